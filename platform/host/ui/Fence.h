#pragma once

#include <android-base/unique_fd.h>
#include <utils/Errors.h>
#include <utils/LightRefBase.h>
#include <utils/StrongPointer.h>
#include <utils/Timers.h>

#include <atomic>
#include <cstdint>
#include <limits>
#include <mutex>

namespace android {

// A sync fence. On the device the kernel signals fences; on the host, producers call signal(),
// and the fence's descriptor is an eventfd that becomes readable then. The descriptor is made
// when it is first needed (get(), or a wait that may block): most fences are only asked whether
// they have signalled, and a descriptor costs three system calls in its life.
class Fence : public LightRefBase<Fence> {
public:
    static const sp<Fence> NO_FENCE;
    static constexpr nsecs_t SIGNAL_TIME_PENDING = std::numeric_limits<nsecs_t>::max();
    static constexpr nsecs_t SIGNAL_TIME_INVALID = -1;

    // An invalid fence, which counts as signalled.
    Fence() = default;
    explicit Fence(base::unique_fd fenceFd);
    Fence(const Fence&) = delete;
    Fence& operator=(const Fence&) = delete;

    bool isValid() const { return mValid; }
    // The descriptor, -1 for an invalid fence (or when no eventfd could be made).
    int get() const;

    // Polls the fence for at most timeout ms (0 never blocks, -1 waits for ever).
    // Returns NO_ERROR once signalled, TIMED_OUT otherwise. Once the descriptor is made, every
    // wait polls it, as a device's fence is polled, so that what a benchmark measures of a fence
    // given a descriptor is a device's cost; before, a wait of 0 reads the signal time only.
    status_t wait(int timeout) const;

    // SIGNAL_TIME_PENDING until signalled, SIGNAL_TIME_INVALID for an invalid fence.
    nsecs_t getSignalTime() const;

    // Host only: a fence that nobody has signalled yet, and the producer's side of it.
    static sp<Fence> createPending();
    static sp<Fence> createSignalled(nsecs_t signalTime);
    void signal(nsecs_t signalTime);

private:
    friend class LightRefBase<Fence>;
    ~Fence();

    struct Pending {};
    explicit Fence(Pending);
    // The descriptor, made on first use.
    int descriptorLocked() const;

    const bool mValid = false;
    mutable std::mutex mMutex;
    mutable base::unique_fd mFenceFd;  // guarded by mMutex
    // mFenceFd's descriptor once made, for the waits that poll it without the mutex.
    mutable std::atomic<int> mMadeFd{-1};
    std::atomic<nsecs_t> mSignalTime{SIGNAL_TIME_PENDING};
};

}  // namespace android
