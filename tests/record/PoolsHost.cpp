// A program with pools to be recorded: enabled and not, static and not, shared, cleared, and with
// calls that a pool refuses.

#include <MemPool>

#include <new>
#include <string>

using namespace OBR::MemPool;

namespace {

Mgr early("a static one, with a long name");

}  // namespace

struct Derived : Mgr {
    using Mgr::Mgr;
};

int main() {
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
