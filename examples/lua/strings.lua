-- Like an analysis tool: splits, joins, counts and sorts words.
local scale = tonumber(os.getenv("SCALE") or 1)

local words = {}
for i = 1, math.floor(120000 * scale) do
    words[i] = ("word%x"):format(i * 2654435761 % 9973)
end

local counts = {}
for turn = 1, 5 do
    local lines = {}
    for i = 1, #words, 12 do
        lines[#lines + 1] = table.concat(words, " ", i, math.min(i + 11, #words)) .. turn
    end
    for _, line in ipairs(lines) do
        for word in line:gmatch("%w+") do
            local key = word:upper()
            counts[key] = (counts[key] or 0) + 1
        end
    end
end

local keys = {}
for key in pairs(counts) do keys[#keys + 1] = key end
table.sort(keys, function(a, b)
    if counts[a] ~= counts[b] then return counts[a] > counts[b] end
    return a < b
end)
print("distinct words", #keys)
for i = 1, 5 do print(keys[i], counts[keys[i]]) end
