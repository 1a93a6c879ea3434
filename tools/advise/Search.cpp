// The times of a setting are kept as ratios: each one beside those of the heap right before and
// right after it. A machine that is slower for a while, for other work or for heat, is so for both,
// and the settings stay comparable however far apart in time they were looked at.

#include "advise/Search.hpp"

#include <algorithm>
#include <optional>
#include <set>
#include <utility>
#include <vector>

#include "advise/Space.hpp"

namespace Advise {

namespace {

using Replay::PoolSettings;

// The leaders at the end have this many rounds, unless time is out.
constexpr unsigned int enoughRounds = 15;
// No setting leads on fewer rounds: a lucky one would lead the search astray.
constexpr unsigned int trustedRounds = 3;
// What a neighbour must be better by to be walked to.
constexpr double worthAStep = 0.99;
// How many settings are timed between two replays of the heap.
constexpr std::size_t batchSize = 4;
// Which share of the time may have gone when a phase is left.
constexpr double lookingShare = 0.4;
constexpr double walkingShare = 0.7;

// A setting in the course of the search.
struct Candidate {
    PoolSettings settings;
    double bytesHeld;
    std::vector<double> ratios;  // Of its time to the heap's, a round each.
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
        heapBytes = meter.Held(std::nullopt).OrFail("the replay on the heap failed");
        TimeHeap();
    }

    Findings Run() {
        const std::vector<PoolSettings> grid = CoarseGrid();
        for (std::size_t i = 0; i < grid.size() && (i == 0 || HasTime(lookingShare));
             i += batchSize) {
            const std::size_t end = std::min(i + batchSize, grid.size());
            Look({grid.begin() + static_cast<std::ptrdiff_t>(i),
                  grid.begin() + static_cast<std::ptrdiff_t>(end)});
        }
        for (const Aim aim : aims) { Walk(aim); }
        // So many of the most promising get so many rounds.
        constexpr std::pair<std::size_t, unsigned int> halvings[] = {{8, 3}, {4, 6}, {2, 10}};
        for (const auto& [numBest, rounds] : halvings) {
            for (const Aim aim : aims) { AddRounds(Best(aim, numBest), rounds); }
        }
        for (const Aim aim : aims) { Confirm(aim, enoughRounds, 1); }
        AddRounds(Alive(), trustedRounds);
        for (const Aim aim : aims) { Confirm(aim, enoughRounds, 1); }
        // Here time does not count: the figure of a single round says nothing.
        for (const Aim aim : aims) { Confirm(aim, trustedRounds, 1e9); }
        return Finish();
    }

private:
    bool HasTime(double share) const { return meter.Elapsed() < share * seconds; }

    void TimeHeap() {
        heapTimes.push_back(meter.Time(std::nullopt).OrFail("the replay on the heap failed"));
    }

    // Tries what was not tried yet, one round each.
    void Look(const std::vector<PoolSettings>& settings) {
        std::vector<std::size_t> added;
        for (const PoolSettings& each : settings) {
            if (!HasTime(1) && !candidates.empty()) { break; }
            if (!tried.insert(each).second) { continue; }
            const Outcome held = meter.Held(each);
            if (held.figure.has_value()) {
                added.push_back(candidates.size());
                candidates.push_back({each, *held.figure, {}});
            } else {
                givenUp.push_back({each, held.problem});
            }
        }
        Time(added);
    }

    // A round for each of these.
    void Time(const std::vector<std::size_t>& indices) {
        for (std::size_t i = 0; i < indices.size(); i += batchSize) {
            const std::size_t end = std::min(i + batchSize, indices.size());
            std::vector<Outcome> outcomes;
            for (std::size_t j = i; j < end; ++j) {
                outcomes.push_back(meter.Time(candidates[indices[j]].settings));
            }
            const double before = heapTimes.back();
            TimeHeap();
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
            givenUp.push_back({candidate.settings, outcome.problem});
            dead.insert(index);
        }
    }

    // Steps to the best neighbour as long as that is better.
    void Walk(Aim aim) {
        auto center = Confirm(aim, trustedRounds, walkingShare);
        while (center.has_value() && HasTime(walkingShare)) {
            Look(Neighbours(candidates[*center].settings));
            const auto next = Confirm(aim, trustedRounds, walkingShare);
            if (!next.has_value() || CostOf(*next, aim) >= worthAStep * CostOf(*center, aim)) {
                return;
            }
            center = next;
        }
    }

    // The leader, once it leads with that many rounds or that share of the time is out. None if all
    // were given up.
    std::optional<std::size_t> Confirm(Aim aim, unsigned int rounds, double share) {
        std::vector<std::size_t> leader = Best(aim, 1);
        while (!leader.empty() && NumRounds(leader.front()) < rounds && HasTime(share)) {
            Time(leader);
            leader = Best(aim, 1);
        }
        return leader.empty() ? std::nullopt : std::optional(leader.front());
    }

    // Brings these to that many rounds, as far as there is time.
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

    std::vector<std::size_t> Alive() const {
        std::vector<std::size_t> alive;
        for (std::size_t i = 0; i < candidates.size(); ++i) {
            if (dead.count(i) == 0) { alive.push_back(i); }
        }
        return alive;
    }

    // The best of those that are left, the very best first.
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
        return Cost({Quantile(candidate.ratios, 0.5), 0, candidate.bytesHeld, 0},
                    {1, 0, heapBytes, 0}, aim);
    }

    Figures FiguresOf(const std::vector<double>& ratios, double bytesHeld) const {
        const double heapTime = Quantile(heapTimes, 0.5);
        return {heapTime * Quantile(ratios, 0.5),
                heapTime * (Quantile(ratios, 0.75) - Quantile(ratios, 0.25)), bytesHeld,
                static_cast<unsigned int>(ratios.size())};
    }

    // The heap's spread is that of its times beside one another, as that of the settings is.
    Figures FiguresOfHeap() const {
        std::vector<double> ratios = {1};
        for (std::size_t i = 2; i < heapTimes.size(); ++i) {
            ratios.push_back(2 * heapTimes[i - 1] / (heapTimes[i - 2] + heapTimes[i]));
        }
        Figures figures = FiguresOf(ratios, heapBytes);
        figures.nsPerEvent = Quantile(heapTimes, 0.5);
        figures.rounds = static_cast<unsigned int>(heapTimes.size());
        return figures;
    }

    Findings Finish() const {
        Findings findings{FiguresOfHeap(), {}, givenUp};
        for (const std::size_t i : Alive()) {
            const Candidate& each = candidates[i];
            findings.settings.push_back({each.settings, FiguresOf(each.ratios, each.bytesHeld)});
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
    std::set<std::size_t> dead;  // Candidates that were given up.
    std::vector<GivenUp> givenUp;
};

}  // namespace

// At 10 to 30 nanoseconds an event these are 30 to 100 replays, which do for a coarse look. Fewer
// steps would make more replays of what may be another program: its peak tends to come late.
std::size_t MaxSteps(double seconds) {
    constexpr double perSecond = 1000000;
    constexpr double least = 4000000;
    return static_cast<std::size_t>(std::max(least, perSecond * seconds));
}

Findings Search(Meter& meter, double seconds, const std::function<void(std::size_t)>& atStep) {
    return Searcher(meter, seconds, atStep).Run();
}

}  // namespace Advise
