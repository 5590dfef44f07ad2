#pragma once

#include <cstdint>
#include <mutex>

#include "EventDispatcher.h"

namespace android::Interpolation {

// An extra receiver that does nothing with what it gets.
class NullReceiver : public EventDispatcher::EventReceiver {
public:
    void onEvent(const EventType&, const nsecs_t&, const EventData&) override {}
};

// Stands for the layer's ring log until it lands: subscribed to every event of its uid, it keeps a
// 16-byte record of each under its own mutex, overwriting the oldest.
class RingLogStandIn : public EventDispatcher::EventReceiver {
public:
    struct Record {
        nsecs_t time;
        uint32_t type;
        uint32_t payloadKind;
    };
    static_assert(sizeof(Record) == 16);

    explicit RingLogStandIn(uint32_t uid) : mUid(uid) {}

    void onFirstRef() override {
        EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, this);
    }
    void onLastStrongRef(const void*) override {
        EventDispatcher::unsubscribe(mUid, EventDispatcher::ALL_EVENTS, this);
    }

    void onEvent(const EventType& type, const nsecs_t& time, const EventData& data) override {
        std::lock_guard lock(mMutex);
        mRecords[mNext++ % CAPACITY] = {time, type, static_cast<uint32_t>(data.index())};
    }

private:
    static constexpr uint32_t CAPACITY = 1024;

    const uint32_t mUid;
    std::mutex mMutex;
    uint32_t mNext = 0;           // guarded by mMutex
    Record mRecords[CAPACITY]{};  // guarded by mMutex
};

}  // namespace android::Interpolation
