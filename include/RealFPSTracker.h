#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <cstdint>
#include <mutex>
#include <utility>

#include "RingBuffer.h"

namespace android::Interpolation::MachineLearning {

// The rate at which the game really provides buffers over the last second, announced as
// eRealFPSChangedEvent each time it is read.
class RealFPSTracker final : public virtual RefBase {
public:
    static constexpr uint32_t FRAME_MEMORY = 120;

    explicit RealFPSTracker(uint32_t uid);

    // The owner keeps this current; every provided buffer is recorded with it.
    void setReferenceTime(nsecs_t referenceTime);
    void logBufferProvided(const nsecs_t& t);
    // Frames per second over the newest buffers, until their span passes one second.
    uint32_t getRealFPS(const nsecs_t& now);

    void dump(String8& out, const char* prefix) const;

private:
    mutable std::mutex mMutex;
    const uint32_t mUid;
    nsecs_t mReferenceTime = 0;  // guarded by mMutex
    // {reference time at the call, provided time}, newest at 0.
    RingBuffer<std::pair<nsecs_t, nsecs_t>> mHistory;  // guarded by mMutex
};

}  // namespace android::Interpolation::MachineLearning
