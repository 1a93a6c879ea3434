// The library in a process that is not linked to it: it is loaded with a plugin that uses it and
// unloaded again, and its exit step runs while the host still has pools. A second plugin contains a
// copy of its own.

#include <dlfcn.h>
#include <malloc.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include <gtest/gtest.h>

#include "Child.hpp"

using testing::ExitedWithCode;
using testing::MatchesRegex;

namespace {

// Room for the handle of a pool. The host does not know the type.
struct Place {
    void* handle = nullptr;
};

// The plugin, loaded, and the library with it.
struct Plugin {
    const char* const path = PLUGIN;
    void* const file = dlopen(path, RTLD_NOW);
    void (*const build)(void*, const char* name) = Find<void(void*, const char*)>("Build");
    void (*const share)(void*, const void*) = Find<void(void*, const void*)>("Share");
    void (*const destroy)(void*) = Find<void(void*)>("Destroy");
    void (*const showPools)(const char* name) = Find<void(const char*)>("ShowPools");

private:
    template <typename Function>
    Function* Find(const char* name) {
        return reinterpret_cast<Function*>(dlsym(file, name));
    }
};

// A leak checker finds the memory of living pools through `kept`. The library must release
// everything else, and the loader must keep nothing of it.
TEST(Load, LoadingAndUnloadingLeavesNothingBehind) {
    Child::SetEnvironment({{"NUV_OBR_MEMPOOL_ON", "1"}});
    static Place kept[20];
    std::size_t held = 0;
    for (int round = 0; round < 1000; ++round) {
        const Plugin plugin;
        Place passing;
        plugin.build(&passing, "passing");
        if (round < 20) { plugin.build(&kept[round], "kept"); }
        plugin.destroy(&passing);
        void* const library = dlopen(SONAME, RTLD_NOLOAD | RTLD_NOW);
        ASSERT_NE(library, nullptr);
        dlclose(library);
        dlclose(plugin.file);
        ASSERT_EQ(dlopen(SONAME, RTLD_NOLOAD | RTLD_NOW), nullptr);
        if (round == 30) { held = mallinfo2().uordblks; }
    }
    EXPECT_EQ(mallinfo2().uordblks, held);
}

const std::string builtOwn = "xmpt:c:[0-9a-f]+\n";
const std::string built = builtOwn + "xmpt:a:[^\n]*:10\nxmpt:a:[^\n]*:5000\n";
const std::string destroyed = "xmpt:d:[0-9a-f]+\n";

const Plugin* plugin = nullptr;
Place first, second, third;

// `atExit` is what the destructors of a host's statics do. It is registered before the library is
// loaded and thus runs after the library's exit step.
void LoadBehind(void (*atExit)()) {
    Child::Capture(Child::Captured::both);
    Child::SetEnvironment({{"NUV_OBR_MEMPOOL_TRACE", "1"}, {"NUV_OBR_MEMPOOL_ON", "1"}});
    std::atexit(atExit);
    plugin = new Plugin;
    plugin->build(&first, "first");
}

// Only the pool in the plugin's static traces its end.
TEST(Load, APoolAliveAtUnloadIsLeftAloneInSilence) {
    const auto run = [] {
        LoadBehind([] { std::puts("exit"); });
        dlclose(plugin->file);
        std::puts("unloaded");
        std::exit(0);
    };
    EXPECT_EXIT(run(), ExitedWithCode(0),
                MatchesRegex(builtOwn + built + destroyed + "unloaded\nexit\n"));
}

// The third handle has left its own pool, which nothing destroys, for the first one's, and the
// first handle has moved on to the second one's. What looks like a handle where the first one was
// is not one.
TEST(Load, PoolsOutliveTheExitStep) {
    const auto run = [] {
        LoadBehind([] {
            plugin->showPools("first");
            plugin->destroy(&first);
            first = third;
            plugin->destroy(&third);
            std::puts(first.handle != nullptr ? "left alone" : "touched");
            plugin->destroy(&second);
            plugin->build(&third, "first");
            plugin->showPools("first");
            plugin->destroy(&third);
            plugin->showPools("first");
        });
        plugin->build(&second, "second");
        plugin->build(&third, "third");
        plugin->share(&third, &first);
        plugin->share(&first, &second);
        plugin->showPools("first");
        std::exit(0);
    };
    const std::string none = "0 pools, 0 and 0 handles, without 'first'\n";
    EXPECT_EXIT(run(), ExitedWithCode(0),
                MatchesRegex(builtOwn + built + built + built +
                             "4 pools, 4 and 4 handles, with 'first'\n" + destroyed +  //
                             none + destroyed + destroyed + "left alone\n" + built +   //
                             "1 pools, 1 and 1 handles, with 'first'\n" + destroyed + none));
}

// Each copy has its own names, settings and pools, and one outlives the other.
TEST(Load, TwoCopiesInAProcessAreIndependent) {
    const auto run = [] {
        LoadBehind([] {});
        const Plugin other{PLUGIN_WITH_ARCHIVE};
        other.build(&second, "first");
        plugin->build(&third, "third");
        other.showPools("third");
        plugin->showPools("third");
        plugin->destroy(&first);
        dlclose(plugin->file);
        other.showPools("first");
        other.destroy(&second);
        std::exit(0);
    };
    const std::string two = "2 pools, 2 and 2 handles, with";
    EXPECT_EXIT(run(), ExitedWithCode(0),
                MatchesRegex(builtOwn + built + builtOwn + built + built + two +
                             "out 'third'\n3 pools, 3 and 3 handles, with 'third'\n" + destroyed +
                             destroyed + two + " 'first'\n" + destroyed + destroyed));
}

}  // namespace
