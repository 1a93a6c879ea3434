#include "advise/Advice.hpp"

#include <cstddef>
#include <stdexcept>

#include <fmt/format.h>

#include "advise/ForkedMeter.hpp"
#include "advise/Search.hpp"
#include "replay/Recording.hpp"
#include "system/Interruption.hpp"

namespace Advise {

Advice TakeAdvice(Trace::StepReader& reader, const Question& question,
                  const std::function<void(const std::string&)>& show) {
    Replay::Recording recording = Replay::ReadRecording(
        reader, [&](auto position) { show(fmt::format("event {}", position)); },
        MaxSteps(question.seconds));
    if (recording.peakBlocks == 0) {
        throw std::runtime_error(reader.Name() + ": no block was allocated");
    }
    if (question.mergesGroups) { Replay::MergePools(recording); }

    Advice advice;
    advice.layer = question.layer;
    advice.program.numEvents = recording.steps.size();
    advice.program.numLeftOut = recording.numLeftOut;
    const auto share = reader.Facts().find("allocation_share");
    if (share != reader.Facts().end()) { advice.program.allocationShare = ShareOf(share->second); }
    const System::Interruption interruption;
    constexpr double mostOfTime = 1.4;  // After that no measurement is waited for.
    ForkedMeter meter(recording, question.layer, mostOfTime * question.seconds);
    advice.findings = Search(meter, question.seconds, [&](std::size_t numTried) {
        show(fmt::format("{} settings tried, {:.0f} s of about {}", numTried, meter.Elapsed(),
                         question.seconds));
    });
    advice.isStopped = System::Interruption::Signal() != 0;
    advice.verdict = Judge(advice.findings, advice.program);
    return advice;
}

}  // namespace Advise
