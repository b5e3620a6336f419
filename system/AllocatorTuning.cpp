#include "system/AllocatorTuning.h"

#include <cstdlib>  // defines __GLIBC__ where that is the C library

#ifdef __GLIBC__
#include <malloc.h>
#endif

namespace appsync {

void tuneAllocator() noexcept {
#ifdef __GLIBC__
    constexpr int kLargestKept = 4 << 20;  // bytes: above what an install holds of an entry
    constexpr int kKeptInAll = 16 << 20;   // bytes, of each arena
    constexpr int kArenas = 2;             // with one for each thread, each keeps its own share
    (void)::mallopt(M_MMAP_THRESHOLD, kLargestKept);
    (void)::mallopt(M_TRIM_THRESHOLD, kKeptInAll);
    (void)::mallopt(M_ARENA_MAX, kArenas);
#endif
}

}  // namespace appsync
