#pragma once

#include <utils/RefBase.h>
#include <utils/Timers.h>

#include <cstdint>
#include <memory>
#include <mutex>
#include <unordered_map>
#include <utility>
#include <variant>
#include <vector>

#include "FrameItem.h"

namespace android::Interpolation {

// Single bits, so that a subscription is a mask.
enum EventType : uint32_t {
    eFrameReceivedEvent = 0x1,                    // FrameItem: a frame entered a FrameList
    eFrameReleasedEvent = 0x2,                    // FrameItem: a frame left a FrameList
    eFrameListSizeChangedEvent = 0x4,             // int: the queue length
    eBlendedCompositionEvent = 0x8,               // RenderState: two frames picked for blending
    eRepeatedCompositionEvent = 0x10,             // RenderState: the previous picture again
    eDelayChangedEvent = 0x20,                    // nsecs_t: the new display delay
    eNewFrameCompositionEvent = 0x40,             // RenderState: a single new picture
    eBufferRequestedEvent = 0x80,                 // int: slot
    eBufferDequeuedEvent = 0x100,                 // int: slot
    eBufferQueuedEvent = 0x200,                   // int: slot
    eBufferCompletedEvent = 0x400,                // int: slot
    eFrameDesiredEvent = 0x800,                   // FrameItem
    eDFSChangedEvent = 0x1000,                    // int: render frame rate
    eRealFPSChangedEvent = 0x2000,                // int
    ePresentationRefusedEvent = 0x20000,          // int: 0
    eBufferDisplayedEvent = 0x40000,              // int: slot
    eBufferReleasedEvent = 0x80000,               // int: slot
    eBufferComposedEvent = 0x100000,              // RenderState: what was composed
    eCompositionEstimateEvent = 0x200000,         // nsecs_t: estimated composition time
    eReleaseDelayed = 0x400000,                   // nsecs_t
    eClientCompositionExceptionCheck = 0x800000,  // bool
};

using EventData = std::variant<bool, int, nsecs_t, FrameItem, RenderState>;

// The process-wide event bus: receivers subscribe per uid with a mask of event types, and every
// broadcast is delivered synchronously, under the bus's mutex, in order of subscription.
class EventDispatcher {
public:
    static constexpr uint32_t ALL_EVENTS = 0xFFFFFFFF;
    static constexpr uint32_t NO_EVENTS = 0;

    class EventReceiver : public virtual RefBase {
    public:
        // Runs under the bus's mutex: it must not broadcast, subscribe or unsubscribe.
        virtual void onEvent(const EventType& type, const nsecs_t& time, const EventData& data) = 0;
        virtual ~EventReceiver() = default;
    };

    virtual ~EventDispatcher() = default;

    static void broadcastEvent(const uint32_t& uid, const EventType& type, const nsecs_t& time,
                               const EventData& data);
    static void subscribe(const uint32_t& uid, const uint32_t& flags, wp<EventReceiver> receiver);
    static void unsubscribe(const uint32_t& uid, const uint32_t& flags, wp<EventReceiver> receiver);

    void broadcastEventLocked(const uint32_t& uid, const EventType& type, const nsecs_t& time,
                              const EventData& data);
    void subscribeLocked(const uint32_t& uid, const uint32_t& flags, wp<EventReceiver> receiver);
    void unsubscribeLocked(const uint32_t& uid, const uint32_t& flags, wp<EventReceiver> receiver);

private:
    using Subscription = std::pair<uint32_t /* flags */, wp<EventReceiver>>;
    class CalledReceivers;

    static EventDispatcher& getInstanceLocked() {
        if (mInstance == nullptr) mInstance.reset(new EventDispatcher());
        return *mInstance;
    }
    // Delivers the event; `called` holds each receiver called, to be released after the mutex.
    void deliverLocked(uint32_t uid, EventType type, nsecs_t time, const EventData& data,
                       CalledReceivers& called);

    // Removes the uid's entry, and forgets it as the last one broadcast to.
    void eraseLocked(uint32_t uid);

    std::unordered_map<uint32_t, std::vector<Subscription>> mSubscriptions;  // by uid
    // The entry of the uid broadcast to last: a layer's events come in runs, and finding the
    // entry again would cost a division. Entries stay in place until erased.
    uint32_t mLastUid = 0;
    std::vector<Subscription>* mLastSubscriptions = nullptr;

    static std::unique_ptr<EventDispatcher> mInstance;  // guarded by mMutex
    static std::mutex mMutex;
};

}  // namespace android::Interpolation
