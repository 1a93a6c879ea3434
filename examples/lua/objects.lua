-- Like a simulator: creates and drops generations of objects that contain smaller objects.
local scale = tonumber(os.getenv("SCALE") or 1)

local Particle = {}
Particle.__index = Particle

function Particle.new(x, y)
    return setmetatable({place = {x = x, y = y}, speed = {x = 1.5, y = -0.5}, age = 0}, Particle)
end

function Particle:step(dt)
    local place, speed = self.place, self.speed
    self.place = {x = place.x + speed.x * dt, y = place.y + speed.y * dt}
    self.age = self.age + 1
    return self.age < 3
end

local alive, made, sum = {}, 0, 0
for turn = 1, 12 do
    for i = 1, math.floor(20000 * scale) do
        alive[#alive + 1] = Particle.new(i, turn)
        made = made + 1
    end
    local next = {}
    for _, particle in ipairs(alive) do
        if particle:step(0.25) then
            next[#next + 1] = particle
        else
            sum = sum + particle.place.x + particle.place.y
        end
    end
    alive = next
end
print("objects", made, #alive, sum)
