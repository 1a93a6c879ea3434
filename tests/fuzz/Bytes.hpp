// The bytes of an input as a series of decisions. After its end all of them are 0.

#ifndef OBR_TESTS_FUZZ_BYTES_HPP
#define OBR_TESTS_FUZZ_BYTES_HPP

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace Fuzz {

class Bytes {
public:
    Bytes(const std::uint8_t* first, std::size_t number) : next(first), end(first + number) {}

    bool AtEnd() const { return next == end; }
    std::uint8_t Byte() { return AtEnd() ? std::uint8_t{0} : *next++; }
    bool Bit() { return (Byte() & 1) != 0; }
    std::uint32_t Short() {
        const std::uint32_t low = Byte();
        return low + Byte() * 0x100u;
    }
    std::uint32_t Word() {
        const std::uint32_t low = Short();
        return low + (Short() << 16);
    }

    // A number below `number`, which is not 0.
    std::uint32_t Below(std::size_t number) {
        const auto limit = static_cast<std::uint32_t>(number);
        return (limit <= 0x100 ? Byte() : Short()) % limit;
    }

    template <typename T, std::size_t number>
    T OneOf(const T (&values)[number]) {
        return values[Below(number)];
    }

    std::string_view Rest() {
        const auto* const first = reinterpret_cast<const char*>(next);
        const auto size = static_cast<std::size_t>(end - next);
        next = end;
        return {first, size};
    }

private:
    const std::uint8_t* next;
    const std::uint8_t* end;
};

}  // namespace Fuzz

#endif
