#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <array>
#include <cstdint>
#include <mutex>

#include "EventDispatcher.h"
#include "FrameItem.h"
#include "RingBuffer.h"
#include "SerializableEvent.h"

namespace android {
class Parcel;
}  // namespace android

namespace android::Interpolation {

// The black-box recorder of one game layer: every event of its uid, flattened, in a ring of the
// newest NUM_EVENTS records, plus three records the engine logs directly. The controlling service
// reads it whole through writeToParcel after a user reports stutter.
class Ringlog final : public EventDispatcher::EventReceiver {
public:
    // 62487 records of 16 bytes: just under 1 MB of ring.
    static constexpr uint32_t NUM_EVENTS = 62487;
    static constexpr size_t HEADER_SIZE = 184;
    // Where the header's fields lie, little-endian; every other byte is zero.
    struct HeaderLayout {
        static constexpr size_t TAG = 8;  // int64 HEADER_TAG
        static constexpr size_t MAJOR_VERSION = 16;
        static constexpr size_t MINOR_VERSION = 20;
        static constexpr size_t REVISION = 24;
        static constexpr size_t MODE = 28;
        static constexpr size_t CHECKSUM = 32;  // 64 hexadecimal digits, no terminator
        static constexpr size_t CHECKSUM_SIZE = 64;
        static constexpr size_t CREATION_TIME = 96;  // int64 seconds since the epoch
        static constexpr size_t SIZE = 104;          // int64 HEADER_SIZE
        static constexpr size_t UID = 112;
        static constexpr size_t NAME = 116;  // cut at, or zero-padded to, NAME_SIZE bytes
        static constexpr size_t NAME_SIZE = 64;
    };
    // Every reader of the format expects this value at HeaderLayout::TAG.
    static constexpr int64_t HEADER_TAG = 6;

    // Type codes of the direct records; they lie above the bus's ordinary event bits.
    static constexpr uint32_t FRAME_REPEATED_RECORD = 0x10000;
    static constexpr uint32_t BACKPRESSURE_RECORD = 0x8000;
    static constexpr uint32_t GFPS_CHANGED_RECORD = 0x4000;

    Ringlog(String8& name, const InterpolationMode& mode, const unsigned int& uid);

    void onFirstRef() override;
    void onLastStrongRef(const void* id) override;
    void onEvent(const EventType& type, const nsecs_t& time, const EventData& data) override;

    // The host logs these itself: a frame shown again, a producer that found no free buffer, and a
    // new game-rate limit.
    void logFrameRepeated();
    void logBackpressure();
    void logGFPSChangedEvent(const int& gfps);

    // The header, capacity, count, newest slot and the whole ring storage, whatever the count.
    void writeToParcel(Parcel& out);

private:
    void logDirectRecord(uint32_t type, int32_t value);
    uint32_t uid() const;

    String8 mName;
    std::mutex mMutex;
    // Written only by the constructor, so uid() reads it without the lock.
    std::array<uint8_t, HEADER_SIZE> mHeader;
    RingBuffer<SerializableEvent> mRing;  // guarded by mMutex
};

}  // namespace android::Interpolation
