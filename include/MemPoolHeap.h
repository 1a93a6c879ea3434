/* A Heap of <MemPoolHeap> for hosts in C, from C99 on: one memory pool with blocks of any size.

       #include <MemPoolHeap.h>

       obr_heap* heap = obr_heap_new("parser", NULL);
       char* text = obr_heap_malloc(heap, 24);
       obr_heap_free(heap, text);
       obr_heap_delete(heap);

   Link libObrMemPoolC: MemPool::MemPoolC of CMake's package ObrMemPool, or ObrMemPoolC of
   pkg-config.

   Errors are null or false, and obr_heap_error says why. The process ends only where the heap below
   ends it. `heap` must be a living heap in all functions, not null, unless said.

   Threads. Any threads may create and delete heaps at once. A heap and its blocks belong to one
   thread at a time. */

#ifndef OBR_MEMPOOL_HEAP_C_H
#define OBR_MEMPOOL_HEAP_C_H

#include <stdbool.h>
#include <stddef.h>
#include <stdio.h>

#define OBR_HEAP_API __attribute__((visibility("default")))

#ifdef __cplusplus
extern "C" {
#endif

/* A pool and its blocks. */
typedef struct obr_heap obr_heap;

/* A setting that is on or off. */
enum { OBR_HEAP_DEFAULT = 0, OBR_HEAP_ON = 1, OBR_HEAP_OFF = 2 };

/* The settings of a heap. Sizes are bytes. A field that is 0 has its default: the setting of the
   process, unless said. Later versions add fields at the end; `struct_size` keeps them apart:

       obr_heap_settings settings = {.struct_size = sizeof settings, .alignment = 16}; */
typedef struct obr_heap_settings {
    size_t struct_size;     /* sizeof(obr_heap_settings). */
    int pools;              /* OBR_HEAP_OFF takes each block from the heap below. Default: on. */
    int keep_empty_buckets; /* Whether a bucket without blocks is kept until obr_heap_free_all. */
    size_t bucket_size;     /* Of a bucket's records together, plus 2. At most 65535. */
    size_t max_record_size; /* Larger requests go to the heap below. Counts 4 bytes of overhead. */
    size_t min_record_size; /* Of the first size class. Counts 4 bytes of overhead. */
    size_t data_alignment;  /* The sizes of records are rounded up to a multiple of it. */
    size_t alignment;       /* Of blocks: a power of two from 8, the default, to 4096. */
} obr_heap_settings;

/* What a heap holds at one moment. See HeapStats of <MemPoolHeap>. */
typedef struct obr_heap_statistics {
    size_t struct_size;   /* sizeof(obr_heap_statistics). */
    size_t buckets;       /* Buckets, */
    size_t empty_buckets; /* those without a block, */
    size_t full_buckets;  /* and those without room for one. */
    size_t used_records;  /* Blocks in buckets. */
    size_t free_records;  /* Room for blocks in buckets. */
    size_t heap_records;  /* Blocks that come from the heap below one by one. */
    size_t bytes_held;    /* Asked of the heap below. */
    size_t bytes_used;    /* Of those the bytes of blocks. */
} obr_heap_statistics;

/* Creates a heap. The text of `name` is copied; null makes a name. Null `settings` are the
   defaults. Null if a living pool has that name, if the settings cannot make a pool, or if memory
   is exhausted. */
OBR_HEAP_API obr_heap* obr_heap_new(const char* name, const obr_heap_settings* settings);

/* Drops all blocks and ends the heap. Null does nothing. */
OBR_HEAP_API void obr_heap_delete(obr_heap* heap);

/* These do what the functions of C do whose names they bear. Blocks are aligned as the settings
   say. A size of 0 is a block of its own. The largest size is 1073733632. The alignment of
   obr_heap_aligned_alloc is a power of two up to 4096; realloc keeps it. A block stays in its place
   if it has room and half of it or more is used; obr_heap_realloc of 0 bytes gives it back and
   returns null. Null with an error also for a foreign block, which stays as it is. */
OBR_HEAP_API void* obr_heap_malloc(obr_heap* heap, size_t size);
OBR_HEAP_API void* obr_heap_calloc(obr_heap* heap, size_t count, size_t size);
OBR_HEAP_API void* obr_heap_realloc(obr_heap* heap, void* block, size_t size);
OBR_HEAP_API void* obr_heap_aligned_alloc(obr_heap* heap, size_t alignment, size_t size);

/* Gives a block back. False, with nothing changed, for null and for what is no block of this heap,
   as far as a pool can see: see Free of <MemPoolHeap>. */
OBR_HEAP_API bool obr_heap_free(obr_heap* heap, void* block);

/* All of them in one call, a hook as Lua, mujs and mruby take it: a `new_size` of 0 gives the block
   back, if there is one, and returns null; a null `block` is a new one; else the block is resized.
   `heap` is an obr_heap*, so that the function can be handed over as it is. `old_size` is not
   needed. */
OBR_HEAP_API void* obr_heap_call(void* heap, void* block, size_t old_size, size_t new_size);

/* The bytes that a host may use in a block, at least those asked for. 0 for null and for what is no
   block of this heap. */
OBR_HEAP_API size_t obr_heap_usable_size(const obr_heap* heap, const void* block);

/* Drops every block at once. */
OBR_HEAP_API void obr_heap_free_all(obr_heap* heap);

/* Counts what the heap holds. The caller sets `struct_size`; false if that is no size. */
OBR_HEAP_API bool obr_heap_stats(const obr_heap* heap, obr_heap_statistics* statistics);

/* Writes the pool's report to a stream. While it runs no other thread may print through C++'s
   std::cout. False if memory is exhausted or the stream does not take all of it. */
OBR_HEAP_API bool obr_heap_report(const obr_heap* heap, FILE* stream);

/* Why the last of these functions that failed in this thread did so; "" if none has. The text lives
   until the next failure in this thread. */
OBR_HEAP_API const char* obr_heap_error(void);

#ifdef __cplusplus
}
#endif

#endif
