// The forms of a trace line. Each begins with the mark and the letter of its kind; then come its
// fields, each behind a colon. The library writes the first four, the others are a recorder's.
//
//     xmpt:c:POOL               xmpt:x:POOL
//     xmpt:d:POOL               xmpt:n:POOL:TEXT
//     xmpt:a:POOL:BLOCK:SIZE    xmpt:i:KEY:TEXT
//     xmpt:f:POOL:BLOCK:
//
// POOL and BLOCK are addresses of 16 hexadecimal digits, SIZE is decimal. A KEY has no colon. A
// TEXT ends with the line.

#ifndef OBR_TOOLS_TRACE_LINEFORMS_HPP
#define OBR_TOOLS_TRACE_LINEFORMS_HPP

#include <array>
#include <cstddef>
#include <string_view>

#include "trace/Event.hpp"

namespace Trace {

constexpr std::string_view mark = "xmpt:";
constexpr std::size_t addressDigits = 16;

enum class Field : std::uint8_t { None, Pool, Block, Size, Nothing, Key, Text };

struct LineForm {
    Kind kind;
    char letter;
    std::array<Field, 3> fields;  // Up to the first None.
};

// In the order of Kind.
inline constexpr std::array<LineForm, 7> lineForms = {{
    {Kind::Created, 'c', {Field::Pool}},
    {Kind::Destroyed, 'd', {Field::Pool}},
    {Kind::Allocated, 'a', {Field::Pool, Field::Block, Field::Size}},
    {Kind::Freed, 'f', {Field::Pool, Field::Block, Field::Nothing}},
    {Kind::Cleared, 'x', {Field::Pool}},
    {Kind::Named, 'n', {Field::Pool, Field::Text}},
    {Kind::Info, 'i', {Field::Key, Field::Text}},
}};

}  // namespace Trace

#endif
