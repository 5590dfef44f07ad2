#include "EventDispatcher.h"

#include <algorithm>
#include <new>

#include "DeferredRelease.h"
#include "Log.h"

namespace android::Interpolation {

std::unique_ptr<EventDispatcher> EventDispatcher::mInstance;
std::mutex EventDispatcher::mMutex;

namespace {

// One object can hold several receiver subobjects that share one reference block, so identity is
// the pair of object pointer and reference block, not the block alone.
bool isSameReceiver(const wp<EventDispatcher::EventReceiver>& a,
                    const wp<EventDispatcher::EventReceiver>& b) {
    return a.unsafe_get() == b.unsafe_get() && a.get_refs() == b.get_refs();
}

void* promotedPointer(const wp<EventDispatcher::EventReceiver>& receiver) {
    return receiver.promote().get();
}

}  // namespace

// The receivers one broadcast has called. Their strong references are dropped only once the bus's
// mutex is released: dropping the last one runs the receiver's onLastStrongRef, which unsubscribes
// and so takes that mutex. The first ON_STACK of them stay on the broadcasting thread's stack;
// any more wait in the thread's DeferredRelease.
class EventDispatcher::CalledReceivers {
public:
    CalledReceivers() {}
    ~CalledReceivers() {
        for (size_t i = 0; i < mCount; i++)
            mSlots[i].receiver.~sp();
        if (mDeferred) DeferredRelease<EventReceiver>::releaseAll();
    }
    CalledReceivers(const CalledReceivers&) = delete;
    CalledReceivers& operator=(const CalledReceivers&) = delete;

    void hold(sp<EventReceiver>&& receiver) {
        if (mCount < ON_STACK) {
            new (&mSlots[mCount++].receiver) sp<EventReceiver>(std::move(receiver));
        } else {
            DeferredRelease<EventReceiver>::hold(std::move(receiver));
            mDeferred = true;
        }
    }

    // Leaves every reference to the thread's next DeferredRelease<EventReceiver>::releaseAll().
    void deferAll() {
        for (size_t i = 0; i < mCount; i++) {
            DeferredRelease<EventReceiver>::hold(std::move(mSlots[i].receiver));
            mSlots[i].receiver.~sp();
        }
        mCount = 0;
        mDeferred = false;
    }

private:
    static constexpr size_t ON_STACK = 32;
    // Constructed and destroyed one by one, so that a broadcast pays only for the receivers it
    // called.
    union Slot {
        Slot() {}
        ~Slot() {}
        sp<EventReceiver> receiver;
    };
    Slot mSlots[ON_STACK];
    size_t mCount = 0;
    bool mDeferred = false;
};

void EventDispatcher::broadcastEvent(const uint32_t& uid, const EventType& type,
                                     const nsecs_t& time, const EventData& data) {
    CalledReceivers called;
    std::lock_guard lock(mMutex);
    getInstanceLocked().deliverLocked(uid, type, time, data, called);
}

void EventDispatcher::subscribe(const uint32_t& uid, const uint32_t& flags,
                                wp<EventReceiver> receiver) {
    ILOG(2, "EventDispatcher::subscribe uid %u flag %u subscriber %p", uid, flags,
         promotedPointer(receiver));
    std::lock_guard lock(mMutex);
    getInstanceLocked().subscribeLocked(uid, flags, std::move(receiver));
}

void EventDispatcher::unsubscribe(const uint32_t& uid, const uint32_t& flags,
                                  wp<EventReceiver> receiver) {
    ILOG(2, "EventDispatcher::unsubcribe uid %u flag %u subscriber %p", uid, flags,
         promotedPointer(receiver));
    std::lock_guard lock(mMutex);
    getInstanceLocked().unsubscribeLocked(uid, flags, std::move(receiver));
}

void EventDispatcher::broadcastEventLocked(const uint32_t& uid, const EventType& type,
                                           const nsecs_t& time, const EventData& data) {
    CalledReceivers called;
    deliverLocked(uid, type, time, data, called);
    called.deferAll();
}

void EventDispatcher::deliverLocked(uint32_t uid, EventType type, nsecs_t time,
                                    const EventData& data, CalledReceivers& called) {
    std::vector<Subscription>* subscriptions = uid == mLastUid ? mLastSubscriptions : nullptr;
    if (subscriptions == nullptr) {
        auto entry = mSubscriptions.find(uid);
        if (entry == mSubscriptions.end()) {
            ILOG(1, "EventDispatcher::broadcastEventLocked no subscribers for uid %d", uid);
            return;
        }
        subscriptions = &entry->second;
    }
    if (subscriptions->empty()) {
        ILOG(1, "EventDispatcher::broadcastEventLocked no subscribers for uid %d", uid);
        eraseLocked(uid);
        return;
    }
    mLastUid = uid;
    mLastSubscriptions = subscriptions;
    for (const auto& [flags, receiver] : *subscriptions) {
        if ((flags & type) == 0) continue;
        sp<EventReceiver> strong = receiver.promote();
        if (strong == nullptr) {
            // Dead entries stay: only unsubscribe removes subscriptions.
            ILOG(2,
                 "EventDispatcher::broadcastEventLocked subscriber %p has been deallocated. "
                 "Please unsubscribe before deallocation.",
                 receiver.unsafe_get());
            continue;
        }
        strong->onEvent(type, time, data);
        called.hold(std::move(strong));
    }
}

void EventDispatcher::eraseLocked(uint32_t uid) {
    mSubscriptions.erase(uid);
    if (uid == mLastUid) mLastSubscriptions = nullptr;
}

void EventDispatcher::subscribeLocked(const uint32_t& uid, const uint32_t& flags,
                                      wp<EventReceiver> receiver) {
    std::vector<Subscription>& subscriptions = mSubscriptions[uid];
    for (auto& [entryFlags, entryReceiver] : subscriptions) {
        if (isSameReceiver(entryReceiver, receiver)) {
            entryFlags |= flags;
            return;
        }
    }
    subscriptions.emplace_back(flags, std::move(receiver));
}

void EventDispatcher::unsubscribeLocked(const uint32_t& uid, const uint32_t& flags,
                                        wp<EventReceiver> receiver) {
    auto entry = mSubscriptions.find(uid);
    if (entry == mSubscriptions.end()) {
        ILOG(1, "EventDispatcher::unsubscribeLocked no subscribers for uid %d", uid);
        return;
    }
    std::vector<Subscription>& subscriptions = entry->second;
    if (subscriptions.empty()) {
        ILOG(1, "EventDispatcher::unsubscribeLocked no subscribers for uid %d", uid);
        eraseLocked(uid);
        return;
    }
    auto found =
            std::find_if(subscriptions.begin(), subscriptions.end(),
                         [&](const Subscription& s) { return isSameReceiver(s.second, receiver); });
    if (found == subscriptions.end()) {
        ILOG(1, "EventDispatcher::unsubscribeLocked no subscriber %p found for uid %d",
             receiver.unsafe_get(), uid);
        return;
    }
    found->first &= ~flags;
    if (found->first == 0) subscriptions.erase(found);
}

}  // namespace android::Interpolation
