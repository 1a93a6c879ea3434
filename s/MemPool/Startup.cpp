// The data of the process, which all pools share, and what happens when the library is loaded and
// unloaded. On load, in this order: the registry is constructed empty, its exit step is registered,
// and the settings start up (which may throw). On unload the exit step releases the registry's own
// nodes and nothing else.
//
// A program can link the library as an archive. These objects are then still constructed before the
// host's statics. Every operation of the library links this file into the program, since the data
// is defined here.

#include <ios>

#include "MemPool/Checked.hpp"
#include "MemPool/MgrRegistry.hpp"
#include "MemPool/Settings.hpp"

// Before all objects of the program that have no priority of their own.
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

OBR_FIRST const std::ios_base::Init streams;  // The start-up writes to them.

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
