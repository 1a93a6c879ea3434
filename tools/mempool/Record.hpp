// Recording as a subcommand does it.

#ifndef OBR_TOOLS_MEMPOOL_RECORD_HPP
#define OBR_TOOLS_MEMPOOL_RECORD_HPP

#include "mempool/Program.hpp"
#include "record/Session.hpp"

namespace Tool {

// The options of a recording: by which groups, and of the heap or of pools.
void AddRecordOptions(CLI::App& subcommand, Record::Order& order);

// Records. Says on standard error if pools were to be recorded and the program has made none.
Record::Outcome RecordAsOrdered(const Record::Order& order);

// Ends this process as the recorded program has ended: by its exit status, or by its signal.
int EndLike(const Record::Outcome& outcome);

}  // namespace Tool

#endif
