// The data of the process, which all pools share, and what happens to it when the library is loaded
// and unloaded, in this order: the registry is constructed empty, its exit step stands ready, the
// settings start up (which may throw). On the way out the exit step releases the registry's own
// nodes and nothing else.
//
// A program can hold the library as an archive. No static of the host's is constructed ahead of
// these objects then, and since the data is defined here, each operation of the library brings this
// file into the program.

#include <ios>

#include "MemPool/Checked.hpp"
#include "MemPool/MgrRegistry.hpp"
#include "MemPool/Settings.hpp"

// Ahead of all objects of the program that name no priority of their own.
#define OBR_FIRST __attribute__((init_priority(101)))

namespace OBR::MemPool {

namespace Settings {

// The widest bounds. The start-up stores the defaults before anything reads these, but leaves the
// trace alone.
PoolSettings pool = {SettingTable::bucketSize.largest, SettingTable::maxRecordSize.largest,
                     SettingTable::minRecordSize.smallest, SettingTable::dataAlignment.smallest,
                     false};
bool off = false;
bool trace = false;

}  // namespace Settings

namespace {

OBR_FIRST const std::ios_base::Init streams;  // The start-up writes.

}  // namespace

OBR_FIRST MgrRegistry registry;

namespace {

struct ExitStep {
    ~ExitStep() {
        Checked::AtExit();
        registry.ReleaseNodes();
    }
};
OBR_FIRST const ExitStep exitStep;

OBR_FIRST const EnvInit envInit;

}  // namespace

}  // namespace OBR::MemPool
