-- Objects with methods and fields, made and dropped a generation at a time, as a simulator does.
local scale = tonumber(os.getenv("SCALE") or 1)

local Particle = {}
Particle.__index = Particle

function Particle.new(x, y)
    return setmetatable({x = x, y = y, vx = 1.5, vy = -0.5, age = 0}, Particle)
end

function Particle:step(dt)
    self.x = self.x + self.vx * dt
    self.y = self.y + self.vy * dt
    self.age = self.age + 1
    return self.age < 3
end

local alive, made, sum = {}, 0, 0
for turn = 1, 60 do
    for i = 1, math.floor(20000 * scale) do
        alive[#alive + 1] = Particle.new(i, turn)
        made = made + 1
    end
    local next = {}
    for _, particle in ipairs(alive) do
        if particle:step(0.25) then
            next[#next + 1] = particle
        else
            sum = sum + particle.x + particle.y
        end
    end
    alive = next
end
print("objects", made, #alive, sum)
