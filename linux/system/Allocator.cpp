#include "linux/system/Allocator.h"

#include <malloc.h>

namespace lumacast {

namespace {

constexpr int kPools = 2;
/// Larger blocks are mapped by themselves, and so much may stay free at a pool's end. Set, because the allocator raises
/// both with every large block that is freed.
constexpr int kLargeBlock = 256 * 1024;

}  // namespace

void keepMemoryFlat() {
    mallopt(M_ARENA_MAX, kPools);
    mallopt(M_MMAP_THRESHOLD, kLargeBlock);
    mallopt(M_TRIM_THRESHOLD, kLargeBlock);
}

}  // namespace lumacast
