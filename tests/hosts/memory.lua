-- A string above what a pool gives, which is Lua's own error, and a state that goes on after it.
-- expect: false	not enough memory
-- expect: still 1000000 bytes
print(pcall(string.rep, "x", 0x40000000))
print("still " .. #string.rep("x", 1000000) .. " bytes")
