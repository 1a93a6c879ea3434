// The times of settings are kept as ratios: each one to the times of the heap right before and
// right after it. If the machine is slower for a while, it is slower for both, so that settings can
// be compared even if they were measured at different times.

#include "advise/Search.hpp"

#include <algorithm>
#include <optional>
#include <set>
#include <stdexcept>
#include <utility>
#include <variant>
#include <vector>

#include "advise/Space.hpp"

namespace Advise {

namespace {

using OBR::MemPool::PoolSettings;

// The leaders have this many rounds at the end, unless time runs out.
constexpr unsigned int enoughRounds = 15;
constexpr unsigned int roundsOfMimalloc = 7;
// The search steps to a neighbour only if its ratio is at most this.
constexpr double worthAStep = 0.99;
// Settings that are timed between two replays of the heap.
constexpr std::size_t batchSize = 4;
// Each phase ends when this share of the time has passed.
constexpr double lookingShare = 0.4;
constexpr double walkingShare = 0.7;

constexpr const char* heapFailed = "the replay on the heap failed";
constexpr const char* endedEarly =
    "the search ended before the heap was measured; let it run longer, or raise --seconds";

// Settings, or mimalloc, during the search.
struct Candidate {
    Side side;
    double bytes;
    std::vector<double> ratios;  // Of its time to the heap's, one per round.
};

struct Less {
    bool operator()(const PoolSettings& a, const PoolSettings& b) const {
        for (const auto& row : OBR::MemPool::SettingTable::all) {
            if (row.In(a) != row.In(b)) { return row.In(a) < row.In(b); }
        }
        return false;
    }
};

class Searcher {
public:
    Searcher(Meter& replays, double budget, const std::function<void(std::size_t)>& progress)
        : meter(replays), seconds(budget), atStep(progress) {
        heapBytes = FirstOfHeap(meter.Held(Malloc()));
        heapTimes.push_back(FirstOfHeap(meter.Time(Malloc())));
    }

    Findings Run() {
        const std::vector<PoolSettings> grid = CoarseGrid();
        // The defaults have enough rounds for a verdict however short the time is.
        Look({grid.front()});
        Confirm(Aim::Time, leastRounds, 1e9);
        for (std::size_t i = 1; i < grid.size() && HasTime(lookingShare); i += batchSize) {
            const std::size_t end = std::min(i + batchSize, grid.size());
            Look({grid.begin() + static_cast<std::ptrdiff_t>(i),
                  grid.begin() + static_cast<std::ptrdiff_t>(end)});
        }
        for (const Aim aim : aims) { Walk(aim); }
        TryMimalloc();
        // The number of the most promising, and the rounds that they get.
        constexpr std::pair<std::size_t, unsigned int> halvings[] = {{8, 3}, {4, 6}, {2, 10}};
        for (const auto& [numBest, rounds] : halvings) {
            for (const Aim aim : aims) { AddRounds(Best(aim, numBest), rounds); }
        }
        for (const Aim aim : aims) { Confirm(aim, enoughRounds, 1); }
        AddRounds(Alive(), leastRounds);
        for (const Aim aim : aims) { Confirm(aim, enoughRounds, 1); }
        // Without a time limit: the figure of a single round is worthless.
        for (const Aim aim : aims) { Confirm(aim, leastRounds, 1e9); }
        return Finish();
    }

private:
    double FirstOfHeap(const Outcome& outcome) const {
        if (!outcome.figure.has_value() && meter.IsStopped()) {
            throw std::runtime_error(endedEarly);
        }
        return outcome.OrFail(heapFailed);
    }

    bool HasTime(double share) const {
        return !meter.IsStopped() && meter.Elapsed() < share * seconds;
    }

    // Tries those that were not tried yet, one round each.
    void Look(const std::vector<PoolSettings>& settings) {
        std::vector<std::size_t> added;
        for (const PoolSettings& each : settings) {
            if (!HasTime(1)) { break; }
            if (!tried.insert(each).second) { continue; }
            const Outcome held = meter.Held(each);
            if (meter.IsStopped()) { break; }
            if (held.figure.has_value()) {
                added.push_back(candidates.size());
                candidates.push_back({each, *held.figure, {}});
            } else {
                givenUp.push_back({each, held.problem});
            }
        }
        Time(added);
    }

    // Measures one round for each of these.
    void Time(const std::vector<std::size_t>& indices) {
        for (std::size_t i = 0; i < indices.size(); i += batchSize) {
            const std::size_t end = std::min(i + batchSize, indices.size());
            std::vector<Outcome> outcomes;
            for (std::size_t j = i; j < end; ++j) {
                outcomes.push_back(meter.Time(candidates[indices[j]].side));
            }
            const Outcome heap = meter.Time(Malloc());
            if (meter.IsStopped()) { return; }
            const double before = heapTimes.back();
            heapTimes.push_back(heap.OrFail(heapFailed));
            const double beside = (before + heapTimes.back()) / 2;
            for (std::size_t j = i; j < end; ++j) { Add(indices[j], outcomes[j - i], beside); }
            atStep(tried.size());
        }
    }

    void Add(std::size_t index, const Outcome& outcome, double heapTime) {
        Candidate& candidate = candidates[index];
        if (outcome.figure.has_value()) {
            candidate.ratios.push_back(*outcome.figure / heapTime);
        } else {
            if (index != mimalloc) { givenUp.push_back({SettingsOf(index), outcome.problem}); }
            dead.insert(index);
        }
    }

    // Measures mimalloc, if it is installed.
    void TryMimalloc() {
        const Outcome held = meter.Held(Mimalloc());
        if (!held.figure.has_value()) { return; }
        mimalloc = candidates.size();
        candidates.push_back({Mimalloc(), *held.figure, {}});
        AddRounds({*mimalloc}, roundsOfMimalloc);
    }

    const PoolSettings& SettingsOf(std::size_t index) const {
        return std::get<PoolSettings>(candidates[index].side);
    }

    // Steps to the best neighbour as long as it is better.
    void Walk(Aim aim) {
        auto center = Confirm(aim, leastRounds, walkingShare);
        while (center.has_value() && HasTime(walkingShare)) {
            Look(Neighbours(SettingsOf(*center)));
            const auto next = Confirm(aim, leastRounds, walkingShare);
            if (!next.has_value() || CostOf(*next, aim) >= worthAStep * CostOf(*center, aim)) {
                return;
            }
            center = next;
        }
    }

    // Adds rounds until the leader has that many, or that share of the time has passed. Returns the
    // leader; none if all were given up.
    std::optional<std::size_t> Confirm(Aim aim, unsigned int rounds, double share) {
        std::vector<std::size_t> leader = Best(aim, 1);
        while (!leader.empty() && NumRounds(leader.front()) < rounds && HasTime(share)) {
            Time(leader);
            leader = Best(aim, 1);
        }
        return leader.empty() ? std::nullopt : std::optional(leader.front());
    }

    // Adds rounds until these have that many, or time runs out.
    void AddRounds(const std::vector<std::size_t>& indices, unsigned int rounds) {
        for (unsigned int round = 0; round < rounds; ++round) {
            std::vector<std::size_t> batch;
            for (std::size_t place = 0; place < indices.size() && HasTime(1); ++place) {
                const std::size_t index = indices[place];
                if (NumRounds(index) <= round && dead.count(index) == 0) { batch.push_back(index); }
                if (batch.size() == batchSize || place + 1 == indices.size()) {
                    Time(std::exchange(batch, {}));
                }
            }
        }
    }

    // The settings that were timed and not given up.
    std::vector<std::size_t> Alive() const {
        std::vector<std::size_t> alive;
        for (std::size_t i = 0; i < candidates.size(); ++i) {
            const bool isTimed = !candidates[i].ratios.empty() && dead.count(i) == 0;
            if (isTimed && i != mimalloc) { alive.push_back(i); }
        }
        return alive;
    }

    // The best of those that were not given up, the best first.
    std::vector<std::size_t> Best(Aim aim, std::size_t number) const {
        std::vector<std::size_t> best = Alive();
        std::sort(best.begin(), best.end(), [&](std::size_t a, std::size_t b) {
            return std::pair(CostOf(a, aim), a) < std::pair(CostOf(b, aim), b);
        });
        best.resize(std::min(number, best.size()));
        return best;
    }

    std::size_t NumRounds(std::size_t index) const { return candidates[index].ratios.size(); }

    double CostOf(std::size_t index, Aim aim) const {
        const Candidate& candidate = candidates[index];
        return Cost({Quantile(candidate.ratios, 0.5), 0, candidate.bytes, 0}, {1, 0, heapBytes, 0},
                    aim);
    }

    Findings Finish() const {
        Findings findings{FiguresOfHeap(heapTimes, heapBytes), {}, {}, givenUp};
        const auto figuresOf = [&](const Candidate& each) {
            return FiguresOf(each.ratios, each.bytes, findings.heap.time);
        };
        for (const std::size_t i : Alive()) {
            findings.settings.push_back({SettingsOf(i), figuresOf(candidates[i])});
        }
        if (mimalloc.has_value() && !candidates[*mimalloc].ratios.empty()) {
            findings.mimalloc = figuresOf(candidates[*mimalloc]);
        }
        return findings;
    }

    Meter& meter;
    const double seconds;
    const std::function<void(std::size_t)>& atStep;
    double heapBytes = 0;
    std::vector<double> heapTimes;
    std::set<PoolSettings, Less> tried;
    std::vector<Candidate> candidates;
    std::set<std::size_t> dead;           // Candidates that were given up.
    std::optional<std::size_t> mimalloc;  // Its candidate.
    std::vector<GivenUp> givenUp;
};

}  // namespace

// At 10 to 30 nanoseconds per event this allows 30 to 100 replays, enough for a coarse look. With
// fewer steps there would be more replays, but of a less typical part: the peak tends to come late.
std::size_t MaxSteps(double seconds) {
    constexpr double perSecond = 1000000;
    constexpr double least = 4000000;
    return static_cast<std::size_t>(std::max(least, perSecond * seconds));
}

Findings Search(Meter& meter, double seconds, const std::function<void(std::size_t)>& atStep) {
    return Searcher(meter, seconds, atStep).Run();
}

}  // namespace Advise
