-- The text of an error, where it was raised, and the way there.
-- expect-error: error.lua:6: too deep: 3
-- expect-error: stack traceback:
print("before")
local function fall(depth)
    if depth == 3 then error("too deep: " .. depth) end
    fall(depth + 1)
end
fall(0)
