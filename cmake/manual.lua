-- Makes a manual of a text for pandoc, and of what is told elsewhere already:
--
--   <!-- README: HEADING -->   what README.md, which the variable README names, has under that heading
--   <!-- HELP -->              what the program that the variable PROGRAM names says of each of its
--                              subcommands, in the form that CLI11 gives it
--
-- A manual page shows neither the target of a link nor wide tables well: a link is its text, and a
-- table of up to four columns is a list of its rows.

local function readme_part(heading)
    local file = assert(io.open(os.getenv("README")))
    local readme = pandoc.read(file:read("a"), "markdown-smart")
    file:close()
    local part, inside = pandoc.List(), false
    for _, block in ipairs(readme.blocks) do
        if block.t == "Header" and block.level <= 2 then
            inside = pandoc.utils.stringify(block) == heading
        elseif inside then
            part:insert(block)
        end
    end
    assert(#part > 0, "README.md has nothing under: " .. heading)
    return part
end

local function row_as_item(row, headings)
    local cells = row.cells
    local text = pandoc.List(cells[#cells].contents[1].content) .. { pandoc.Str(".") }
    for column = 2, #cells - 1 do
        text:extend { pandoc.Space(), pandoc.Str(headings[column] .. ": ") }
        text:extend(cells[column].contents[1].content)
        text:insert(pandoc.Str("."))
    end
    return { cells[1].contents[1].content, { { pandoc.Para(text) } } }
end

local function table_as_list(tbl)
    if #tbl.colspecs > 4 then return nil end
    local headings = pandoc.List(tbl.head.rows[1].cells):map(function(cell)
        return pandoc.utils.stringify(cell.contents)
    end)
    return pandoc.DefinitionList(pandoc.List(tbl.bodies[1].body):map(function(row)
        return row_as_item(row, headings)
    end))
end

-- Entries of a help, "  NAME   TEXT" with TEXT also on the lines behind, as a list. Names of options
-- and arguments stand two blanks in, the words that a footer explains none.
local function entries(lines, indent)
    local items, text = pandoc.List(), nil
    for _, line in ipairs(lines) do
        local name = line:match("^" .. indent .. "(%S.*)$")
        if name then
            local head, tail = name:match("^(.-)  +(.*)$")
            text = { tail or "" }
            head = (head or name):gsub(" REQUIRED$", "")
            items:insert({ { pandoc.Strong(head) }, text })
        elseif text then
            table.insert(text, (line:gsub("^ +", "")))
        end
    end
    return pandoc.DefinitionList(items:map(function(item)
        return { item[1], { { pandoc.Para(table.concat(item[2], " ")) } } }
    end))
end

-- Paragraphs of lines between empty ones.
local function paragraphs(help)
    local all, lines = pandoc.List(), pandoc.List()
    for line in (help .. "\n\n"):gmatch("(.-)\n") do
        if line ~= "" then
            lines:insert(line)
        elseif #lines > 0 then
            all:insert(lines)
            lines = pandoc.List()
        end
    end
    return all
end

local function help_of(program, subcommand)
    local blocks = pandoc.List { pandoc.Header(2, subcommand) }
    for index, lines in ipairs(paragraphs(pandoc.pipe(program, { subcommand, "--help" }, ""))) do
        if index == 1 then
            local usage = lines:remove()
            blocks:insert(pandoc.Para(pandoc.Code((usage:gsub("^Usage: ", "")))))
            blocks:insert(pandoc.Para(table.concat(lines, " ") .. "."))
        elseif lines[1]:match("^%u[%w -]*:$") then
            lines:remove(1)
            blocks:insert(entries(lines, "  "))
        elseif lines[1]:match("^%S.-  +%S") and not lines[1]:match("^%S.-  +%S.-  +%S") then
            blocks:insert(entries(lines, ""))
        elseif lines[1]:match("^ ") then
            blocks:insert(pandoc.CodeBlock(table.concat(lines, "\n")))
        else
            blocks:insert(pandoc.Para(table.concat(lines, " ")))
        end
    end
    return blocks
end

local function all_help()
    local program, blocks = os.getenv("PROGRAM"), pandoc.List()
    local list = pandoc.pipe(program, { "--help" }, ""):match("\nSubcommands:\n(.*)")
    for name in list:gmatch("  (%l[%l-]*) +%u[^\n]*") do
        blocks:extend(help_of(program, name))
    end
    assert(#blocks > 0, program .. " tells no subcommand")
    return blocks
end

local function include(block)
    local heading = block.text:match("^<!%-%- README: (.*) %-%->$")
    if block.text == "<!-- HELP -->" then return all_help() end
    return heading and readme_part(heading)
end

return {
    { RawBlock = include },
    { Link = function(link) return link.content end, Table = table_as_list },
}
