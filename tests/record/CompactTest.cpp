// The compact form compared with the lines that it represents: whole, cut anywhere and damaged
// anywhere. And `mempool text`, which prints these lines.

#include <sys/resource.h>

#include <cstddef>
#include <memory>
#include <random>
#include <string>
#include <string_view>

#include <gtest/gtest.h>

#include "Shell.hpp"
#include "TraceLines.hpp"
#include "trace/CompactForm.hpp"
#include "trace/CompactWriter.hpp"
#include "trace/OpenTrace.hpp"
#include "trace/TextWriter.hpp"

namespace {

const std::string everyKind =
    Lines(
        "@c:P\n@n:P:main() (a.c:5)\n@a:P:X:18446744073709551615\n@a:P:Y:0\n@f:P:Y:\n@f:P:X:\n"
        "@c:Q\n@a:Q:X:4096\n@a:P:X:127\n@a:P:Y:128\n@x:P\n@d:P\n@f:Q:Y:\n@d:Q\n") +
    "xmpt:a:ffffffffffffffff:8000000000000001:3\nxmpt:a:0000000000000000:0000000000000000:3\n"
    "xmpt:f:0000000000000000:fffffffffffffff0:\nxmpt:f:0000000000000000:0000000000000020:\n"
    "xmpt:i:program:jq :. \nxmpt:i::\nxmpt:t:250\n";

std::string Compact(const std::string& lines) {
    std::string file;
    Trace::CompactWriter writer([&](std::string_view bytes) { file += bytes; });
    const auto reader = ReadLines(lines);
    Trace::Event event;
    while (reader->Next(event)) { writer.Write(event); }
    writer.Finish();
    return file;
}

struct Text {
    std::string lines;
    std::string problem;
    std::size_t position = 0;
};
Text ReadText(const std::string& file) {
    const auto reader = Trace::MakeReader(Trace::Input(std::make_unique<TextSource>(file)));
    Text text;
    Trace::Event event;
    while (reader->Next(event)) { Trace::AppendLine(text.lines, event); }
    text.problem = reader->Problem();
    text.position = reader->Position();
    return text;
}

TEST(Compact, IsReadAsTheLinesThatWereWritten) {
    const Text text = ReadText(Compact(everyKind));
    EXPECT_EQ(text.lines, everyKind);
    EXPECT_EQ(text.problem, "");
    EXPECT_EQ(text.position, 21U);
    EXPECT_EQ(ReadText(Compact("")).lines, "");
}

// More than one chunk, and more pools than have an index at a time.
TEST(Compact, HoldsLongTraces) {
    std::mt19937_64 random(1);
    std::string lines;
    Trace::Event event;
    for (std::size_t count = 0; count != Trace::maxPools + 5000; ++count) {
        event = {Trace::Kind::Created, random(), random(), random() >> random() % 64, {}, {}};
        for (const auto kind : {Trace::Kind::Created, Trace::Kind::Allocated, Trace::Kind::Freed}) {
            event.kind = kind;
            if (kind != Trace::Kind::Created && count % 8 != 0) { continue; }
            Trace::AppendLine(lines, event);
        }
    }
    event = {Trace::Kind::Named, event.pool, 0, 0, {}, {}};
    const std::string name(Trace::maxTextSize, 'n');
    event.text = name;
    Trace::AppendLine(lines, event);
    EXPECT_TRUE(ReadText(Compact(lines)).lines == lines);

    // A text that is too long is cut.
    lines.insert(lines.size() - 1, "x");
    EXPECT_EQ(ReadText(Compact(lines)).lines.size(), lines.size() - 1);
}

TEST(Compact, TakesFewBytesForBlocksThatLieTogether) {
    std::string file;
    Trace::CompactWriter writer([&](std::string_view bytes) { file += bytes; });
    std::mt19937_64 random(1);
    for (int count = 0; count != 20000; ++count) {
        const std::uint64_t block = 0x55'0000'1000 + random() % 4096 * 16;
        writer.Write({Trace::Kind::Allocated, 1, block, random() % 200, {}, {}});
        writer.Write({Trace::Kind::Freed, 1, block, 0, {}, {}});
    }
    writer.Finish();
    EXPECT_LT(file.size(), 40000 * 3);
}

// A recorder knows neither the pool of a released block nor whether it missed a release.
TEST(Compact, KnowsWhereAReleasedBlockLies) {
    std::string file;
    Trace::CompactWriter writer([&](std::string_view bytes) { file += bytes; });
    const auto allocate = [&](std::uint64_t pool, std::uint64_t block) {
        writer.Write({Trace::Kind::Allocated, pool, block, 8, {}, {}});
    };
    writer.WriteOwned();
    writer.WriteThread(1);
    allocate(0x6a1200, 0x10);
    allocate(0x6a1300, 0x20);
    writer.WriteReleased(0x30);
    writer.WriteReleased(0x10);
    writer.WriteReleased(0x10);
    writer.WriteThread(2);
    writer.WriteReleased(0x20);
    allocate(0x6a1300, 0x20);
    allocate(0x6a1200, 0x20);
    writer.WriteReleased(0x20);
    writer.Finish();
    const std::string p = Lines(":P:00000000000000");
    const std::string q = Lines(":Q:00000000000000");
    EXPECT_EQ(ReadText(file).lines, "xmpt:a" + p + "10:8\nxmpt:a" + q + "20:8\nxmpt:f" + p +
                                        "10:\nxmpt:f" + q + "20:\nxmpt:a" + q + "20:8\nxmpt:f" + q +
                                        "20:\nxmpt:a" + p + "20:8\nxmpt:f" + p +
                                        "20:\nxmpt:i:foreign_frees:1\n");
}

TEST(Compact, IsReadUpToTheDamage) {
    std::string file;
    std::size_t sizes[2] = {};  // Of the file up to the end of each of its two chunks.
    {
        Trace::CompactWriter writer([&](std::string_view bytes) { file += bytes; });
        const auto reader = ReadLines(everyKind);
        Trace::Event event;
        while (reader->Next(event)) {
            writer.Write(event);
            if (event.kind != Trace::Kind::Cleared) { continue; }
            writer.Flush();
            sizes[0] = file.size();
        }
        writer.Flush();
        sizes[1] = file.size();
        writer.Finish();
    }
    ASSERT_EQ(ReadText(file).lines, everyKind);
    const auto linesOf = [&](std::size_t size) {
        return size < sizes[0]   ? ""
               : size < sizes[1] ? everyKind.substr(0, everyKind.find("xmpt:d"))
                                 : everyKind;
    };
    for (std::size_t size = Trace::compactMagic.size(); size != file.size(); ++size) {
        const Text text = ReadText(file.substr(0, size));
        EXPECT_EQ(text.problem, "unexpected end of file") << size;
        EXPECT_EQ(text.lines, linesOf(size));
    }
    EXPECT_EQ(ReadText(file + "x").problem, "there is more after its end");
    for (std::size_t bit = 8 * Trace::compactMagic.size(); bit != 8 * file.size(); ++bit) {
        std::string damaged = file;
        damaged[bit / 8] = static_cast<char>(damaged[bit / 8] ^ 1 << bit % 8);
        const Text text = ReadText(damaged);
        // There are bits that mean nothing in a frame.
        EXPECT_EQ(text.lines, text.problem.empty() ? everyKind : linesOf(bit / 8)) << bit;
    }
}

std::string HeaderOf(std::size_t packedSize, std::size_t plainSize) {
    std::string header;
    for (const std::size_t size : {packedSize, plainSize}) {
        for (int shift = 0; shift != 32; shift += 8) { header += static_cast<char>(size >> shift); }
    }
    return header;
}

// Chunks with a correct checksum that no writer writes: entries that make no sense, more pools than
// have an index, and no entry at all, of which a file could have any number.
TEST(Compact, RefusesInvalidChunks) {
    std::string pools;
    for (std::size_t count = 0; count != Trace::maxPools + 1; ++count) { pools.append("\0\1", 2); }
    const std::string one("\x09\x01", 2);
    for (const std::string& plain :
         {one + "\x02\x07", one + "\x0d", one + "\x0f", one + "\x08\x80", one + "\x0b\x05xy",
          one + "\x09", one + "\x08\xff\xff\xff\xff\xff\xff\xff\xff\xff\xff\xff\x01", pools,
          std::string()}) {
        std::string chunk(ZSTD_compressBound(plain.size()), '\0');
        chunk.resize(ZSTD_compress(chunk.data(), chunk.size(), plain.data(), plain.size(), 1));
        const std::string file = std::string(Trace::compactMagic)
                                     .append(HeaderOf(chunk.size(), plain.size()))
                                     .append(chunk + HeaderOf(0, 0));
        EXPECT_EQ(ReadText(file).problem, "damaged") << testing::PrintToString(plain.substr(0, 20));
    }
    // Sizes that no chunk has: memory for them is not even requested.
    for (const std::string& header : {HeaderOf(8, 0x7FFF'FFFF), HeaderOf(0x7FFF'FFFF, 8)}) {
        EXPECT_EQ(ReadText(std::string(Trace::compactMagic) + header + "12345678").problem,
                  "damaged");
    }
    rusage usage = {};
    getrusage(RUSAGE_SELF, &usage);
    EXPECT_LT(usage.ru_maxrss, 1 << 20) << "KiB";
}

TEST(TextCommand, PrintsAnyTrace) {
    const std::string command = MEMPOOL " text ";
    Shell::WriteFile("compact", Compact(everyKind));
    Shell::WriteFile("lines", "before\n>" + everyKind + "after\n");
    Shell::WriteFile("bad", "xmpt:q\n" + everyKind);
    Shell::WriteFile("none", "xmpt:q\nno\n");
    Shell::WriteFile("cut", Compact(everyKind).substr(0, 60));
    EXPECT_EQ(Shell::Output(command + "compact"), everyKind);
    EXPECT_EQ(Shell::Output("gzip -c compact | " + command + "-"), everyKind);
    EXPECT_EQ(Shell::Output(command + "lines"), everyKind);
    EXPECT_EQ(Shell::Output(command + "bad 2>&1 >/dev/null"),
              "mempool: bad: 1 malformed lines ignored\n");
    EXPECT_EQ(Shell::Output(command + "- <none", 1),
              "mempool: standard input: 1 malformed lines ignored\n"
              "mempool: standard input: not a trace\n");
    EXPECT_EQ(Shell::Output(command + "cut", 1),
              "mempool: cut: unexpected end of file; the events before that were read\n");
    EXPECT_EQ(Shell::Output(command + "lost", 1), "mempool: lost: No such file or directory\n");
    EXPECT_EQ(Shell::Output(command + "compact >/dev/full", 1),
              "mempool: standard output cannot be written to\n");
}

}  // namespace
