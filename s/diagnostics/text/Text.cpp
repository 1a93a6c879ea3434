// Addresses have the same digits everywhere. One class makes them, without the heap.

#include "diagnostics/text/Text.hpp"

#include <array>
#include <cassert>
#include <charconv>

namespace OBR::MemPool {

namespace {

struct Address {
    std::array<char, 18> text;
    std::size_t prefix = 0;  // Characters of "0x".

    explicit Address(const void* pointer) {
        text.fill('0');
        if (pointer == nullptr) { return; }
        prefix = 2;
        text[1] = 'x';
        auto rest = reinterpret_cast<std::uintptr_t>(pointer);
        for (auto digit = text.rbegin(); rest != 0; ++digit, rest /= 16) {
            *digit = "0123456789abcdef"[rest % 16];
        }
    }
    std::string_view Whole() const { return {text.data(), text.size()}; }
    std::string_view Bare() const { return Whole().substr(prefix); }
};

}  // namespace

std::string Indent(std::uint32_t level) {
    return std::string(std::size_t{3} * level, ' ');
}

std::string PtrText(const void* pointer) {
    return std::string(Address(pointer).Whole());
}

std::string BareHex(const void* pointer) {
    return std::string(Address(pointer).Bare());
}

FixedText& FixedText::Add(std::string_view piece) {
    assert(length + piece.size() < sizeof text);
    length += piece.copy(text + length, sizeof text - 1 - length);
    return *this;
}

FixedText& FixedText::AddNumber(std::uint32_t number) {
    char digits[10];
    const auto end = std::to_chars(digits, digits + sizeof digits, number).ptr;
    return Add({digits, static_cast<std::size_t>(end - digits)});
}

FixedText& FixedText::AddBareHex(const void* pointer) {
    return Add(Address(pointer).Bare());
}

}  // namespace OBR::MemPool
