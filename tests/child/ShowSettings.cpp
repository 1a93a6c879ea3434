// A host that is linked to the library and shows the settings that the load has left. It does not
// use the standard streams of C++, so that nothing but the library makes them ready.

#include <MemPool>
#include <cstdio>

using namespace OBR::MemPool;

int main() {
    std::printf("on=%d off=%d trace=%d bucket=%u max=%u min=%u alignment=%u keep=%d\n",
                NUV_OBR_MEMPOOL_ON(), NUV_OBR_MEMPOOL_OFF(), NUV_OBR_MEMPOOL_TRACE(),
                NUV_OBR_MEMPOOL_BUCKET_SIZE(), NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(),
                NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(), NUV_OBR_MEMPOOL_DATA_ALIGNMENT(),
                NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS());
}
