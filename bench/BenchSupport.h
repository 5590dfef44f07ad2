#pragma once

// What the benchmarks of the frame paths share: fences, and the plainest bus for the floors.

#include <ui/Fence.h>

#include <cstdint>
#include <mutex>
#include <utility>
#include <vector>

#include "EventDispatcher.h"

namespace android::Interpolation {

// A host fence is polled through its eventfd, as a device's fence is through its sync file, only
// once its descriptor is made: the benchmarks make it, so that they measure a device's polls.
inline sp<Fence> withDescriptor(sp<Fence> fence) {
    fence->get();
    return fence;
}

// Signalled eventfd fences, handed out in turn: a fence comes round again long after its frame
// has left the queue.
inline constexpr size_t FENCE_COUNT = 64;
// Iterations run before the measured ones, so that storage that grows to its steady size has done
// so.
inline constexpr int WARM_UP = 16;

inline std::vector<sp<Fence>> signalledFences() {
    std::vector<sp<Fence>> fences;
    for (size_t i = 0; i < FENCE_COUNT; i++)
        fences.push_back(withDescriptor(Fence::createSignalled(static_cast<nsecs_t>(i + 1))));
    return fences;
}

// A bus with nothing but its mutex and its receivers: promoted under the mutex, released after it.
class FloorBus {
public:
    void subscribe(uint32_t flags, const sp<EventDispatcher::EventReceiver>& receiver) {
        mSubscriptions.emplace_back(flags, receiver);
    }
    void broadcast(EventType type, nsecs_t time, const EventData& data) {
        sp<EventDispatcher::EventReceiver> called[4];
        size_t count = 0;
        {
            std::lock_guard lock(mMutex);
            for (const auto& [flags, receiver] : mSubscriptions) {
                if ((flags & type) == 0) continue;
                sp<EventDispatcher::EventReceiver> strong = receiver.promote();
                if (strong == nullptr) continue;
                strong->onEvent(type, time, data);
                called[count++] = std::move(strong);
            }
        }
    }

private:
    std::mutex mMutex;
    std::vector<std::pair<uint32_t, wp<EventDispatcher::EventReceiver>>> mSubscriptions;
};

}  // namespace android::Interpolation
