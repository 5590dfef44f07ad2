#include "AllocationCounter.h"

#include <atomic>
#include <cstdlib>
#include <new>

// The binary's one replacement of the global allocator: it counts every allocation, so that each
// benchmark can report how many its measured loop made (the frame paths promise none).
namespace {
std::atomic<uint64_t> sAllocations{0};
}  // namespace

// Not inlined: GCC would otherwise see free() meet a pointer from operator new, or a malloc()
// pointer meet operator delete, and warn.
[[gnu::noinline]] void* operator new(size_t size) {
    sAllocations.fetch_add(1, std::memory_order_relaxed);
    if (void* p = std::malloc(size == 0 ? 1 : size)) return p;
    throw std::bad_alloc();
}
[[gnu::noinline]] void operator delete(void* p) noexcept {
    std::free(p);
}
[[gnu::noinline]] void operator delete(void* p, size_t) noexcept {
    std::free(p);
}

namespace android::Interpolation {

uint64_t allocationCount() {
    return sAllocations.load(std::memory_order_relaxed);
}

}  // namespace android::Interpolation
