#pragma once

#include <ui/Fence.h>
#include <ui/GraphicBuffer.h>
#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <cstdint>
#include <mutex>

#include "Delayer.h"
#include "FrameItem.h"
#include "FrameList.h"
#include "FrameTimings.h"
#include "TimestampChecker.h"

namespace android::Interpolation {

// The entry point of one game layer's buffers. The host calls interceptFrame when a buffer is
// queued and again when it is acquired; each call records the buffer's timings, gives it a
// trustworthy timestamp plus the current display delay as its display time, and puts it into the
// layer's FrameList, where the second call merges into the first.
//
// Lock order: this mutex, then the list's (then the bus's); the delayer's mutex is taken inside
// this one and never together with the list's.
class FrameInterceptor final : public virtual RefBase {
public:
    // Creates a Delayer only in mode 0 while applyDelayToFrames is set; otherwise frames get no
    // delay.
    FrameInterceptor(String8& name, const uint32_t& uid, const InterpolationMode& mode,
                     sp<FrameList>& frameList, sp<FrameTimingsAggregator>& timings);
    ~FrameInterceptor() override = default;

    void interceptFrame(const uint64_t& frameNumber, const int& slot,
                        const sp<GraphicBuffer>& buffer, nsecs_t timestamp,
                        const sp<Fence>& acquireFence, bool acquired);
    // The delayer's state, or nothing without one.
    void dumpState(String8& out, const char* prefix);

    // The layer's delayer, for the host's own hit and miss reports; null without one.
    const sp<Delayer>& getDelayer() const { return mDelayer; }

private:
    std::mutex mMutex;
    const String8 mName;
    const sp<Delayer> mDelayer;
    const sp<FrameList> mFrameList;
    const sp<FrameTimingsAggregator> mTimings;
    TimestampChecker mTimestampChecker;  // guarded by mMutex
};

}  // namespace android::Interpolation
