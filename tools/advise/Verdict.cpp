#include "advise/Verdict.hpp"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <functional>
#include <tuple>

#include "advise/Space.hpp"

namespace Advise {

namespace {

// Bytes are counted, not timed, and stray by little but what the heap splits off a block.
constexpr double smallestGain = 0.01;

using Index = std::optional<std::size_t>;

// The first of those that pass with the least key.
template <typename Key>
Index Least(const std::vector<Measured>& settings,
            const std::function<bool(const Figures&)>& passes, const Key& key) {
    Index least;
    for (std::size_t i = 0; i < settings.size(); ++i) {
        if (!passes(settings[i].figures)) { continue; }
        if (!least.has_value() || key(settings[i]) < key(settings[*least])) { least = i; }
    }
    return least;
}

// The one with the least cost at both, or one that is as good, within the spread of its runs, with
// fewer changes.
Index Simplest(const Findings& findings, const std::function<bool(const Figures&)>& passes) {
    const auto cost = [&](const Figures& figures) {
        return Cost(figures, findings.heap, Aim::Both);
    };
    const Index least =
        Least(findings.settings, passes, [&](const Measured& each) { return cost(each.figures); });
    if (!least.has_value()) { return least; }
    const Figures& best = findings.settings[*least].figures;
    const double most = (1 + best.nsSpread / best.nsPerEvent) * cost(best);
    return Least(
        findings.settings,
        [&](const Figures& figures) { return passes(figures) && cost(figures) <= most; },
        [&](const Measured& each) {
            return std::tuple(NumDifferences(each.settings, Replay::PoolSettings()),
                              cost(each.figures));
        });
}

bool IsFaster(const Figures& figures, const Figures& heap) {
    return figures.nsPerEvent < heap.nsPerEvent && TimesDiffer(figures, heap);
}
bool IsSmaller(const Figures& figures, const Figures& heap) {
    return figures.bytesHeld < (1 - smallestGain) * heap.bytesHeld;
}
bool Gains(const Figures& figures, const Figures& heap) {
    return IsFaster(figures, heap) || IsSmaller(figures, heap);
}

}  // namespace

const char* Verdict::Name() const {
    if (isFaster) { return isSmaller ? "both" : "faster"; }
    return isSmaller ? "smaller" : "none";
}

Verdict Judge(const Findings& findings) {
    const Figures& heap = findings.heap;
    const auto any = [](const Figures&) { return true; };
    Verdict verdict;
    verdict.fastest = Least(findings.settings, any, [](const Measured& each) {
        return std::tuple(each.figures.nsPerEvent, each.figures.bytesHeld);
    });
    verdict.smallest = Least(findings.settings, any, [](const Measured& each) {
        return std::tuple(each.figures.bytesHeld, each.figures.nsPerEvent);
    });
    const auto costsNothing = [&](const Figures& figures) {
        return figures.nsPerEvent <= heap.nsPerEvent && figures.bytesHeld <= heap.bytesHeld;
    };
    verdict.best = verdict.advised = Simplest(findings, [&](const Figures& figures) {
        return costsNothing(figures) && Gains(figures, heap);
    });
    if (!verdict.best.has_value()) {
        verdict.best = Simplest(findings, costsNothing);
        verdict.advised = Simplest(findings, [&](const Figures& figures) {
            return Gains(figures, heap) && Cost(figures, heap, Aim::Both) < 1;
        });
    }
    if (verdict.advised.has_value()) {
        const Figures& advised = findings.settings[*verdict.advised].figures;
        verdict.isFaster = IsFaster(advised, heap);
        verdict.isSmaller = IsSmaller(advised, heap);
    }
    return verdict;
}

bool TimesDiffer(const Figures& a, const Figures& b) {
    return std::abs(a.nsPerEvent - b.nsPerEvent) > std::max(a.nsSpread, b.nsSpread);
}

double TimeOfProgram(double share, double ratio) {
    return 1 - share * (1 - ratio);
}

std::optional<double> ShareOf(const std::string& text) {
    double share = 0;
    const char* const last = text.data() + text.size();
    const auto [end, error] = std::from_chars(text.data(), last, share);
    const bool isShare = error == std::errc() && end == last && share >= 0 && share <= 1;
    return isShare ? std::optional(share) : std::nullopt;
}

std::vector<std::pair<std::string, std::string>> EnvironmentOf(
    const Replay::PoolSettings& settings) {
    std::vector<std::pair<std::string, std::string>> variables = {{"NUV_OBR_MEMPOOL_ON", "1"}};
    for (const auto& row : OBR::MemPool::SettingTable::all) {
        variables.emplace_back(row.variable, std::to_string(row.In(settings)));
    }
    return variables;
}

std::vector<std::string> CodeOf(const Replay::PoolSettings& settings) {
    std::vector<std::string> lines = {"OBR::MemPool::HeapSettings()", "    .On(true)"};
    for (const auto& row : OBR::MemPool::SettingTable::all) {
        const unsigned int value = row.In(settings);
        const std::string argument = !row.IsFlag() ? std::to_string(value)
                                     : value != 0  ? "true"
                                                   : "false";
        lines.push_back(std::string("    .") + row.word + "(" + argument + ")");
    }
    return lines;
}

}  // namespace Advise
