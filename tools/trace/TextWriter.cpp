// From events to lines, by the table of forms.

#include "trace/TextWriter.hpp"

#include <charconv>
#include <cstdint>
#include <string_view>

#include "trace/LineForms.hpp"

namespace Trace {

namespace {

void AppendText(std::string& line, std::string_view text) {
    for (const char letter : text) {
        const bool isControl = static_cast<unsigned char>(letter) < 0x20 || letter == 0x7F;
        line += isControl ? '?' : letter;
    }
}

void Append(std::string& line, Field field, const Event& event) {
    switch (field) {
        case Field::Pool:
            AppendAddress(line, event.pool);
            break;
        case Field::Block:
            AppendAddress(line, event.block);
            break;
        case Field::Size:
            line += std::to_string(event.size);
            break;
        case Field::Key:
            AppendText(line, event.key);
            break;
        case Field::Text:
            AppendText(line, event.text);
            break;
        case Field::Empty:
        case Field::None:
            break;
    }
}

}  // namespace

void AppendLine(std::string& lines, const Event& event) {
    for (const LineForm& form : lineForms) {
        if (form.kind != event.kind) { continue; }
        lines += mark;
        lines += form.letter;
        for (const Field field : form.fields) {
            if (field == Field::None) { break; }
            lines += ':';
            Append(lines, field, event);
        }
        lines += '\n';
    }
}

void AppendAddress(std::string& text, std::uint64_t address) {
    constexpr std::string_view digits = "0123456789abcdef";
    for (std::size_t shift = 4 * addressDigits; shift != 0; shift -= 4) {
        text += digits[address >> (shift - 4) & 0xF];
    }
}

}  // namespace Trace
