// An analysis and its page, for the subcommands that report.

#ifndef OBR_TOOLS_MEMPOOL_REPORT_HPP
#define OBR_TOOLS_MEMPOOL_REPORT_HPP

#include <memory>
#include <string>
#include <vector>

#include "report/Analysis.hpp"
#include "system/OutputFile.hpp"

namespace Tool {

// Analyses the trace at `path`, and again if its stacks show further functions that only pass
// memory on. Standard input is read once.
Report::Analysis AnalyseTrace(Trace::StepReader& reader, const std::string& path,
                              const OBR::MemPool::PoolSettings& settings, Report::Skipped skipped);

// Opens the file of a page before any work is done for it; null if `path` is empty. Throws a
// std::runtime_error if it cannot be written, is one of the inputs, or no page can be made.
std::unique_ptr<System::OutputFile> OpenPage(const std::string& path,
                                             const std::vector<std::string>& inputs);

// `advice` is the JSON of `mempool advise`, or "null".
void WritePage(System::OutputFile& file, const Report::Analysis& analysis,
               const std::string& advice);

}  // namespace Tool

#endif
