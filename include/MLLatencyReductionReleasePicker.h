#pragma once

#include "LatencyReduction.h"
#include "ReleasePicker.h"

namespace android::Interpolation {

// The object has two receiver subobjects, its own and ReleasePicker's, which is what lets it hold
// two entries at the event bus; the compiler's note that its own is out of reach by conversion is
// expected, and primaryReceiver() reaches it.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Winaccessible-base"

// Holds frames until the queue is full and the newest frame is on screen, then sleeps for the
// delay the latency-reduction delayer predicts from past frame timings before releasing the
// oldest, so that the game renders its next frame as late as is safe.
//
// The sleep holds mMutex, on purpose: stop and setFrameListCapacity wait for it to end, while
// events are left in the base's inbox without waiting.
class MLLatencyReductionReleasePicker final : public EventDispatcher::EventReceiver,
                                              public virtual ReleasePicker {
public:
    MLLatencyReductionReleasePicker(sp<FrameList>& frameList, sp<FrameTimingsAggregator>& timings,
                                    String8& name, unsigned int const& uid);

    void onEvent(const EventType& type, const nsecs_t& time, const EventData& data) override;
    ~MLLatencyReductionReleasePicker() override = default;
    // Subscribes twice: the base's receiver for composition events and frame arrivals, and this
    // object's own receiver for frame arrivals again, so that each arrival wakes the selection
    // twice.
    void onFirstRef() override;
    void onLastStrongRef(const void* id) override;
    void setFrameListCapacity(size_t capacity) override;
    ReleaseChoice tryRelease() override;

protected:
    // The policy with its sleep as a value: RELEASE_AFTER_SLEEP for the predicted delay.
    ReleaseChoice decideLocked() override;

private:
    // The receiver subobject of the second subscription.
    EventDispatcher::EventReceiver* primaryReceiver();

    const sp<MachineLearning::LRDelayer> mDelayer;
};

#pragma GCC diagnostic pop

}  // namespace android::Interpolation
