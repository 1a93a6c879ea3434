// A host that is linked to the library and shows the settings that the load has left other than at
// their defaults. It does not use the standard streams of C++, so that nothing but the library
// makes them ready.

#include <MemPool>
#include <cstdio>

using namespace OBR::MemPool;

static void Show(const char* name, unsigned int value, unsigned int byDefault) {
    if (value != byDefault) { std::printf(" %s=%u", name, value); }
}

int main() {
    std::printf("settings:");
    Show("on", NUV_OBR_MEMPOOL_ON(), 0);
    Show("off", NUV_OBR_MEMPOOL_OFF(), 1);
    Show("trace", NUV_OBR_MEMPOOL_TRACE(), 0);
    Show("bucket", NUV_OBR_MEMPOOL_BUCKET_SIZE(), 4010);
    Show("max", NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(), 1000);
    Show("min", NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(), 8);
    Show("alignment", NUV_OBR_MEMPOOL_DATA_ALIGNMENT(), 4);
    Show("keep", NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(), 0);
    std::printf("\n");
}
