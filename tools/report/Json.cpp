// The keys of the JSON and their values.

#include "report/Json.hpp"

#include <algorithm>
#include <charconv>
#include <cstdint>
#include <map>
#include <optional>
#include <utility>
#include <vector>

#include <nlohmann/json.hpp>

#include "trace/CutText.hpp"

namespace Report {

namespace {

using Json = nlohmann::ordered_json;

Json ToJson(const BlockSum& sum) {
    return {{"blocks", sum.blocks}, {"bytes", sum.bytes}};
}

// Adds the figures of a set of blocks.
void AddTally(Json& json, const Tally& tally) {
    json["blocks"] = tally.all.blocks;
    json["bytes"] = tally.all.bytes;
    json["at_peak"] = ToJson(tally.atPeak);
    json["in_records"] = ToJson(tally.inRecords);
    json["padding"] = tally.padding;
    json["lifetimes"] = tally.lifetimes;
    json["cleared"] = tally.dropped;
    json["temporary"] = tally.temporary;
    json["never"] = tally.never.blocks;
    json["never_bytes"] = tally.never.bytes;
}

Json ToJson(const Runs& runs) {
    return {{"blocks", runs.together},        {"runs", runs.numRuns},
            {"longest", runs.longest},        {"by_length", runs.byLength},
            {"clear_blocks", runs.clearable}, {"clear_runs", runs.numClears}};
}

Json Seconds(const std::optional<std::uint64_t>& milliseconds) {
    if (!milliseconds.has_value()) { return nullptr; }
    return static_cast<double>(*milliseconds) / 1000;
}

Json ToJson(const Moment& moment) {
    return {{"event", moment.event}, {"seconds", Seconds(moment.milliseconds)},
            {"asked", moment.asked}, {"blocks", moment.blocks},
            {"pools", moment.pools}, {"one_pool", moment.onePool},
            {"heap", moment.heap},   {"heap_chunks", moment.chunks}};
}

// A number if the fact is one, null if the trace does not have it.
Json FactValue(const std::map<std::string, std::string>& facts, const char* key) {
    const auto fact = facts.find(key);
    if (fact == facts.end()) { return nullptr; }
    const Json number = Json::parse(fact->second, nullptr, false);
    return number.is_number() ? number : Json(fact->second);
}

void AddFacts(Json& json, const Analysis& analysis) {
    json["trace"] = analysis.trace;
    for (const char* key : {"program", "by", "cpu_seconds", "allocation_share",
                            "allocation_share_error", "threads", "foreign_frees"}) {
        json[key] = FactValue(analysis.facts, key);
    }
    // The name of a program may be a number.
    if (!json["program"].is_null()) { json["program"] = analysis.facts.at("program"); }
    json["facts"] = analysis.facts;

    Json faults = Json::object();
    for (std::size_t fault = 0; fault < Trace::faultNames.size(); ++fault) {
        const std::uint64_t number = analysis.badLines.numFaults[fault];
        if (number != 0) { faults[Trace::faultNames[fault]] = number; }
    }
    json["bad_lines"] = {{"total", analysis.badLines.Total()}, {"faults", std::move(faults)}};
    json["warning"] = analysis.warning.empty() ? Json(nullptr) : Json(analysis.warning);

    for (const auto& row : OBR::MemPool::SettingTable::all) {
        const unsigned int value = row.In(analysis.settings);
        json["settings"][row.key] = row.IsFlag() ? Json(value != 0) : Json(value);
    }
}

void AddTotals(Json& json, const Analysis& analysis) {
    json["events"] = analysis.events;
    json["frees"] = analysis.frees;
    json["clears"] = analysis.clears;
    AddTally(json, analysis.total);
    json["peak"] = ToJson(analysis.peak);
    json["most"] = ToJson(analysis.most);
    json["most"].erase("event");
    json["most"].erase("seconds");
    json["together"] = ToJson(analysis.runs);
    std::vector<std::uint64_t> bounds;
    for (std::uint64_t bound = 10; bounds.size() + 1 < numLifetimes; bound *= 10) {
        bounds.push_back(bound);
    }
    json["lifetime_bounds"] = bounds;
}

void AddSizes(Json& json, const Analysis& analysis) {
    json["sizes"] = Json::array();
    for (const SizeRow& row : analysis.sizes) {
        Json size = {{"smallest", row.smallest}, {"largest", row.largest}};
        AddTally(size, row.tally);
        json["sizes"].push_back(std::move(size));
    }
}

void AddGroups(Json& json, const Analysis& analysis, const JsonLimits& limits) {
    json["num_groups"] = analysis.groups.size();
    json["groups"] = Json::array();
    for (const GroupRow& row : analysis.groups) {
        if (json["groups"].size() == limits.groups) { break; }
        Json group = {{"name", Trace::CutText(row.name, limits.nameBytes)},
                      {"pools", row.numPools}};
        AddTally(group, row.tally);
        group["stack"] = row.stack;
        group["together"] = ToJson(row.runs);
        json["groups"].push_back(std::move(group));
    }
}

void AddStacks(Json& json, const Analysis& analysis, const JsonLimits& limits) {
    json["num_stacks"] = analysis.stacks.size();
    json["stacks"] = Json::array();
    for (const StackRow& row : analysis.stacks) {
        if (json["stacks"].size() == limits.stacks) { break; }
        json["stacks"].push_back({{"frames", row.frames},
                                  {"blocks", row.all.blocks},
                                  {"bytes", row.all.bytes},
                                  {"at_peak", ToJson(row.atPeak)}});
    }
}

void AddTimeline(Json& json, const Analysis& analysis) {
    Json lines = Json::object();
    for (const char* key : {"event", "seconds", "asked", "least_asked", "blocks", "pools",
                            "one_pool", "heap", "heap_chunks"}) {
        lines[key] = Json::array();
    }
    for (const Point& point : analysis.timeline) {
        const Json moment = ToJson(point.most);
        for (const auto& [key, value] : moment.items()) { lines[key].push_back(value); }
        lines["least_asked"].push_back(point.leastAsked);
    }
    json["timeline"] = std::move(lines);
}

void AddGrowth(Json& json, const Analysis& analysis, const JsonLimits& limits) {
    const std::size_t numGrowing = std::min(analysis.groups.size(), maxGrowing);
    Json growth = {{"event", Json::array()}, {"seconds", Json::array()}, {"groups", Json::array()}};
    for (std::size_t i = 0; i < numGrowing; ++i) {
        growth["groups"].push_back(
            {{"name", Trace::CutText(analysis.groups[i].name, limits.nameBytes)},
             {"bytes", Json::array()}});
    }
    growth["others"] = Json::array();
    for (const GrowthPoint& point : analysis.growth) {
        growth["event"].push_back(point.event);
        growth["seconds"].push_back(Seconds(point.milliseconds));
        for (std::size_t i = 0; i < numGrowing; ++i) {
            growth["groups"][i]["bytes"].push_back(point.live[i]);
        }
        growth["others"].push_back(point.live.back());
    }
    json["growth"] = std::move(growth);
}

// A row per size class that ever has a bucket; if there are too many, those with the most bytes.
void AddFill(Json& json, const Analysis& analysis, const JsonLimits& limits) {
    struct Row {
        std::vector<std::uint64_t> used;
        std::vector<std::uint64_t> records;
        std::uint64_t mostBytes = 0;
    };
    const std::size_t numColumns = analysis.fill.size();
    std::map<std::uint32_t, Row> rows;
    Json events = Json::array();
    for (std::size_t i = 0; i < numColumns; ++i) {
        events.push_back(analysis.fill[i].event);
        for (const FillColumn::Cell& cell : analysis.fill[i].cells) {
            Row& row = rows[cell.sizeClass];
            row.used.resize(numColumns);
            row.records.resize(numColumns);
            row.used[i] = cell.used;
            row.records[i] = cell.records;
            row.mostBytes =
                std::max(row.mostBytes, cell.records * analysis.classes[cell.sizeClass].dataSize);
        }
    }
    json["fill"] = {{"event", std::move(events)}, {"num_classes", rows.size()}};
    std::vector<std::pair<std::uint64_t, std::uint32_t>> order;
    order.reserve(rows.size());
    for (const auto& [number, row] : rows) { order.emplace_back(row.mostBytes, number); }
    std::sort(order.rbegin(), order.rend());
    order.resize(std::min(order.size(), limits.fillRows));
    std::sort(order.begin(), order.end(),
              [](const auto& a, const auto& b) { return a.second < b.second; });
    Json& classes = json["fill"]["classes"] = Json::array();
    for (const auto& [bytes, number] : order) {
        const SizeClass& sizeClass = analysis.classes[number];
        classes.push_back({{"data_size", sizeClass.dataSize},
                           {"records_a_bucket", sizeClass.recsPerBucket},
                           {"used", rows[number].used},
                           {"records", rows[number].records}});
    }
}

}  // namespace

std::string ToJson(const Analysis& analysis, const JsonLimits& limits) {
    Json json;
    AddFacts(json, analysis);
    AddTotals(json, analysis);
    AddSizes(json, analysis);
    AddGroups(json, analysis, limits);
    AddStacks(json, analysis, limits);
    AddTimeline(json, analysis);
    AddGrowth(json, analysis, limits);
    AddFill(json, analysis, limits);
    return json.dump(-1, ' ', false, Json::error_handler_t::replace);
}

}  // namespace Report
