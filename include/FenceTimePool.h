#pragma once

#include <ui/Fence.h>
#include <ui/FenceTime.h>
#include <utils/LightRefBase.h>
#include <utils/StrongPointer.h>

#include <cstddef>
#include <memory>
#include <mutex>
#include <vector>

namespace android::Interpolation {

// Storage for the FenceTime wrappers of one layer's fences: once the pool has grown to the number
// of wrappers in use at a time, wrapping a fence for each frame allocates nothing. A wrapper's
// storage (its shared reference counts included) returns to the pool when its last reference
// goes, on whatever thread that happens, and keeps the pool alive until then.
class FenceTimePool final : public LightRefBase<FenceTimePool> {
public:
    FenceTimePool() = default;
    FenceTimePool(const FenceTimePool&) = delete;
    FenceTimePool& operator=(const FenceTimePool&) = delete;

    std::shared_ptr<FenceTime> wrap(const sp<Fence>& fence);

    // Blocks made so far, free or in use.
    size_t capacity() const;

private:
    friend class LightRefBase<FenceTimePool>;
    template <typename T>
    class Allocator;

    // A shared FenceTime and its reference counts: the wrapper itself plus the control block's
    // virtual table, two counts and the allocator, with room to spare for other standard
    // libraries' layouts. Sized from the platform's own FenceTime, so a device build's larger one
    // fits too; the allocator checks it at compile time.
    static constexpr size_t CONTROL_BLOCK_ROOM = 48;
    static constexpr size_t BLOCK_SIZE =
            (sizeof(FenceTime) + CONTROL_BLOCK_ROOM + alignof(std::max_align_t) - 1) /
            alignof(std::max_align_t) * alignof(std::max_align_t);
    static constexpr size_t BLOCKS_PER_CHUNK = 16;
    union Block {
        Block* next;  // while free
        alignas(std::max_align_t) unsigned char bytes[BLOCK_SIZE];
    };

    ~FenceTimePool() = default;
    void* take();
    void give(void* storage);

    mutable std::mutex mMutex;
    std::vector<std::unique_ptr<Block[]>> mChunks;  // guarded by mMutex
    Block* mFree = nullptr;                         // guarded by mMutex
};

}  // namespace android::Interpolation
