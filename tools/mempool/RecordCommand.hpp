// Recording as a subcommand does it.

#ifndef OBR_TOOLS_MEMPOOL_RECORDCOMMAND_HPP
#define OBR_TOOLS_MEMPOOL_RECORDCOMMAND_HPP

#include "mempool/Program.hpp"
#include "record/Session.hpp"

namespace Tool {

// The options of a recording: by which groups, and of the heap or of pools.
void AddRecordOptions(CLI::App& subcommand, Recorder::Order& order);

// Records. Says on standard error why the trace is not what the user may expect.
Recorder::Outcome RecordAsOrdered(const Recorder::Order& order);

}  // namespace Tool

#endif
