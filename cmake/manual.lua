-- Builds a manual from a text for pandoc. Comments in it stand for text from elsewhere:
--
--   <!-- FILE -->            the page FILE of the project, without its title
--   <!-- FILE: HEADING -->   the part of that page below HEADING, a heading of the second level
--   <!-- HELP -->            the help of each subcommand of a program, in CLI11's form
--
-- The variables SOURCES and PROGRAM name the project's folder and the program. A manual cannot show the
-- target of a link or a wide table, so a link becomes its text, and a table of up to four columns a list.

local function page_part(name, heading)
    local file = assert(io.open(os.getenv("SOURCES") .. "/" .. name))
    local page = pandoc.read(file:read("a"), "markdown-smart")
    file:close()
    local part, inside = pandoc.List(), heading == nil
    for _, block in ipairs(page.blocks) do
        local level = block.t == "Header" and block.level or 3
        if level == 2 and heading then
            inside = pandoc.utils.stringify(block) == heading
        elseif inside and level > 1 then
            part:insert(block)
        end
    end
    assert(#part > 0, name .. " has nothing below: " .. (heading or "its title"))
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

-- The entries of a help as a list. An entry is "NAME   TEXT", and TEXT may continue on the next lines.
-- `indent` is what precedes NAME: two blanks for options and arguments, none for words in a footer.
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

-- The paragraphs of a help, each a list of its lines.
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
    assert(#blocks > 0, program .. " lists no subcommand")
    return blocks
end

local function include(block)
    if block.text == "<!-- HELP -->" then return all_help() end
    local name, heading = block.text:match("^<!%-%- (%S+%.md):? ?(.-) ?%-%->$")
    if not name then return nil end
    return page_part(name, heading ~= "" and heading or nil)
end

return {
    { RawBlock = include },
    { Link = function(link) return link.content end, Table = table_as_list },
}
