-- Like a compiler: builds many small, short-lived trees next to a large one that stays.
local depth = math.floor(15 + math.log(tonumber(os.getenv("SCALE") or 1), 2))

local function build(level)
    if level == 0 then return {kind = "leaf", line = level, value = 1} end
    return {
        kind = "pair", line = level, type = "sum",
        left = build(level - 1), right = build(level - 1),
    }
end

local function count(tree)
    if tree.kind == "leaf" then return 1 end
    return 1 + count(tree.left) + count(tree.right)
end

local stays = build(depth)
for level = 4, depth, 4 do
    local rounds = 1 << (depth - level + 3)
    local nodes = 0
    for _ = 1, rounds do
        nodes = nodes + count(build(level))
    end
    print(("%d trees of depth %d: %d nodes"):format(rounds, level, nodes))
end
print("the one that stays: " .. count(stays) .. " nodes")
