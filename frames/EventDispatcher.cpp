#include "EventDispatcher.h"

#include <algorithm>

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

EventDispatcher& EventDispatcher::getInstanceLocked() {
    if (mInstance == nullptr) mInstance.reset(new EventDispatcher());
    return *mInstance;
}

void EventDispatcher::broadcastEvent(const uint32_t& uid, const EventType& type,
                                     const nsecs_t& time, const EventData& data) {
    {
        std::lock_guard lock(mMutex);
        getInstanceLocked().broadcastEventLocked(uid, type, time, data);
    }
    // The receivers called keep their references until here, so that one whose last reference
    // goes can unsubscribe.
    DeferredRelease<EventReceiver>::releaseAll();
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
    auto entry = mSubscriptions.find(uid);
    if (entry == mSubscriptions.end()) {
        ILOG(1, "EventDispatcher::broadcastEventLocked no subscribers for uid %d", uid);
        return;
    }
    if (entry->second.empty()) {
        ILOG(1, "EventDispatcher::broadcastEventLocked no subscribers for uid %d", uid);
        mSubscriptions.erase(entry);
        return;
    }
    for (const auto& [flags, receiver] : entry->second) {
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
        DeferredRelease<EventReceiver>::hold(std::move(strong));
    }
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
        mSubscriptions.erase(entry);
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
