// mimalloc, loaded beside the C library's malloc without replacing it.

#ifndef OBR_TOOLS_REPLAY_MIMALLOC_HPP
#define OBR_TOOLS_REPLAY_MIMALLOC_HPP

#include <cstddef>
#include <cstdint>

namespace Replay {

struct Mimalloc {
    void* (*allocate)(std::size_t size);
    void (*free)(void* block);

    // Loads it the first time. Throws a std::runtime_error if it is not installed.
    static const Mimalloc& Get();

    // The bytes of its pages, as far as they have been used for blocks.
    static std::int64_t BytesHeld();
};

}  // namespace Replay

#endif
