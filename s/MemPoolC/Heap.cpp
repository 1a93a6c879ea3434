// The functions of MemPoolHeap.h. Each calls a Heap and keeps the reason of a failure.

#include "MemPoolC/Heap.hpp"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdio>
#include <cstring>
#include <exception>
#include <iostream>
#include <mutex>
#include <new>
#include <sstream>
#include <stdexcept>
#include <string>
#include <string_view>

using OBR::MemPool::Heap;
using OBR::MemPool::HeapSettings;
using OBR::MemPool::HeapStats;

namespace {

thread_local std::array<char, 256> lastError = {};

void SetError(const char* reason) {
    std::snprintf(lastError.data(), lastError.size(), "%s", reason);
}

constexpr const char* exhausted = "out of memory";
constexpr const char* foreign = "not a block of this heap";
constexpr const char* unknownFields = "struct_size is not the size of the struct";

// Sets the error of an allocation of that size. Returns null.
void* NoBlock(std::size_t size) {
    SetError(size > Heap::MaxSize() ? "the size is above the maximum of 1073733632" : exhausted);
    return nullptr;
}
static_assert(Heap::MaxSize() == 1073733632, "The error names the maximum.");

// The settings that this version knows, from a host compiled with this, an older or a newer one.
obr_heap_settings Known(const obr_heap_settings& theirs) {
    obr_heap_settings ours = {};
    if (theirs.struct_size < sizeof theirs.struct_size) {
        throw std::invalid_argument(unknownFields);
    }
    std::memcpy(&ours, &theirs, std::min(sizeof ours, theirs.struct_size));
    const char* const bytes = reinterpret_cast<const char*>(&theirs);
    for (std::size_t at = sizeof ours; at < theirs.struct_size; ++at) {
        if (bytes[at] != 0) { throw std::invalid_argument("a setting is unknown to this version"); }
    }
    return ours;
}

void Set(HeapSettings& settings, HeapSettings& (HeapSettings::*set)(bool), int value) {
    if (value < OBR_HEAP_DEFAULT || value > OBR_HEAP_OFF) {
        throw std::invalid_argument("a setting is neither OBR_HEAP_ON nor OBR_HEAP_OFF");
    }
    if (value != OBR_HEAP_DEFAULT) { (settings.*set)(value == OBR_HEAP_ON); }
}

void Set(HeapSettings& settings, HeapSettings& (HeapSettings::*set)(std::size_t),
         std::size_t value) {
    if (value != 0) { (settings.*set)(value); }
}

HeapSettings SettingsFrom(const obr_heap_settings* theirs) {
    HeapSettings settings;
    settings.On(true);
    if (theirs == nullptr) { return settings; }
    const obr_heap_settings known = Known(*theirs);
    Set(settings, &HeapSettings::On, known.pools);
    Set(settings, &HeapSettings::KeepEmptyBuckets, known.keep_empty_buckets);
    Set(settings, &HeapSettings::BucketSize, known.bucket_size);
    Set(settings, &HeapSettings::MaxRecordSize, known.max_record_size);
    Set(settings, &HeapSettings::MinRecordSize, known.min_record_size);
    Set(settings, &HeapSettings::DataAlignment, known.data_alignment);
    Set(settings, &HeapSettings::Alignment, known.alignment);
    Set(settings, &HeapSettings::Limit, known.limit);
    return settings;
}

// The report as a text. Report prints to std::cout, which is redirected meanwhile.
std::string ReportOf(const Heap& heap) {
    std::ostringstream report;
    const std::ios_base::iostate state = std::cout.rdstate();
    std::streambuf* const output = std::cout.rdbuf(report.rdbuf());
    std::exception_ptr failure;
    try {
        heap.Report();
    } catch (...) { failure = std::current_exception(); }
    const bool isWhole = std::cout.good();
    std::cout.rdbuf(output);
    std::cout.clear(state);
    if (failure != nullptr || !isWhole) { throw std::bad_alloc(); }
    return report.str();
}

}  // namespace

extern "C" {

obr_heap* obr_heap_new(const char* name, const obr_heap_settings* settings) {
    try {
        return new obr_heap{Heap(name, SettingsFrom(settings))};
    } catch (const std::bad_alloc&) { SetError(exhausted); } catch (const std::exception& error) {
        const std::string_view prefix = OBR::MemPool::detail::refusalPrefix;  // Of C++ only.
        const char* const reason = error.what();
        const bool hasPrefix = std::string_view(reason).substr(0, prefix.size()) == prefix;
        SetError(reason + (hasPrefix ? prefix.size() : 0));
    }
    return nullptr;
}

void obr_heap_delete(obr_heap* heap) {
    delete heap;
}

void* obr_heap_malloc(obr_heap* heap, size_t size) {
    void* const block = heap->heap.Malloc(size);
    return block != nullptr ? block : NoBlock(size);
}

void* obr_heap_calloc(obr_heap* heap, size_t count, size_t size) {
    void* const block = heap->heap.Calloc(count, size);
    const bool isTooLarge = size != 0 && count > Heap::MaxSize() / size;
    return block != nullptr ? block : NoBlock(isTooLarge ? SIZE_MAX : count * size);
}

void* obr_heap_realloc(obr_heap* heap, void* block, size_t size) {
    void* const moved = heap->heap.Realloc(block, size);
    if (moved != nullptr || size == 0) { return moved; }
    if (block == nullptr || heap->heap.UsableSize(block) != 0) { return NoBlock(size); }
    SetError(foreign);
    return nullptr;
}

void* obr_heap_aligned_alloc(obr_heap* heap, size_t alignment, size_t size) {
    void* const block = heap->heap.Malloc(size, alignment);
    if (block != nullptr || OBR::MemPool::detail::IsAlignment(alignment)) {
        return block != nullptr ? block : NoBlock(size);
    }
    SetError("the alignment is not a power of two up to 4096");
    return nullptr;
}

bool obr_heap_free(obr_heap* heap, void* block) {
    if (heap->heap.Free(block)) { return true; }
    SetError(foreign);
    return false;
}

void* obr_heap_call(void* heap, void* block, size_t, size_t new_size) {
    if (block == nullptr && new_size == 0) { return nullptr; }
    return obr_heap_realloc(static_cast<obr_heap*>(heap), block, new_size);
}

size_t obr_heap_usable_size(const obr_heap* heap, const void* block) {
    return heap->heap.UsableSize(block);
}

void obr_heap_free_all(obr_heap* heap) {
    heap->heap.FreeAll();
}

bool obr_heap_stats(const obr_heap* heap, obr_heap_statistics* statistics) {
    const std::size_t size = statistics->struct_size;
    if (size < sizeof size) {
        SetError(unknownFields);
        return false;
    }
    const HeapStats stats = heap->heap.GetStats();
    const obr_heap_statistics all = {size,
                                     stats.buckets,
                                     stats.emptyBuckets,
                                     stats.fullBuckets,
                                     stats.usedRecords,
                                     stats.freeRecords,
                                     stats.heapRecords,
                                     stats.bytesHeld,
                                     stats.bytesUsed,
                                     stats.bytesPeak};
    std::memcpy(statistics, &all, std::min(size, sizeof all));
    return true;
}

bool obr_heap_report(const obr_heap* heap, FILE* stream) {
    try {
        const std::string report = [heap] {
            const std::lock_guard<std::mutex> guard(OBR::MemPool::detail::BuildLock());
            return ReportOf(heap->heap);
        }();
        if (std::fwrite(report.data(), 1, report.size(), stream) == report.size() &&
            std::fflush(stream) == 0) {
            return true;
        }
        SetError("the stream does not take the report");
    } catch (const std::exception&) { SetError(exhausted); }
    return false;
}

const char* obr_heap_error(void) {
    return lastError.data();
}

}  // extern "C"
