// A program with pools to be recorded: enabled and not, static and not, shared, cleared, and with
// calls that a pool refuses.

#include <MemPool>

#include <unistd.h>

#include <csignal>
#include <new>
#include <string>

using namespace OBR::MemPool;

namespace {

Mgr early("a static one, with a long name");

}  // namespace

struct Derived : Mgr {
    using Mgr::Mgr;
};

// With nobody to drain the channel, which fills with events of two slots. One of a single slot is
// among them, so that half of the last one has room.
void Fill() {
    NUV_OBR_MEMPOOL_ON(true);
    Mgr pool("pool");
    usleep(100000);  // All events so far are drained.
    kill(getppid(), SIGSTOP);
    for (int count = 0; count != 300000; ++count) {
        if (count == 100000) { pool.Clear(); }
        pool.Free(pool.Alloc(8));
    }
}

int main(int argc, char**) {
    if (argc > 1) {
        Fill();
        return 0;
    }
    NUV_OBR_MEMPOOL_ON(true);
    Mgr pool("pool");
    void* const block = pool.Alloc(10);
    pool.Alloc(5000);
    pool.Clear();
    pool.Free(pool.Alloc(0));
    {
        Derived derived;
        derived.Alloc(12);
        Mgr other("");
        other = derived;
    }
    early.Clear();
    early.Free(early.Alloc(20));
    // Refused: the library's own trace has lines for these two, but nothing happens.
    pool.Free(nullptr);
    pool.Free(block);
    return 3;
}
