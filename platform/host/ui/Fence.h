#pragma once

#include <android-base/unique_fd.h>
#include <utils/Errors.h>
#include <utils/LightRefBase.h>
#include <utils/StrongPointer.h>
#include <utils/Timers.h>

#include <atomic>
#include <cstdint>
#include <limits>

namespace android {

// A sync fence backed by an eventfd: it is signalled once the eventfd becomes readable.
// On the device the kernel signals fences; on the host, producers call signal().
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

    bool isValid() const { return mFenceFd.ok(); }
    int get() const { return mFenceFd.get(); }

    // Polls the fence for at most timeout ms (0 never blocks, -1 waits for ever).
    // Returns NO_ERROR once signalled, TIMED_OUT otherwise.
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

    base::unique_fd mFenceFd;
    std::atomic<nsecs_t> mSignalTime{SIGNAL_TIME_PENDING};
};

}  // namespace android
