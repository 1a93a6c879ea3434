#include "advise/Verdict.hpp"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <functional>
#include <tuple>

#include <fmt/format.h>

#include "advise/Space.hpp"

namespace Advise {

namespace {

// The smallest price that counts, in bytes and in the time of the whole program.
constexpr double leastPrice = 0.01;
// With fewer events there is nothing to gain.
constexpr std::uint64_t leastEvents = 1000;

using Index = std::optional<std::size_t>;

// The first one with the smallest key among those that pass.
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

std::string Percent(double share) {
    return fmt::format("{:.{}f} %", 100 * share, share < 0.1 ? 1 : 0);
}

// Judges settings by their effect on one program.
class Judging {
public:
    Judging(const Findings& measured, const Program& whole)
        : findings(measured), program(whole), share(program.allocationShare) {
        // The program is too short for samples, but not for the replayed time of its events.
        if (!share.has_value() && program.seconds > 0.) {
            const auto numEvents = static_cast<double>(program.numEvents + program.numLeftOut);
            share = std::min(1., numEvents * findings.heap.time / 1e9 / *program.seconds);
        }
        if (program.seconds > 0.) { start = program.startSeconds / *program.seconds; }
    }

    Verdict Judge() const {
        const auto any = [](const Figures&) { return true; };
        Verdict verdict;
        verdict.fastest = Least(findings.settings, any, [](const Measured& each) {
            return std::tuple(each.figures.time, each.figures.bytes);
        });
        verdict.smallest = Least(findings.settings, any, [](const Measured& each) {
            return std::tuple(each.figures.bytes, each.figures.time);
        });
        const auto isFree = [&](const Figures& figures) {
            return !HasFewEvents() && TimeEffect(figures) != Effect::Price &&
                   BytesEffect(figures) != Effect::Price;
        };
        const auto gains = [&](const Figures& figures) {
            return TimeEffect(figures) == Effect::Gain || BytesEffect(figures) == Effect::Gain;
        };
        verdict.best = verdict.advised =
            Simplest([&](const Figures& figures) { return isFree(figures) && gains(figures); });
        if (!verdict.best.has_value()) {
            verdict.best = Simplest(isFree);
            verdict.advised = Simplest([&](const Figures& figures) {
                return gains(figures) && (1 - Saved(figures)) * BytesRatio(figures) < 1;
            });
        }
        // A replay shows neither a lock nor threads that wait for it.
        if (HasThreads()) { verdict.advised = std::nullopt; }
        if (verdict.advised.has_value()) {
            const Figures& advised = findings.settings[*verdict.advised].figures;
            verdict.time = TimeEffect(advised);
            verdict.bytes = BytesEffect(advised);
        }
        if (findings.mimalloc.has_value()) {
            const Figures& other = *findings.mimalloc;
            const double pools = verdict.advised.has_value() ? BothRatio(Of(*verdict.advised)) : 1;
            verdict.isMimallocBetter = other.rounds >= leastRounds && isFree(other) &&
                                       gains(other) &&
                                       (1 + other.spread / other.time) * BothRatio(other) < pools;
        }
        verdict.sentences = SentencesOf(verdict);
        return verdict;
    }

private:
    double TimeRatio(const Figures& figures) const {
        return Cost(figures, findings.heap, Aim::Time);
    }
    double BytesRatio(const Figures& figures) const {
        return Cost(figures, findings.heap, Aim::Bytes);
    }
    double BothRatio(const Figures& figures) const {
        return Cost(figures, findings.heap, Aim::Both);
    }

    bool HasFewEvents() const { return program.numEvents < leastEvents; }
    bool HasThreads() const { return program.numThreads > 1; }

    // The share of the program's time that it would save, less than 0 if it would take longer. A
    // difference within the spread counts as none.
    double Saved(const Figures& figures) const { return Saved(figures, share.value_or(1)); }
    double Saved(const Figures& figures, double ofShare) const {
        const bool differs = DifferInTime(figures, findings.heap);
        return (differs ? ofShare * (1 - TimeRatio(figures)) : 0) - start;
    }

    Effect TimeEffect(const Figures& figures) const {
        if (HasFewEvents()) { return Effect::None; }
        const double leastShare = share.value_or(1) - program.shareError.value_or(0);
        if (Saved(figures, leastShare) >= program.leastGain.time) { return Effect::Gain; }
        return Saved(figures) <= -leastPrice ? Effect::Price : Effect::None;
    }

    Effect BytesEffect(const Figures& figures) const {
        const double ratio = BytesRatio(figures);
        if (HasFewEvents()) { return Effect::None; }
        if (ratio < 1 - program.leastGain.bytes) { return Effect::Gain; }
        return ratio > 1 + leastPrice ? Effect::Price : Effect::None;
    }

    // The settings with the least cost in time and bytes, or ones with fewer changes that are as
    // good within the spread. The time of fewer rounds is worth nothing.
    Index Simplest(const std::function<bool(const Figures&)>& suits) const {
        const auto passes = [&](const Figures& figures) {
            return figures.rounds >= leastRounds && suits(figures);
        };
        const Index least = Least(findings.settings, passes,
                                  [&](const Measured& each) { return BothRatio(each.figures); });
        if (!least.has_value()) { return least; }
        const Figures& best = findings.settings[*least].figures;
        const double most = (1 + best.spread / best.time) * BothRatio(best);
        return Least(
            findings.settings,
            [&](const Figures& figures) { return passes(figures) && BothRatio(figures) <= most; },
            [&](const Measured& each) {
                return std::tuple(NumDifferences(each.settings, OBR::MemPool::PoolSettings()),
                                  BothRatio(each.figures));
            });
    }

    std::vector<std::string> SentencesOf(const Verdict& verdict) const {
        std::vector<std::string> sentences = {
            verdict.advised.has_value() ? Gain(verdict, Of(*verdict.advised)) : NoGain(verdict)};
        if (program.numLeftOut != 0) {
            sentences.push_back(
                fmt::format("Only the first {} of {} events were replayed; a larger --seconds "
                            "covers more.",
                            program.numEvents, program.numEvents + program.numLeftOut));
        }
        if (!share.has_value()) {
            sentences.emplace_back(
                "The trace does not say which share of the program's time its allocation calls "
                "take.");
        } else if (verdict.advised.has_value()) {
            sentences.push_back(fmt::format(
                "{}: with pools the program would take about {}, not counting what the places of "
                "its blocks change.",
                Share(), Percent(1 - Saved(Of(*verdict.advised)))));
        } else if (sentences.front().find(Share()) != 0) {
            sentences.push_back(Share() + ".");
        }
        if (verdict.isMimallocBetter) {
            sentences.push_back(
                fmt::format("{} mimalloc would help{}: it takes {:.2f} of the heap's time and "
                            "{:.2f} of its bytes.",
                            verdict.advised.has_value() ? "Preloaded" : "Only preloaded",
                            verdict.advised.has_value() ? " more" : "",
                            TimeRatio(*findings.mimalloc), BytesRatio(*findings.mimalloc)));
        }
        return sentences;
    }

    // What the allocation calls take, which is known.
    std::string Share() const {
        const std::string error = program.shareError.has_value()
                                      ? fmt::format(" (+/- {})", Percent(*program.shareError))
                                      : "";
        return fmt::format("Allocation calls take an estimated {}{} of the program's time",
                           Percent(*share), error);
    }

    const Figures& Of(std::size_t index) const { return findings.settings[index].figures; }

    std::string Gain(const Verdict& verdict, const Figures& pools) const {
        const bool isPaid = verdict.time == Effect::Price || verdict.bytes == Effect::Price;
        const char* const time =
            verdict.time != Effect::None          ? ""
            : !DifferInTime(pools, findings.heap) ? " (the same, within the spread of the runs)"
            : std::abs(Saved(pools)) < leastPrice ? " (which the program would not notice)"
                                                  : " (too little to promise)";
        return fmt::format(
            "Pools would help{}: they take {:.2f} of the heap's time{} and {:.2f} "
            "of its bytes.",
            isPaid ? ", at a price" : "", TimeRatio(pools), time, BytesRatio(pools));
    }

    std::string NoGain(const Verdict& verdict) const {
        if (HasFewEvents()) {
            return fmt::format("The program would not notice: it has only {} events.",
                               program.numEvents);
        }
        if (HasThreads()) {
            return fmt::format(
                "Pools would not help: {} threads of the program allocate, a pool serves one at a "
                "time, and a replay does not show how long the others wait.",
                program.numThreads);
        }
        const bool isMeasured =
            std::any_of(findings.settings.begin(), findings.settings.end(),
                        [](const Measured& each) { return each.figures.rounds >= leastRounds; });
        if (!isMeasured) {
            return "Too few replays for a verdict: more --seconds allow more of them.";
        }
        if (verdict.fastest.has_value() && share.has_value()) {
            const double saved = Saved(Of(*verdict.fastest));
            if (saved <= 0 && saved + start > 0) {
                return fmt::format(
                    "Pools would not help: they save no more than the start of the preloaded "
                    "library takes, {} of the program's time.",
                    Percent(start));
            }
            if (saved > 0 && saved < leastPrice) {
                return fmt::format(
                    "{}: it would not notice that pools save {}, unless its blocks lie better "
                    "there.",
                    Share(), Percent(saved));
            }
            if (saved > 0 && TimeEffect(Of(*verdict.fastest)) == Effect::None) {
                return fmt::format("{}: pools might save {}, which is too little to promise.",
                                   Share(), Percent(saved));
            }
        }
        return fmt::format(
            "{} would not help: no settings gain more than the spread of the runs and more than "
            "they cost.",
            program.hasPlan ? "One pool for all blocks" : "Pools");
    }

    const Findings& findings;
    const Program& program;
    std::optional<double> share;  // Of the program's time, in allocation calls.
    double start = 0;             // The same of the start of preloaded pools.
};

}  // namespace

const char* Verdict::Name() const {
    if (time == Effect::Gain) { return bytes == Effect::Gain ? "both" : "faster"; }
    return bytes == Effect::Gain ? "smaller" : "none";
}

const char* Verdict::Price() const {
    return time == Effect::Price ? "time" : bytes == Effect::Price ? "bytes" : "none";
}

Verdict Judge(const Findings& findings, const Program& program) {
    return Judging(findings, program).Judge();
}

std::optional<double> NumberIn(const std::string& text, double most) {
    double number = 0;
    const char* const last = text.data() + text.size();
    const auto [end, error] = std::from_chars(text.data(), last, number);
    const bool isNumber = error == std::errc() && end == last && number >= 0 && number <= most;
    return isNumber ? std::optional(number) : std::nullopt;
}

std::vector<std::pair<std::string, std::string>> EnvironmentOf(
    const OBR::MemPool::PoolSettings& settings) {
    std::vector<std::pair<std::string, std::string>> variables = {{"NUV_OBR_MEMPOOL_ON", "1"}};
    for (const auto& row : OBR::MemPool::SettingTable::all) {
        variables.emplace_back(row.variable, std::to_string(row.In(settings)));
    }
    return variables;
}

std::vector<std::string> CodeOf(const OBR::MemPool::PoolSettings& settings, Replay::Layer layer) {
    const bool isForHeap = layer == Replay::Layer::Heap;
    if (layer == Replay::Layer::Malloc) { return {}; }
    std::vector<std::string> lines = {"OBR::MemPool::NUV_OBR_MEMPOOL_ON(true);"};
    if (isForHeap) { lines = {"OBR::MemPool::HeapSettings()", "    .On(true)"}; }
    for (const auto& row : OBR::MemPool::SettingTable::all) {
        const unsigned int value = row.In(settings);
        if (value == row.In(OBR::MemPool::PoolSettings())) { continue; }
        const std::string argument = !row.IsFlag() ? std::to_string(value)
                                     : value != 0  ? "true"
                                                   : "false";
        lines.push_back(isForHeap ? fmt::format("    .{}({})", row.word, argument)
                                  : fmt::format("OBR::MemPool::{}({});", row.variable, argument));
    }
    return lines;
}

}  // namespace Advise
