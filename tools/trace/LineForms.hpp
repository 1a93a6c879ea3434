// The forms of a trace line: a mark, the letter of the kind, then the fields, each after a colon.
// The library writes the four forms on the left, a recorder all of them.
//
//     xmpt:c:POOL               xmpt:x:POOL
//     xmpt:d:POOL               xmpt:n:POOL:TEXT
//     xmpt:a:POOL:BLOCK:SIZE    xmpt:i:KEY:TEXT
//     xmpt:f:POOL:BLOCK:        xmpt:t:MILLISECONDS
//
// POOL and BLOCK are addresses of 16 hexadecimal digits, SIZE and MILLISECONDS are decimal. A KEY
// has no colon. A TEXT ends with the line, and a free ends with an empty field.

#ifndef OBR_TOOLS_TRACE_LINEFORMS_HPP
#define OBR_TOOLS_TRACE_LINEFORMS_HPP

#include <array>
#include <cstddef>
#include <cstdint>
#include <iterator>
#include <string_view>

#include "trace/Event.hpp"

namespace Trace {

constexpr std::string_view mark = "xmpt:";
constexpr std::size_t addressDigits = 16;

enum class Field : std::uint8_t { None, Pool, Block, Size, Empty, Key, Text };

struct LineForm {
    Kind kind;
    char letter;
    std::array<Field, 3> fields;  // Up to the first None.
};

// In the order of Kind. All kinds except Malformed have a form.
inline constexpr LineForm lineForms[] = {
    {Kind::Created, 'c', {Field::Pool}},
    {Kind::Destroyed, 'd', {Field::Pool}},
    {Kind::Allocated, 'a', {Field::Pool, Field::Block, Field::Size}},
    {Kind::Freed, 'f', {Field::Pool, Field::Block, Field::Empty}},
    {Kind::Cleared, 'x', {Field::Pool}},
    {Kind::Named, 'n', {Field::Pool, Field::Text}},
    {Kind::Info, 'i', {Field::Key, Field::Text}},
    {Kind::Time, 't', {Field::Size}},
};
static_assert(std::size(lineForms) == static_cast<std::size_t>(Kind::Malformed),
              "Every kind of event has the form of its line.");

}  // namespace Trace

#endif
