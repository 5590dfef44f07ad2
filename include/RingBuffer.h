#pragma once

#include <algorithm>
#include <cstdint>
#include <memory>

namespace android::Interpolation {

// A fixed-capacity circular store that overwrites its oldest element. The array is allocated once,
// at construction, so push never allocates. It has no lock: its owner locks.
//
// Indexing: at(i) with i >= 0 counts from the newest element (0 = newest), i < 0 from the oldest
// (-1 = oldest). Both reduce modulo size, not capacity, so any index lands on a stored element.
template <typename T>
class RingBuffer {
public:
    explicit RingBuffer(uint32_t capacity)
        // One slot even for capacity 0, so that at() on an empty ring still has an element to
        // return: a value-initialised T.
        : mCapacity(capacity), mData(new T[std::max<uint32_t>(capacity, 1)]()) {}
    virtual ~RingBuffer() = default;

    // Copies would duplicate the whole array behind the owner's back.
    RingBuffer(const RingBuffer&) = delete;
    RingBuffer& operator=(const RingBuffer&) = delete;

    void push(const T& value) {
        if (mCapacity == 0) return;
        mHead = static_cast<int32_t>((static_cast<int64_t>(mHead) + 1) % mCapacity);
        // The first push sets the tail to 0; a push into a full ring drops the oldest.
        if (mSize == 0 || mSize >= mCapacity) {
            mTail = static_cast<int32_t>((static_cast<int64_t>(mTail) + 1) % mCapacity);
        }
        if (mSize < mCapacity) mSize++;
        mData[mHead] = value;
    }

    uint32_t size() const { return mSize; }
    uint32_t capacity() const { return mCapacity; }

    // On an empty ring: the value-initialised element of slot 0.
    T& at(int32_t i) { return mData[slotFor(i)]; }
    const T& at(int32_t i) const { return mData[slotFor(i)]; }

    // The slots in storage order and the slot of the newest element (-1 before the first push), for
    // owners that hand out the whole storage as it lies.
    const T* data() const { return mData.get(); }
    int32_t headSlot() const { return mHead; }

    // Copies the elements at indices start..end-1 that exist, newest first, to out[0], out[1], ...
    // Returns the number written.
    uint32_t serialize(T* out, uint32_t end, uint32_t start) const {
        uint32_t written = 0;
        for (uint32_t i = start; i < end && i < mSize; i++) {
            out[written++] = at(static_cast<int32_t>(i));
        }
        return written;
    }

private:
    uint32_t slotFor(int32_t i) const {
        if (mSize == 0) return 0;
        // In 64 bits, so that no index overflows; the remainder is taken into 0..size-1 at once
        // instead of adding size until the value is not negative, which gives the same slot.
        const int64_t raw =
                i >= 0 ? static_cast<int64_t>(mHead) - i : static_cast<int64_t>(mTail) - i - 1;
        const int64_t size = mSize;
        return static_cast<uint32_t>(((raw % size) + size) % size);
    }

    const uint32_t mCapacity;
    uint32_t mSize = 0;
    int32_t mHead = -1;  // slot of the newest element
    int32_t mTail = -1;  // slot of the oldest element
    std::unique_ptr<T[]> mData;
};

}  // namespace android::Interpolation
