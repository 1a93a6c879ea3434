// -*- C -*-
// A Heap of <MemPoolHeap> for hosts in C, from C99 on: one memory pool with blocks of any size.
//
//     #include <MemPoolHeap.h>
//
//     obr_heap* heap = obr_heap_new("parser", NULL);
//     char* text = obr_heap_malloc(heap, 24);
//     obr_heap_free(heap, text);
//     obr_heap_delete(heap);
//
// Link libObrMemPoolC: MemPool::MemPoolC of CMake's package ObrMemPool, or ObrMemPoolC of
// pkg-config.
//
// A function that fails returns null or false, and obr_heap_error gives the reason. `heap` must be
// a living heap, not null, where nothing else is documented. A foreign pointer is one that is
// neither null nor points to a living block of the heap; see Heap of <MemPoolHeap>.
//
// Threads: any threads may create and delete heaps at once. A heap and its blocks belong to one
// thread at a time.

#ifndef OBR_MEMPOOL_HEAP_C_H
#define OBR_MEMPOOL_HEAP_C_H

#include <stdbool.h>
#include <stddef.h>
#include <stdio.h>

#define OBR_HEAP_API __attribute__((visibility("default")))

#ifdef __cplusplus
extern "C" {
#endif

// A pool and its blocks.
typedef struct obr_heap obr_heap;

// A setting that is on or off.
enum { OBR_HEAP_DEFAULT = 0, OBR_HEAP_ON = 1, OBR_HEAP_OFF = 2 };

// The settings of a heap. Sizes are bytes. A field that is 0 has its default, which is the setting
// of the process if none is documented. Later versions may add fields at the end; `struct_size`
// shows which version a host was compiled with:
//
//     obr_heap_settings settings = {.struct_size = sizeof settings, .alignment = 16};
typedef struct obr_heap_settings {
    size_t struct_size;      // sizeof(obr_heap_settings).
    int pools;               // OBR_HEAP_OFF: each block comes from operator new. Default: on.
    int keep_empty_buckets;  // Whether a bucket without blocks is kept until obr_heap_free_all.
    size_t bucket_size;      // Total size of a bucket's records, plus 2. At most 65535.
    size_t max_record_size;  // Includes 4 bytes of overhead. Larger requests go to operator new.
    size_t min_record_size;  // Of the first size class. Includes 4 bytes of overhead.
    size_t data_alignment;   // Data sizes are rounded up to a multiple of it.
    size_t alignment;        // Of blocks: a power of two from 8 to 4096. Default: 8.
    size_t limit;            // The maximum of bytes_held. Default: none.
} obr_heap_settings;

// What a heap holds at one moment. See HeapStats of <MemPoolHeap>.
typedef struct obr_heap_statistics {
    size_t struct_size;    // sizeof(obr_heap_statistics).
    size_t buckets;        // All buckets.
    size_t empty_buckets;  // Buckets without a used record.
    size_t full_buckets;   // Buckets without a free record.
    size_t used_records;   // Blocks in buckets.
    size_t free_records;   // Free records in buckets.
    size_t heap_records;   // Blocks that come from operator new one by one.
    size_t bytes_held;     // Requested from operator new.
    size_t bytes_used;     // Of those, the bytes of blocks.
    size_t bytes_peak;     // The maximum of bytes_held so far if there is a limit, else 0.
} obr_heap_statistics;

// Creates a heap. The text of `name` is copied; null gives it a name of its own. Null `settings`
// are the defaults. Returns null if a living pool has that name, if no pool can have the settings,
// or if memory is exhausted. The name of a living pool that has lost its handle through an
// assignment in C++ ends the process.
OBR_HEAP_API obr_heap* obr_heap_new(const char* name, const obr_heap_settings* settings);

// Drops all blocks and destroys the heap. Null does nothing.
OBR_HEAP_API void obr_heap_delete(obr_heap* heap);

// As the functions of C with these names. Blocks are aligned as the settings say. A size of 0 gives
// a distinct block. The largest size is 1073733632. The alignment of obr_heap_aligned_alloc is a
// power of two up to 4096; obr_heap_realloc keeps it. obr_heap_realloc leaves a block in its place
// if it has room and does not shrink to less than half; it frees a block if the size is 0, and
// returns null; and it fails for a foreign pointer.
OBR_HEAP_API void* obr_heap_malloc(obr_heap* heap, size_t size);
OBR_HEAP_API void* obr_heap_calloc(obr_heap* heap, size_t count, size_t size);
OBR_HEAP_API void* obr_heap_realloc(obr_heap* heap, void* block, size_t size);
OBR_HEAP_API void* obr_heap_aligned_alloc(obr_heap* heap, size_t alignment, size_t size);

// Frees a block. False, with nothing changed, for null and a foreign pointer.
OBR_HEAP_API bool obr_heap_free(obr_heap* heap, void* block);

// All of them in one call, as lua_newstate takes it: a `new_size` of 0 frees the block, unless it
// is null, and returns null; otherwise this is obr_heap_realloc. `heap` is an obr_heap*. `old_size`
// is ignored.
OBR_HEAP_API void* obr_heap_call(void* heap, void* block, size_t old_size, size_t new_size);

// The bytes that a host may use in a block, at least those asked for. 0 for null and a foreign
// pointer.
OBR_HEAP_API size_t obr_heap_usable_size(const obr_heap* heap, const void* block);

// Drops all blocks at once. All pointers to them become invalid.
OBR_HEAP_API void obr_heap_free_all(obr_heap* heap);

// Counts what the heap holds. The caller sets `struct_size`. False if that is less than its own
// size.
OBR_HEAP_API bool obr_heap_stats(const obr_heap* heap, obr_heap_statistics* statistics);

// Writes the pool's report to a stream. No other thread may use C++'s std::cout meanwhile. False if
// memory is exhausted or the stream does not take the whole report.
OBR_HEAP_API bool obr_heap_report(const obr_heap* heap, FILE* stream);

// The reason of the last failure in this thread; "" if there was none. The text lives until the
// next failure in this thread.
OBR_HEAP_API const char* obr_heap_error(void);

#ifdef __cplusplus
}
#endif

#endif
