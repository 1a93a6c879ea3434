// The definition of obr_heap of MemPoolHeap.h.

#ifndef OBR_MEMPOOLC_HEAP_HPP
#define OBR_MEMPOOLC_HEAP_HPP

#include <MemPoolHeap.h>
#include <MemPoolHeap>

struct obr_heap {
    OBR::MemPool::Heap heap;
};

#endif
