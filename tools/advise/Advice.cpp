#include "advise/Advice.hpp"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <future>
#include <limits>
#include <stdexcept>

#include <fmt/format.h>

#include "advise/ForkedMeter.hpp"
#include "advise/Search.hpp"
#include "system/Interruption.hpp"

namespace Advise {

namespace {

// The share of the time that the search takes if there are pools to measure after it.
constexpr double shareOfSearch = 0.5;

// In another thread, for the reason why ReadRecording uses one.
Proposal ProposeInThread(const Replay::Recording& recording) {
    if (!recording.hasGroups) { return {}; }
    return std::async(std::launch::async, ProposePools, std::cref(recording)).get();
}

}  // namespace

Program ProgramOf(const Replay::Recording& recording,
                  const std::map<std::string, std::string>& facts, Replay::Layer layer) {
    const auto number = [&](const char* key, double most) {
        const auto fact = facts.find(key);
        return fact == facts.end() ? std::nullopt : NumberIn(fact->second, most);
    };
    constexpr double any = std::numeric_limits<double>::infinity();
    Program program = {recording.steps.size(),
                       recording.numLeftOut,
                       number("allocation_share", 1),
                       number("allocation_share_error", 1),
                       number("cpu_seconds", any),
                       layer == Replay::Layer::Malloc ? Replay::secondsOfPreload : 0};
    // Pools of the program may each belong to a thread.
    const auto by = facts.find("by");
    if (by == facts.end() || by->second != "pools") {
        program.numThreads = static_cast<std::uint64_t>(number("threads", 1e9).value_or(1));
    }
    return program;
}

Advice TakeAdvice(Trace::StepReader& reader, const Question& question,
                  const std::function<void(const std::string&)>& show) {
    Replay::Recording recording = Replay::ReadRecording(
        reader,
        [&](auto position) {
            if (System::Interruption::Signal() != 0) {
                throw std::runtime_error(reader.Name() + ": stopped before the search");
            }
            show(fmt::format("event {}", position));
        },
        MaxSteps(question.seconds));
    if (recording.peakBlocks == 0) {
        throw std::runtime_error(reader.Name() + ": no block was allocated");
    }
    const Proposal proposal = question.hasPlan ? ProposeInThread(recording) : Proposal();
    Replay::MergePools(recording);

    Advice advice;
    advice.layer = question.layer;
    advice.program = ProgramOf(recording, reader.Facts(), question.layer);
    constexpr double mostOfTime = 1.4;  // After that no measurement is waited for.
    const double searchSeconds = (proposal.pools.empty() ? 1 : shareOfSearch) * question.seconds;
    ForkedMeter meter(recording, question.layer, mostOfTime * question.seconds);
    advice.findings = Search(meter, searchSeconds, [&](std::size_t numTried) {
        show(fmt::format("{} settings tried, {:.0f} s of about {}", numTried, meter.Elapsed(),
                         question.seconds));
    });
    advice.isStopped = System::Interruption::Signal() != 0;
    advice.verdict = Judge(advice.findings, advice.program);
    const bool hasThreads = advice.program.numThreads > 1;
    if (proposal.pools.empty() || hasThreads || meter.IsStopped()) { return advice; }

    show(fmt::format("{} pools for blocks that die together", proposal.pools.size()));
    OBR::MemPool::PoolSettings settings;
    if (advice.verdict.advised.has_value()) {
        settings = advice.findings.settings[*advice.verdict.advised].settings;
    }
    // The preloaded library has one pool and no FreeAll.
    const Replay::Layer layer =
        question.layer == Replay::Layer::Malloc ? Replay::Layer::Heap : question.layer;
    const double rest = question.seconds - meter.Elapsed();
    ForkedMeter planMeter(recording, layer, rest + (mostOfTime - 1) * question.seconds);
    advice.plan = MeasurePlan(proposal, settings, advice.program, planMeter, rest);
    if (advice.plan.has_value()) {
        advice.program.hasPlan = true;
        advice.verdict = Judge(advice.findings, advice.program);
        if (layer != question.layer) {
            advice.plan->sentence.insert(0, "Built into the program, blocks can be aligned to 8. ");
        }
    } else if (planMeter.IsStopped()) {
        advice.verdict.sentences.emplace_back(
            "The blocks of some groups die together; more --seconds allow measuring pools for "
            "them.");
    }
    advice.isStopped = System::Interruption::Signal() != 0;
    return advice;
}

}  // namespace Advise
