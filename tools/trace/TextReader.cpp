// From lines to events, by the table of forms.

#include "trace/TextReader.hpp"

#include <algorithm>
#include <charconv>
#include <limits>

#include "trace/LineForms.hpp"

namespace Trace {

namespace {

// Bytes of a line from its mark on. A longer one is malformed.
constexpr std::size_t maxSize = std::size_t{1} << 20;

// Takes the fields of a line from its front. If one is missing, the line is malformed.
class Fields {
public:
    explicit Fields(std::string_view text) : rest(text) {}

    char Letter() {
        const char letter = rest.empty() ? '\0' : rest.front();
        rest.remove_prefix(rest.empty() ? 0 : 1);
        return letter;
    }
    void Colon() {
        if (Letter() != ':') { wellFormed = false; }
    }
    std::uint64_t Address() { return Number(rest.substr(0, addressDigits), 16, addressDigits); }
    std::uint64_t Size() { return Number(rest, 10, 1); }
    std::string_view Key() { return Text(std::min(rest.find(':'), rest.size())); }
    std::string_view Text() { return Text(rest.size()); }

    bool AllTaken() const { return wellFormed && rest.empty(); }

private:
    // A number of more than 64 bits counts as the largest: it is too large in any case.
    std::uint64_t Number(std::string_view digits, int base, std::size_t minDigits) {
        std::uint64_t value = 0;
        const char* const first = digits.data();
        const auto [end, error] = std::from_chars(first, first + digits.size(), value, base);
        const auto numDigits = static_cast<std::size_t>(end - first);
        if (numDigits < minDigits) { wellFormed = false; }
        rest.remove_prefix(numDigits);
        return error == std::errc() ? value : std::numeric_limits<std::uint64_t>::max();
    }

    std::string_view Text(std::size_t size) {
        const std::string_view text = rest.substr(0, size);
        rest.remove_prefix(size);
        return text;
    }

    std::string_view rest;
    bool wellFormed = true;
};

void Take(Fields& fields, Field field, Event& event) {
    switch (field) {
        case Field::Pool:
            event.pool = fields.Address();
            break;
        case Field::Block:
            event.block = fields.Address();
            break;
        case Field::Size:
            event.size = fields.Size();
            break;
        case Field::Key:
            event.key = fields.Key();
            break;
        case Field::Text:
            event.text = fields.Text();
            break;
        case Field::Empty:
        case Field::None:
            break;
    }
}

// Parses the line after its mark.
void Parse(std::string_view text, Event& event) {
    event.kind = Kind::Malformed;
    Fields fields(text);
    const char letter = fields.Letter();
    for (const LineForm& form : lineForms) {
        if (form.letter != letter) { continue; }
        for (const Field field : form.fields) {
            if (field == Field::None) { break; }
            fields.Colon();
            Take(fields, field, event);
        }
        if (fields.AllTaken()) { event.kind = form.kind; }
        return;
    }
}

}  // namespace

bool TextReader::Next(Event& event) {
    std::string_view line;
    while (NextLine(line)) {
        const std::size_t start = line.find(mark);
        if (start == std::string_view::npos && !isTooLong) { continue; }
        if (isTooLong || line.size() - start > maxSize) {
            event.kind = Kind::Malformed;
        } else {
            Parse(line.substr(start + mark.size()), event);
        }
        return true;
    }
    return false;
}

// Reads the next line, without its end and possibly without its beginning: see Shorten. The last
// line of a file needs no end. If the file is incomplete, its last line may be too, and is dropped.
bool TextReader::NextLine(std::string_view& line) {
    input.Skip(lineSize);
    lineSize = 0;
    isTooLong = false;
    std::size_t size = input.Ahead().find('\n');
    std::size_t endSize = 1;
    while (size == std::string_view::npos) {
        Shorten();
        const std::size_t searched = input.Ahead().size();
        if (!input.ReadMore()) {
            if ((searched == 0 && !isTooLong) || !input.Problem().empty()) { return false; }
            size = searched;
            endSize = 0;
            break;
        }
        size = input.Ahead().find('\n', searched);
    }
    lineSize = size + endSize;
    line = input.Ahead().substr(0, size);
    ++number;
    return true;
}

// Bounds the memory for a line whose end is not read yet. Drops what precedes its mark, or what
// precedes the last bytes, which may be the start of a mark. Drops all of a line that is too long.
void TextReader::Shorten() {
    const std::string_view begin = input.Ahead();
    const std::size_t start = begin.find(mark);
    if (start != std::string_view::npos && begin.size() - start > maxSize) { isTooLong = true; }
    const std::size_t kept = isTooLong                         ? 0
                             : start != std::string_view::npos ? begin.size() - start
                                                               : mark.size() - 1;
    input.Skip(begin.size() - std::min(begin.size(), kept));
}

}  // namespace Trace
