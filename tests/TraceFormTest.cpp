// Traces of lines.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "TraceLines.hpp"
#include "trace/TextWriter.hpp"

namespace {

TEST(TraceForm, HasNoControlCharacterInATextThatIsWritten) {
    std::string written;
    Trace::AppendLine(written, {Trace::Kind::Named, 0x6a1200, 0, 0, {}, "two\nlines \x7f\xc3\xa9"});
    EXPECT_EQ(written, Lines("@n:P:two?lines ?\xc3\xa9\n"));
}

TEST(TraceForm, HasNamesOfPoolsAndFactsAboutTheRecording) {
    Trace::StepReader reader(ReadLines(Lines("@i:program:jq:x\n@c:P\n@n:Q:no\n@n:P:caller\n") +
                                       Lines("@a:P:X:1073741823\n@a:P:Y:36893488147419103232\n")),
                             "t");
    Trace::Step step = {};
    while (reader.Next(step)) {}
    EXPECT_EQ(reader.Facts().at("program"), "jq:x");
    EXPECT_EQ(reader.Blocks().Pools().at(0).name, "caller");
    EXPECT_EQ(reader.Bad().Total(), 2U);
    EXPECT_EQ(reader.Bad().first.back().fault, Trace::Fault::TooLarge) << "2^65 bytes.";
}

// Gives a thousand bytes at a time, and keeps the most room that the reader had for them.
class Greedy final : public Trace::ByteSource {
public:
    Greedy(std::string text, std::size_t& mostRoom) : rest(std::move(text)), room(mostRoom) {}
    std::size_t Read(char* bytes, std::size_t size) override {
        room = std::max(room, size);
        const std::size_t number = rest.copy(bytes, std::min<std::size_t>(size, 1000), numRead);
        numRead += number;
        return number;
    }
    std::string Problem() const override { return ""; }

private:
    const std::string rest;
    std::size_t& room;
    std::size_t numRead = 0;
};

TEST(TraceForm, HasRoomForALineWithoutAnEnd) {
    const std::size_t much = 5'000'000;
    const std::size_t most = (1 << 20) - 24;  // Of a name, with "xmpt:n:", the address and a colon.
    const std::string noise(much, 'x');
    // The bytes come in two pieces at each place in the mark that follows the noise.
    for (const std::size_t shift : {0U, 1U, 2U, 3U, 4U, 5U}) {
        std::size_t room = 0;
        std::string text = noise + "\n" + noise.substr(shift) + Lines("@c:P") + "\n";
        text += Lines("@n:P:") + noise.substr(0, most) + "\n";
        text += Lines("@n:P:") + noise.substr(0, most + 1) + "\n";
        text += Lines("@n:P:") + noise + "\n" + Lines("@d:P\n@n:Q:") + noise;
        Trace::TextReader reader(Trace::Input(std::make_unique<Greedy>(text, room)));
        Trace::Event event;
        std::vector<std::pair<Trace::Kind, std::uint64_t>> read;
        while (reader.Next(event)) {
            read.emplace_back(event.kind, reader.Position());
            if (event.kind == Trace::Kind::Named) { EXPECT_EQ(event.text.size(), most); }
        }
        using Trace::Kind;
        EXPECT_EQ(read, (decltype(read){{Kind::Created, 2},
                                        {Kind::Named, 3},
                                        {Kind::Malformed, 4},
                                        {Kind::Malformed, 5},
                                        {Kind::Destroyed, 6},
                                        {Kind::Malformed, 7}}));
        EXPECT_LE(room, std::size_t{2} << 20);
    }
}

}  // namespace
