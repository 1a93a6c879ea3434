// Recording, for the subcommands that record.

#ifndef OBR_TOOLS_MEMPOOL_RECORDCOMMAND_HPP
#define OBR_TOOLS_MEMPOOL_RECORDCOMMAND_HPP

#include "mempool/CommandLine.hpp"
#include "record/Session.hpp"

namespace Tool {

// Adds the options of a recording: the groups, and whether the heap or pools are recorded.
void AddRecordOptions(Subcommand& subcommand, Recorder::Order& order);

// Records the program. Warns on standard error if the trace is not what the user may expect.
Recorder::Outcome RecordAsOrdered(const Recorder::Order& order);

}  // namespace Tool

#endif
