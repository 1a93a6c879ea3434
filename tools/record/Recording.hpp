// The trace of one process.

#ifndef OBR_TOOLS_RECORD_RECORDING_HPP
#define OBR_TOOLS_RECORD_RECORDING_HPP

#include <cstdint>
#include <string>
#include <vector>

#include "record/Channel.hpp"
#include "record/Collector.hpp"
#include "record/Order.hpp"
#include "record/Times.hpp"
#include "system/OutputFile.hpp"
#include "trace/CompactWriter.hpp"

namespace Recorder {

class Recording {
public:
    // Opens the file, which is none of the inputs. Throws a System::Failure, also when it writes.
    Recording(const Order& order, const std::string& path, const std::vector<std::string>& inputs,
              const std::string& commandLine, Channel& ofChannel);

    void WriteProgram(const std::string& commandLine);
    bool Drain(bool atEnd = false) { return collector.Drain(atEnd); }
    void Flush() { writer.Flush(); }

    // Writes the rest.
    void Finish(const ProcessorTime& time, const TickRate& rate);

    System::OutputFile& File() { return file; }
    std::uint64_t NumEvents() const { return collector.NumEvents(); }

private:
    Channel& channel;
    System::OutputFile file;
    Trace::CompactWriter writer;
    Collector collector;
};

}  // namespace Recorder

#endif
