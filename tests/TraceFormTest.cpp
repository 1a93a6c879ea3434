// The forms of a trace line, read and written by one table.

#include <string>

#include <gtest/gtest.h>

#include "TraceLines.hpp"
#include "trace/TextWriter.hpp"

namespace {

TEST(TraceForm, IsWrittenAsItIsRead) {
    const std::string lines =
        Lines("@c:P\n@n:P:main() (a.c:5)\n@a:P:X:18446744073709551615\n@f:P:X:\n@x:P\n@d:P\n") +
        "xmpt:i:program:jq :. \nxmpt:i::\n";
    const auto reader = ReadLines(lines);
    std::string written;
    Trace::Event event;
    while (reader->Next(event)) { Trace::AppendLine(written, event); }
    EXPECT_EQ(written, lines);
    EXPECT_EQ(reader->Position(), 8U);

    event = {Trace::Kind::Named, 0x6a1200, 0, 0, {}, "two\nlines \x7f\xc3\xa9"};
    written.clear();
    Trace::AppendLine(written, event);
    EXPECT_EQ(written, Lines("@n:P:two?lines ?\xc3\xa9\n"));
}

TEST(TraceForm, TellsWhatATraceIsCalledAndWhatItSaysOfItself) {
    Trace::StepReader reader(ReadLines(Lines("@i:program:jq:x\n@c:P\n@n:Q:no\n@n:P:caller\n") +
                                       Lines("@a:P:X:1073741823\n")),
                             "t");
    Trace::Step step = {};
    while (reader.Next(step)) {}
    EXPECT_EQ(reader.Facts().at("program"), "jq:x");
    EXPECT_EQ(reader.Blocks().Pools().at(0).name, "caller");
    EXPECT_EQ(reader.Bad().Total(), 1U);
}

}  // namespace
