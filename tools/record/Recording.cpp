#include "record/Recording.hpp"

#include <string_view>

namespace Recorder {

Recording::Recording(const Order& order, const std::string& path,
                     const std::vector<std::string>& inputs, const std::string& commandLine,
                     Channel& ofChannel)
    : channel(ofChannel),
      file(path, inputs),
      writer([this](std::string_view bytes) { file.Write(bytes); }),
      collector(channel, writer, order.pools) {
    file.KeepIfCutShort();
    WriteProgram(commandLine);
    constexpr const char* names[] = {"all", "thread", "caller", "module", "stack"};
    WriteInfo(writer, "by", order.pools ? "pools" : names[static_cast<std::size_t>(order.by)]);
}

void Recording::WriteProgram(const std::string& commandLine) {
    WriteInfo(writer, "program", commandLine);
}

void Recording::Finish(const ProcessorTime& time, const TickRate& rate) {
    WriteTimes(writer, channel, time, rate);
    writer.Finish();
}

}  // namespace Recorder
