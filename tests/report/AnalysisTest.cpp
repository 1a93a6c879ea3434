// Compares the figures of a report with simple computations over whole random traces, and the model
// of the pools with real pools.

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <iterator>
#include <limits>
#include <map>
#include <random>
#include <string>
#include <tuple>
#include <vector>

#include <MemPool>

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include "Output.hpp"
#include "TraceLines.hpp"
#include "replay/HeapCount.hpp"
#include "report/Analysis.hpp"
#include "report/Json.hpp"
#include "report/MallocSizes.hpp"
#include "report/Samples.hpp"
#include "trace/CompactWriter.hpp"
#include "trace/OpenTrace.hpp"

namespace {

using OBR::MemPool::PoolSettings;

constexpr PoolSettings usual = {4010, 1000, 8, 4, false};

// Sizes of all kinds: around the bounds of records, of the rows of sizes, and large.
std::uint32_t SomeSize(std::mt19937& random) {
    constexpr std::uint32_t special[] = {0, 1, 4, 5, 996, 997, 1000, 1024, 1025, 1152, 1153, 70000};
    if (random() % 4 == 0) { return special[random() % std::size(special)]; }
    return static_cast<std::uint32_t>(random() % (random() % 8 == 0 ? 5000 : 60));
}

struct PlainBlock {
    std::string group;
    std::uint32_t size;
    std::uint64_t born;
    std::uint64_t died = std::numeric_limits<std::uint64_t>::max();  // Also with its pool.
    bool freed = false;
    bool cleared = false;
};

struct PlainTrace {
    std::string lines;
    std::vector<PlainBlock> blocks;
    std::map<std::string, std::string> moves;  // Of a group's blocks, see below.
    std::uint64_t events = 0;
};

// Three pools, one of them unnamed and two of one name, which are cleared, destroyed and made anew.
// In `moves` a block that comes is a letter from "abc", one that goes a digit, by its pool.
PlainTrace MakeTrace(unsigned int seed, int numSteps) {
    std::mt19937 random(seed);
    PlainTrace trace;
    std::map<unsigned int, std::map<std::size_t, std::size_t>> pools;  // Address to number.
    const std::string names[] = {"", "twice", "twice"};
    std::size_t address = 0x10;
    const auto line = [&](const char* form, unsigned int pool, std::size_t block,
                          std::size_t size) {
        char text[80];
        std::snprintf(text, sizeof text, form, pool, block, size);
        trace.lines += text;
    };
    const auto group = [&](unsigned int pool) {
        return names[pool].empty() ? "000000000000000" + std::to_string(pool) : names[pool];
    };
    for (int step = 0; step < numSteps; ++step) {
        const auto pool = static_cast<unsigned int>(random() % 3);
        const bool building = step / 150 % 2 == 0;
        const auto move = random() % 400;
        if (pools.count(pool) == 0) {
            line("xmpt:c:%016x\n", pool, 0, 0);
            if (!names[pool].empty()) {
                trace.lines += "xmpt:n:000000000000000" + std::to_string(pool) + ":twice\n";
            }
            pools[pool];
            ++trace.events;
            continue;
        }
        auto& live = pools[pool];
        if (move < 2) {
            line(move == 0 ? "xmpt:d:%016x\n" : "xmpt:x:%016x\n", pool, 0, 0);
            ++trace.events;
            for (const auto& [place, number] : live) {
                trace.blocks[number].died = trace.events;
                trace.blocks[number].freed = trace.blocks[number].cleared = move == 1;
                trace.moves[group(pool)] += static_cast<char>('0' + pool);
            }
            live.clear();
            if (move == 0) { pools.erase(pool); }
        } else if (live.empty() || move % 10 < (building ? 8 : 1)) {
            const std::uint32_t size = SomeSize(random);
            line("xmpt:a:%016x:%016zx:%zu\n", pool, address, size);
            live[address] = trace.blocks.size();
            trace.blocks.push_back({group(pool), size, ++trace.events});
            trace.moves[group(pool)] += static_cast<char>('a' + pool);
            address += 16;
        } else {
            const auto place = std::next(live.begin(), static_cast<long>(random() % live.size()));
            line("xmpt:f:%016x:%016zx:\n", pool, place->first, 0);
            trace.blocks[place->second].died = ++trace.events;
            trace.blocks[place->second].freed = true;
            trace.moves[group(pool)] += static_cast<char>('0' + pool);
            live.erase(place);
        }
    }
    return trace;
}

Report::Analysis Analyse(const std::string& lines, const PoolSettings& settings = usual) {
    Trace::StepReader reader(ReadLines(lines), "made");
    return Report::Analyse(reader, settings, [](std::uint64_t) {});
}

// What is alive after an event.
template <typename Choose>
Report::BlockSum LiveAt(const PlainTrace& trace, std::uint64_t event, const Choose& choose) {
    Report::BlockSum sum;
    for (const PlainBlock& block : trace.blocks) {
        if (block.born <= event && event < block.died && choose(block)) { sum.Add(block.size); }
    }
    return sum;
}

void ExpectSum(const Report::BlockSum& sum, const Report::BlockSum& plain) {
    EXPECT_EQ(sum.blocks, plain.blocks);
    EXPECT_EQ(sum.bytes, plain.bytes);
}

template <typename Choose>
void ExpectTally(const Report::Tally& tally, const PlainTrace& trace, std::uint64_t peak,
                 const Choose& choose) {
    Report::BlockSum all;
    Report::BlockSum inRecords;
    std::uint64_t padding = 0;
    Report::BlockSum never;
    std::uint64_t temporary = 0;
    std::uint64_t cleared = 0;
    std::array<std::uint64_t, Report::numLifetimes> lifetimes = {};
    for (const PlainBlock& block : trace.blocks) {
        if (!choose(block)) { continue; }
        all.Add(block.size);
        if (block.size <= 996) {
            inRecords.Add(block.size);
            padding += (std::max(block.size, 1U) + 3) / 4 * 4 - block.size;
        }
        if (block.cleared) { ++cleared; }
        if (!block.freed) {
            never.Add(block.size);
            continue;
        }
        if (!block.cleared && block.died == block.born + 1) { ++temporary; }
        std::size_t bin = 0;
        for (std::uint64_t life = block.died - block.born; life > 10; life = (life + 9) / 10) {
            ++bin;
        }
        ++lifetimes.at(bin);
    }
    ExpectSum(tally.all, all);
    ExpectSum(tally.inRecords, inRecords);
    ExpectSum(tally.atPeak, LiveAt(trace, peak, choose));
    EXPECT_EQ(tally.padding, padding);
    ExpectSum(tally.never, never);
    EXPECT_EQ(tally.temporary, temporary);
    EXPECT_EQ(tally.dropped, cleared);
    EXPECT_EQ(tally.lifetimes, lifetimes);
}

TEST(Analysis, AgreesWithPlainFigures) {
    for (const unsigned int seed : {1U, 2U, 3U}) {
        const PlainTrace trace = MakeTrace(seed, 2500);
        const Report::Analysis analysis = Analyse(trace.lines);
        ASSERT_EQ(analysis.badLines.Total(), 0U);
        EXPECT_EQ(analysis.events, trace.events);
        const auto all = [](const PlainBlock&) { return true; };

        std::uint64_t peak = 0;
        Report::BlockSum most;
        for (std::uint64_t event = 1; event <= trace.events; ++event) {
            const Report::BlockSum live = LiveAt(trace, event, all);
            if (std::tie(live.bytes, live.blocks) > std::tie(most.bytes, most.blocks)) {
                most = live;
                peak = event;
            }
        }
        EXPECT_EQ(analysis.peak.event, peak);
        EXPECT_EQ(analysis.peak.asked, most.bytes);
        EXPECT_EQ(analysis.peak.blocks, most.blocks);
        ExpectTally(analysis.total, trace, peak, all);

        std::uint64_t blocksOfSizes = 0;
        std::uint32_t lastSize = 0;
        for (const Report::SizeRow& row : analysis.sizes) {
            EXPECT_TRUE(row.smallest == row.largest || row.smallest > 1024);
            EXPECT_LE(row.largest - row.smallest, row.smallest / 8);
            EXPECT_TRUE(blocksOfSizes == 0 || row.smallest > lastSize);
            lastSize = row.largest;
            blocksOfSizes += row.tally.all.blocks;
            ExpectTally(row.tally, trace, peak, [&](const PlainBlock& block) {
                return row.smallest <= block.size && block.size <= row.largest;
            });
        }
        EXPECT_EQ(blocksOfSizes, trace.blocks.size());

        EXPECT_EQ(analysis.groups.size(), 2U);
        for (const Report::GroupRow& group : analysis.groups) {
            ExpectTally(group.tally, trace, peak,
                        [&](const PlainBlock& block) { return block.group == group.name; });
        }
        EXPECT_GE(analysis.groups[0].tally.atPeak.bytes, analysis.groups[1].tally.atPeak.bytes);
    }
    Report::Sizes ranges;
    const Report::SizeRow* const next = &ranges.Row(1153);
    EXPECT_EQ(&ranges.Row(1152), &ranges.Row(1025)) << "Up to an eighth more than 1024.";
    EXPECT_NE(&ranges.Row(1152), next);
    const Report::Analysis equal = Analyse(Lines("@c:P\n@a:P:X:8\n@f:P:X:\n@a:P:X:8\n@c:Q\n"));
    EXPECT_EQ(equal.peak.event, 2U) << "The first of two equal peaks.";
    EXPECT_GT(equal.most.pools, equal.peak.pools);
    EXPECT_EQ(Analyse(Lines("@c:P\n@a:P:X:8\n@a:P:Y:0\n")).peak.blocks, 2U);
    const auto groups =
        Analyse(Lines("@c:Q\n@c:P\n@d:P\n@c:P\n@a:P:X:8\n@f:P:X:\n@a:P:X:8\n@a:Q:Y:8\n")).groups;
    EXPECT_EQ(groups[0].tally.all.blocks, 2U) << "Of two as large the one with more blocks.";
    EXPECT_EQ(groups[0].numPools, 2U);
}

// Runs are those of a traced pool, so the moves of each pool of a group are followed separately.
TEST(Analysis, CountsWhatDiesTogether) {
    for (const unsigned int seed : {4U, 5U}) {
        const PlainTrace trace = MakeTrace(seed, 4000);
        for (const Report::GroupRow& group : Analyse(trace.lines).groups) {
            Report::Runs plain;
            for (char pool = 0; pool < 3; ++pool) {
                std::uint64_t live = 0;
                std::uint64_t run = 0;
                for (const char move : trace.moves.at(group.name) + static_cast<char>('a' + pool)) {
                    if (move == '0' + pool) {
                        --live;
                        ++run;
                    }
                    if (move != 'a' + pool) { continue; }
                    if (run >= 2) {
                        ++plain.numRuns;
                        plain.together += run;
                        plain.byLength.at(std::to_string(run).size() - 1) += run;
                        plain.longest = std::max(plain.longest, run);
                        plain.numClears += live == 0 ? 1 : 0;
                        plain.clearable += live == 0 ? run : 0;
                    }
                    run = 0;
                    ++live;
                }
            }
            EXPECT_GT(plain.numClears, 0U);
            EXPECT_EQ(group.runs.numRuns, plain.numRuns);
            EXPECT_EQ(group.runs.together, plain.together);
            EXPECT_EQ(group.runs.byLength, plain.byLength);
            EXPECT_EQ(group.runs.longest, plain.longest);
            EXPECT_EQ(group.runs.numClears, plain.numClears);
            EXPECT_EQ(group.runs.clearable, plain.clearable);
        }
    }
}

// The points cover the trace, each with the fullest moment of its part.
TEST(Analysis, KeepsTheCourseOfALongTrace) {
    const PlainTrace trace = MakeTrace(6, 5000);
    const Report::Analysis analysis = Analyse(trace.lines);
    const auto all = [](const PlainBlock&) { return true; };
    const std::uint64_t interval = 16;
    ASSERT_EQ(analysis.timeline.size(), (trace.events + interval - 1) / interval);
    for (std::size_t i = 0; i < analysis.timeline.size(); ++i) {
        std::uint64_t most = 0;
        std::uint64_t least = std::numeric_limits<std::uint64_t>::max();
        const std::uint64_t end = std::min((i + 1) * interval, trace.events);
        for (std::uint64_t event = i * interval + 1; event <= end; ++event) {
            const std::uint64_t asked = LiveAt(trace, event, all).bytes;
            most = std::max(most, asked);
            least = std::min(least, asked);
        }
        const Report::Point& point = analysis.timeline[i];
        EXPECT_EQ(point.most.asked, most);
        EXPECT_EQ(point.leastAsked, least);
        EXPECT_EQ(LiveAt(trace, point.most.event, all).bytes, most);
        std::uint64_t heap = 0;
        LiveAt(trace, point.most.event, [&](const PlainBlock& block) {
            heap += Report::MallocBytes(block.size);
            return true;
        });
        EXPECT_EQ(point.most.heap, heap);
        EXPECT_EQ(point.most.chunks, heap + 8 * point.most.blocks);
        EXPECT_LE(point.most.blocks, analysis.most.blocks);
    }
    for (const Report::GrowthPoint& point : analysis.growth) {
        for (std::size_t i = 0; i < analysis.groups.size(); ++i) {
            EXPECT_EQ(point.live.at(i), LiveAt(trace, point.event, [&](const PlainBlock& block) {
                                            return block.group == analysis.groups[i].name;
                                        }).bytes);
        }
    }
    EXPECT_EQ(std::count_if(analysis.growth.begin(), analysis.growth.end(),
                            [&](const auto& point) { return point.event == analysis.peak.event; }),
              1);
    ASSERT_LE(analysis.fill.size(), Report::maxSamples);
    ASSERT_GE(analysis.fill.size(), Report::maxSamples / 2 - 1);
    for (std::size_t i = 0; i < analysis.fill.size(); ++i) {
        const Report::FillColumn& column = analysis.fill[i];
        EXPECT_EQ(column.event, (i + 1) * analysis.fill[0].event);
        std::uint64_t used = 0;
        for (const auto& cell : column.cells) {
            used += cell.used;
            EXPECT_LE(cell.used, cell.records);
        }
        EXPECT_EQ(used, LiveAt(trace, column.event, [](const PlainBlock& block) {
                            return block.size <= 996;
                        }).blocks);
    }
}

// 20 groups get a block in turn. 11 of them have no growth of their own.
TEST(Analysis, SumsTheGrowthOfFurtherGroups) {
    std::string lines;
    for (int event = 0; event < 519; ++event) {
        const std::string pool = ":00000000000000" + std::to_string(10 + event % 20);
        const std::string block = ":0000000000000" + std::to_string(100 + event);
        lines += event < 20 ? "xmpt:c" + pool + "\n" : "xmpt:a" + pool + block + ":8\n";
    }
    const auto growth = Analyse(lines).growth;
    EXPECT_EQ(growth.back().event, 519U) << "The peak.";
    for (const Report::GrowthPoint& point : growth) {
        const std::uint64_t rounds = std::max<std::uint64_t>(point.event / 20, 1) - 1;
        EXPECT_GE(point.live.back(), 11 * 8 * rounds);
        EXPECT_LE(point.live.back(), 11 * 8 * (rounds + 1));
    }
}

// A block is temporary if the next event of its thread frees it, whatever other threads do between.
TEST(Analysis, KnowsThreadsAndTimes) {
    std::string file;
    Trace::CompactWriter writer([&](std::string_view bytes) { file += bytes; });
    writer.Write({Trace::Kind::Created, 1, 0, 0, {}, {}});
    writer.WriteOwned();
    const auto allocate = [&](std::uint64_t thread, std::uint64_t block) {
        writer.WriteThread(thread);
        writer.Write({Trace::Kind::Allocated, 1, block, 8, {}, {}});
    };
    allocate(1, 0x10);
    writer.Write({Trace::Kind::Time, 0, 0, 250, {}, {}});
    allocate(2, 0x20);
    writer.WriteThread(1);
    writer.WriteReleased(0x10);
    allocate(2, 0x30);
    writer.WriteReleased(0x20);
    writer.Write({Trace::Kind::Time, 0, 0, 300, {}, {}});
    writer.Finish();
    Trace::StepReader reader(Trace::MakeReader(Trace::Input(std::make_unique<TextSource>(file))),
                             "made");
    const Report::Analysis analysis = Report::Analyse(reader, usual, [](std::uint64_t) {});
    EXPECT_EQ(analysis.total.temporary, 1U);
    EXPECT_EQ(analysis.peak.milliseconds, 250U);
    EXPECT_EQ(analysis.growth.back().milliseconds, 250U);
    EXPECT_EQ(analysis.timeline.front().most.milliseconds, std::nullopt);
}

// A single pool for all holds no more than one per group, and the same if there is one group.
TEST(Analysis, ComparesOnePoolWithThoseOfTheGroups) {
    const Report::Analysis several = Analyse(MakeTrace(7, 3000).lines);
    EXPECT_LT(several.most.onePool, several.most.pools);
    std::string lines = Lines("@c:P\n");
    for (int block = 0; block < 500; ++block) {
        char text[80];
        std::snprintf(text, sizeof text, "xmpt:a:00000000006a1200:%016x:%d\n", block, block % 90);
        lines += text;
    }
    const Report::Analysis one = Analyse(lines + Lines("@x:P\n"));
    EXPECT_EQ(one.most.onePool, one.most.pools);
    EXPECT_EQ(one.timeline.back().most.onePool, one.timeline.back().most.pools) << "Cleared.";
    EXPECT_LT(one.timeline.back().most.pools, 3000U);
}

// A caller's stacks are one pool, as if the recording had been by caller.
TEST(Analysis, JoinsTheStacksOfACaller) {
    const std::vector<std::pair<std::string, std::string>> stacks = {
        {"main+0x1 (p);parse+0x2 (p);std::list::add(int)+0x3 (p)", "parse+0x2 (p)"},
        {"main+0x1 (p);parse+0x2 (p);xmalloc+0x8 (p);p+0x44 (libc.so.6)", "parse+0x2 (p)"},
        {"main+0x1 (p);parse+0x9 (p, p.c:3);operator new(unsigned long)+0x3 (q)",
         "parse+0x9 (p, p.c:3)"},
        {"main+0x1 (p);xmalloc+0x8 (p)", "main+0x1 (p)"}};
    std::map<std::string, std::string> pools;
    std::string byStack = "xmpt:i:by:stack\n";
    std::string byCaller = "xmpt:i:by:caller\n";
    for (std::size_t i = 0; i < stacks.size(); ++i) {
        const auto [place, isNew] = pools.try_emplace(stacks[i].second, 1, '0' + i);
        const auto lines = [&](const std::string& pool, const std::string& name, bool creates) {
            const std::string at = ":000000000000000" + pool;
            const std::string block = at + ":00000000000000" + std::to_string(10 + i) + ":";
            return (creates ? "xmpt:c" + at + "\nxmpt:n" + at + ":" + name + "\n" : "") + "xmpt:a" +
                   block + std::to_string(100 * i + 8) + (i == 1 ? "\nxmpt:f" + block : "") + "\n";
        };
        byStack += lines(std::to_string(i), stacks[i].first, true);
        byCaller += lines(place->second, stacks[i].second, isNew);
    }
    const Report::Analysis analysis = Analyse(byStack + "xmpt:d:0000000000000000\n");
    const auto json = nlohmann::json::parse(Report::ToJson(analysis));
    const auto plain = nlohmann::json::parse(Report::ToJson(Analyse(byCaller)));
    ASSERT_EQ(json["groups"].size(), 3U);
    for (std::size_t i = 0; i < 3; ++i) {
        EXPECT_EQ(json["groups"][i]["name"], plain["groups"][i]["name"]);
        EXPECT_EQ(json["groups"][i]["at_peak"], plain["groups"][i]["at_peak"]);
    }
    for (const char* held : {"asked", "pools", "heap"}) {
        EXPECT_EQ(json["most"][held], plain["most"][held]) << held;
    }
    EXPECT_EQ(
        json["groups"][2]["stack"],
        (std::vector<std::string>{"main+0x1 (p)", "parse+0x2 (p)", "std::list::add(int)+0x3 (p)"}));
    EXPECT_EQ(json["stacks"][0]["frames"],
              (std::vector<std::string>{"main+0x1 (p)", "xmalloc+0x8 (p)"}));
    EXPECT_EQ(json["stacks"][3]["bytes"], 108);
    EXPECT_EQ(json["stacks"][3]["at_peak"]["bytes"], 0);
    EXPECT_TRUE(analysis.passingOn.empty());
}

TEST(Stack, FindsWhatPassesMemoryOn) {
    std::vector<Report::StackRow> stacks;
    for (const char* caller : {"a", "b", "c"}) {
        stacks.push_back(
            {{"main+0x1 (p)", std::string(caller) + "+0x1 (p)",
              "make(int)+0x" + std::to_string(stacks.size()) + " (p)", "xmalloc+0x1 (p)"},
             {30, 30},
             {}});
    }
    EXPECT_EQ(Report::FindPassingOn(stacks, {}), Report::Skipped{"make"});
    EXPECT_EQ(Report::FindPassingOn(stacks, {"ma*"}), Report::Skipped{});
    stacks.push_back({{"main+0x1 (p)", "rest+0x1 (p)"}, {10, 10}, {}});
    EXPECT_EQ(Report::FindPassingOn(stacks, {}), Report::Skipped{"make"});
    stacks.back().all.blocks = 11;
    EXPECT_EQ(Report::FindPassingOn(stacks, {}), Report::Skipped{}) << "Less than 90 %.";
    stacks.resize(3);
    stacks.back().frames[1] = "make(int)+0x9 (p)";
    EXPECT_EQ(Report::FindPassingOn(stacks, {}), Report::Skipped{}) << "Two and itself.";
}

// Each wrapper allocates in one place, for callers with sizes of their own.
TEST(Stack, FindsWrappersTogether) {
    std::vector<Report::StackRow> stacks;
    const auto add = [&](const std::string& frame, std::uint64_t blocks,
                         const std::vector<std::uint64_t>& sizes) {
        for (const std::uint64_t size : sizes) {
            const std::string caller = "f" + std::to_string(stacks.size()) + "+0x1 (p)";
            stacks.push_back({{"main+0x1 (p)", caller, frame}, {blocks, blocks * size}, {}});
        }
    };
    add("0x10+0x4 (p)", 20, {16, 17, 18, 160});
    add("0x30+0x4 (p)", 20, {8, 60, 60, 80, 90, 90});
    add("alike+0x4 (p)", 10, {16, 17, 18, 159});
    add("few+0x4 (p)", 10, {8, 9, 999});
    add("same+0x4 (p)", 10, {8, 9, 10, 999, 999, 999, 999, 999, 999});
    add("places+0x4 (p)", 10, {8, 9, 10, 11});
    add("places+0x8 (p)", 10, {99});
    add("rest+0x4 (p)", 190, {8});
    const Report::Skipped both = {"p+0x10", "p+0x30"};
    EXPECT_EQ(Report::FindPassingOn(stacks, {}), both);
    ++stacks.back().all.blocks;
    EXPECT_EQ(Report::FindPassingOn(stacks, {}), Report::Skipped{}) << "Less than a third.";
}

TEST(Json, CutsNamesBetweenCharacters) {
    const Report::Analysis analysis =
        Analyse(Lines("@c:P\n@n:P:a\u00fc\u00fc\u00fc\u00fc\u00fcb\n@a:P:X:8\n@c:Q\n"));
    const auto json = nlohmann::json::parse(Report::ToJson(analysis, {1, 11, 1}));
    EXPECT_EQ(json["num_groups"], 2);
    ASSERT_EQ(json["groups"].size(), 1U);
    EXPECT_EQ(json["groups"][0]["name"], "a\u00fc...\u00fcb");
}

std::uint64_t Field(const std::string& report, const std::string& name) {
    return std::stoull(report.substr(report.find(':', report.find("   " + name)) + 1));
}

// Each step costs the pool what it costs the model, up to what malloc adds to a request.
TEST(PoolModel, HoldsWhatThePoolHolds) {
    constexpr PoolSettings various[] = {
        usual,
        {4010, 1000, 8, 4, true},
        {300, 200, 40, 16, false},
        {210, 206, 4, 1, true},
        {65535, 1000, 16, 3, false},
        {100, 96, 8, 4, false},  // The largest records have a bucket each.
        {100, 96, 8, 4, true},
        {4010, 4, 4, 4, false},  // Nothing fits into a bucket.
    };
    OBR::MemPool::NUV_OBR_MEMPOOL_ON(true);
    for (const PoolSettings& settings : various) {
        settings.Apply();
        std::mt19937 random(11);
        OBR::MemPool::Mgr pool("compared");
        Report::PoolModel model(settings);
        model.Create(0);
        struct Live {
            void* block;
            Report::Place place;
            std::uint32_t size;
        };
        std::vector<Live> live;
        live.reserve(6000);
        std::uint64_t extra = 0;  // What malloc may have added at most.
        for (int step = 0; step < 6000; ++step) {
            // Only the pool's own requests are counted.
            const auto before = static_cast<std::int64_t>(model.BytesHeld());
            if (random() % 2000 == 0) {
                model.Clear(0);
                extra = 24 * (live.size() + 300);
                live.clear();
                HeapCount::Start();
                pool.Clear();
            } else if (live.empty() || random() % 100 < (step / 700 % 2 == 0 ? 75U : 30U)) {
                const std::uint32_t size = SomeSize(random);
                const Report::Place place = model.Allocate(0, size);
                extra = 72;
                HeapCount::Start();
                live.push_back({pool.Alloc(size), place, size});
            } else {
                std::swap(live[random() % live.size()], live.back());
                const Live last = live.back();
                live.pop_back();
                model.Free(0, last.place, last.size);
                extra = 48;
                HeapCount::Start();
                pool.Free(last.block);
            }
            const auto held = static_cast<double>(HeapCount::Stop());
            const auto after = static_cast<std::int64_t>(model.BytesHeld());
            ASSERT_NEAR(held, static_cast<double>(after - before), static_cast<double>(extra));
            if (step % 500 != 0) { continue; }
            Output output;
            pool.Dbg();
            const std::string text = output.Take();
            std::uint64_t free = 0;
            for (const Report::SizeClass& sizeClass : model.Classes()) {
                free += sizeClass.records - sizeClass.usedRecords;
            }
            ASSERT_EQ(Field(text, "Free Recs"), free);
        }
    }
    usual.Apply();
}

}  // namespace
