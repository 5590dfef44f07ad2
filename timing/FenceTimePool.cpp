#include "FenceTimePool.h"

namespace android::Interpolation {

// What std::allocate_shared stores a wrapper and its reference counts in: one block of the pool.
// Each block taken holds a reference to the pool until it is given back, so that copies of the
// allocator need none of their own.
template <typename T>
class FenceTimePool::Allocator {
public:
    using value_type = T;

    explicit Allocator(FenceTimePool* pool) : mPool(pool) {}
    template <typename U>
    Allocator(const Allocator<U>& other) : mPool(other.mPool) {}

    T* allocate(size_t n) {
        static_assert(sizeof(T) <= BLOCK_SIZE && alignof(T) <= alignof(Block),
                      "a shared FenceTime no longer fits a block of the pool");
        if (n != 1) return static_cast<T*>(::operator new(n * sizeof(T)));
        mPool->incStrong(this);
        return static_cast<T*>(mPool->take());
    }
    void deallocate(T* p, size_t n) {
        if (n != 1) {
            ::operator delete(p);
            return;
        }
        mPool->give(p);
        mPool->decStrong(this);  // may be the pool's last reference
    }

    template <typename U>
    bool operator==(const Allocator<U>& other) const {
        return mPool == other.mPool;
    }
    template <typename U>
    bool operator!=(const Allocator<U>& other) const {
        return mPool != other.mPool;
    }

private:
    template <typename U>
    friend class Allocator;

    FenceTimePool* mPool;
};

std::shared_ptr<FenceTime> FenceTimePool::wrap(const sp<Fence>& fence) {
    return std::allocate_shared<FenceTime>(Allocator<FenceTime>(this), fence);
}

size_t FenceTimePool::capacity() const {
    std::lock_guard lock(mMutex);
    return mChunks.size() * BLOCKS_PER_CHUNK;
}

void* FenceTimePool::take() {
    std::lock_guard lock(mMutex);
    if (mFree == nullptr) {
        // More wrappers in use than ever before: the pool grows by a chunk, for good.
        mChunks.push_back(std::make_unique<Block[]>(BLOCKS_PER_CHUNK));
        Block* chunk = mChunks.back().get();
        for (size_t i = 0; i < BLOCKS_PER_CHUNK; i++) {
            chunk[i].next = mFree;
            mFree = &chunk[i];
        }
    }
    Block* block = mFree;
    mFree = block->next;
    return block;
}

void FenceTimePool::give(void* storage) {
    Block* block = static_cast<Block*>(storage);
    std::lock_guard lock(mMutex);
    block->next = mFree;
    mFree = block;
}

}  // namespace android::Interpolation
