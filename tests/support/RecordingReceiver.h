#pragma once

#include <mutex>
#include <vector>

#include "EventDispatcher.h"

namespace android::test {

class RecordingReceiver : public Interpolation::EventDispatcher::EventReceiver {
public:
    struct Event {
        Interpolation::EventType type;
        nsecs_t time;
        Interpolation::EventData data;
    };

    void onEvent(const Interpolation::EventType& type, const nsecs_t& time,
                 const Interpolation::EventData& data) override {
        std::lock_guard lock(mMutex);
        mEvents.push_back({type, time, data});
    }

    std::vector<Event> events() const {
        std::lock_guard lock(mMutex);
        return mEvents;
    }

    std::vector<uint32_t> types() const {
        std::vector<uint32_t> types;
        for (const Event& event : events())
            types.push_back(event.type);
        return types;
    }

    void clear() {
        std::lock_guard lock(mMutex);
        mEvents.clear();
    }

private:
    mutable std::mutex mMutex;
    std::vector<Event> mEvents;  // guarded by mMutex
};

}  // namespace android::test
