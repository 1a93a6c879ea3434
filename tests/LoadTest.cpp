// The library comes and goes in a process that is not linked to it: it is loaded with a plugin that
// uses it, unloaded, and its exit step runs while the host still has pools.

#include <dlfcn.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include <gtest/gtest.h>

#include "Child.hpp"

using Child::Captured;
using testing::ExitedWithCode;
using testing::MatchesRegex;

namespace {

// Room for the handle of a pool. The host does not know the type.
struct Place {
    void* handle = nullptr;
};

// The plugin, loaded, and the library with it.
struct Plugin {
    Plugin() {
        Find("Build", build);
        Find("Share", share);
        Find("Destroy", destroy);
        Find("ShowPools", showPools);
    }

    void* const file = dlopen(PLUGIN, RTLD_NOW);
    void (*build)(void* place, const char* name);
    void (*share)(void* left, const void* right);
    void (*destroy)(void* place);
    void (*showPools)(const char* name);

private:
    template <typename Function>
    void Find(const char* name, Function*& function) {
        function = reinterpret_cast<Function*>(dlsym(file, name));
    }
};

bool IsLoaded() {
    void* const library = dlopen(SONAME, RTLD_NOLOAD | RTLD_NOW);
    return library != nullptr && dlclose(library) == 0;
}

// A leak checker finds what the pools alive hold through `kept`. All else the library must release.
TEST(Load, LoadingAndUnloadingLeavesNothingBehind) {
    Child::SetEnvironment({{"NUV_OBR_MEMPOOL_ON", "1"}});
    static Place kept[20];
    for (Place& place : kept) {
        const Plugin plugin;
        ASSERT_TRUE(IsLoaded());
        Place passing;
        plugin.build(&passing, "passing");
        plugin.build(&place, "kept");
        plugin.destroy(&passing);
        ASSERT_EQ(dlclose(plugin.file), 0);
        ASSERT_FALSE(IsLoaded());
    }
}

const std::string built = "xmpt:c:[0-9a-f]+\nxmpt:a:[^\n]*:10\nxmpt:a:[^\n]*:5000\n";
const std::string builtOwn = "xmpt:c:[0-9a-f]+\n";
const std::string destroyed = "xmpt:d:[0-9a-f]+\n";

// Only the plugin's static tells of its end.
TEST(Load, APoolAliveAtUnloadIsLeftAloneInSilence) {
    const auto run = [] {
        Child::Capture(Captured::both);
        Child::SetEnvironment({{"NUV_OBR_MEMPOOL_TRACE", "1"}, {"NUV_OBR_MEMPOOL_ON", "1"}});
        static Place kept;
        const Plugin plugin;
        plugin.build(&kept, "kept");
        std::puts("unload");
        dlclose(plugin.file);
        std::puts("unloaded");
        std::exit(0);
    };
    EXPECT_EXIT(run(), ExitedWithCode(0),
                MatchesRegex(builtOwn + built + "unload\n" + destroyed + "unloaded\n"));
}

const Plugin* plugin = nullptr;
Place first, second, third;

// `atExit` is what the destructors of a host's statics do. It is registered before the library is
// loaded and thus runs behind the library's exit step.
void LoadBehind(void (*atExit)()) {
    Child::Capture(Captured::both);
    Child::SetEnvironment({{"NUV_OBR_MEMPOOL_TRACE", "1"}, {"NUV_OBR_MEMPOOL_ON", "1"}});
    std::atexit(atExit);
    plugin = new Plugin;
    plugin->build(&first, "first");
    plugin->build(&second, "second");
}

TEST(Load, PoolsOutliveTheExitStep) {
    const auto run = [] {
        LoadBehind([] {
            std::puts("host");
            plugin->showPools("first");
            plugin->destroy(&first);
            plugin->destroy(&second);
            plugin->build(&third, "first");
            plugin->showPools("first");
            plugin->destroy(&third);
            plugin->showPools("first");
        });
        plugin->showPools("first");
        std::exit(0);
    };
    const std::string none = "0 pools, 0 and 0 handles, without 'first'\n";
    EXPECT_EXIT(
        run(), ExitedWithCode(0),
        MatchesRegex(builtOwn + built + built + "3 pools, 3 and 3 handles, with 'first'\n" +  //
                     destroyed + "host\n" + none + destroyed + destroyed +                    //
                     built + "1 pools, 1 and 1 handles, with 'first'\n" +                     //
                     destroyed + none));
}

// The second handle leaves its own pool, which nothing destroys, for the first one's.
TEST(Load, ASharedPoolEndsOnceBehindTheExitStep) {
    static bool isMakerFirst;
    for (const bool value : {true, false}) {
        isMakerFirst = value;
        const auto run = [] {
            LoadBehind([] {
                std::puts("host");
                plugin->destroy(isMakerFirst ? &first : &second);
                plugin->destroy(isMakerFirst ? &second : &first);
                std::puts("done");
            });
            plugin->share(&second, &first);
            plugin->showPools("second");
            std::exit(0);
        };
        EXPECT_EXIT(run(), ExitedWithCode(0),
                    MatchesRegex(builtOwn + built + built +
                                 "3 pools, 3 and 3 handles, with 'second'\n" +  //
                                 destroyed + "host\n" + destroyed + "done\n"));
    }
}

// A pool whose maker has left it for another one forgets that maker when it is destroyed: what
// stands in its place afterwards is the host's own.
TEST(Load, ADestroyedHandlesPlaceIsLeftAloneBehindTheExitStep) {
    const auto run = [] {
        LoadBehind([] {
            void* const shared = third.handle;
            plugin->destroy(&second);
            second.handle = shared;
            plugin->destroy(&third);
            std::puts(second.handle == shared ? "left alone" : "changed");
        });
        plugin->build(&third, "third");
        plugin->share(&third, &second);
        plugin->share(&second, &first);
        std::exit(0);
    };
    EXPECT_EXIT(run(), ExitedWithCode(0),
                MatchesRegex(builtOwn + built + built + built + destroyed +  //
                             destroyed + destroyed + "left alone\n"));
}

}  // namespace
