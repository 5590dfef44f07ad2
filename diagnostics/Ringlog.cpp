#include "Ringlog.h"

#include <limits>
#include <memory>

#include <binder/Parcel.h>

#include <algorithm>
#include <cstring>
#include <ctime>
#include <type_traits>

#include "Log.h"
#include "LogOutput.h"

namespace android::Interpolation {

// The ring's storage goes into the parcel as it lies in memory, which is the format's
// little-endian record only on a little-endian machine.
static_assert(__BYTE_ORDER__ == __ORDER_LITTLE_ENDIAN__, "the ring is written as it lies");

namespace {

using Layout = Ringlog::HeaderLayout;

template <typename T>
void putLittleEndian(uint8_t* at, T value) {
    const auto bits = static_cast<std::make_unsigned_t<T>>(value);
    for (size_t i = 0; i < sizeof(T); i++)
        at[i] = static_cast<uint8_t>(bits >> (8 * i));
}

// Zero everywhere nothing is written: the first 8 bytes, the name's padding, the reserved word.
std::array<uint8_t, Ringlog::HEADER_SIZE> makeHeader(const String8& name, InterpolationMode mode,
                                                     uint32_t uid) {
    std::array<uint8_t, Ringlog::HEADER_SIZE> header{};
    putLittleEndian<int64_t>(&header[Layout::TAG], Ringlog::HEADER_TAG);
    putLittleEndian<uint32_t>(&header[Layout::MAJOR_VERSION], INTERPOLATION_MAJOR_VERSION);
    putLittleEndian<uint32_t>(&header[Layout::MINOR_VERSION], INTERPOLATION_MINOR_VERSION);
    putLittleEndian<uint32_t>(&header[Layout::REVISION], INTERPOLATION_REVISION);
    putLittleEndian<uint32_t>(&header[Layout::MODE], mode);
    memcpy(&header[Layout::CHECKSUM], INTERPOLATION_CHECKSUM,
           strnlen(INTERPOLATION_CHECKSUM, Layout::CHECKSUM_SIZE));
    putLittleEndian<int64_t>(&header[Layout::CREATION_TIME], time(nullptr));
    putLittleEndian<int64_t>(&header[Layout::SIZE], Ringlog::HEADER_SIZE);
    putLittleEndian<uint32_t>(&header[Layout::UID], uid);
    memcpy(&header[Layout::NAME], name.c_str(), std::min(name.size(), Layout::NAME_SIZE));
    return header;
}

class RingSink final : public SerializableEventSink {
public:
    explicit RingSink(RingBuffer<SerializableEvent>& ring) : mRing(ring) {}
    void add(const SerializableEvent& record) override { mRing.push(record); }

private:
    RingBuffer<SerializableEvent>& mRing;
};

}  // namespace

// The ring's array is value-initialised, so it is zero-filled (and its pages touched) here rather
// than on the first events.
Ringlog::Ringlog(String8& name, const InterpolationMode& mode, const unsigned int& uid)
    : mName(name), mHeader(makeHeader(name, mode, uid)), mRing(NUM_EVENTS) {}

uint32_t Ringlog::uid() const {
    uint32_t uid = 0;
    for (size_t i = 0; i < sizeof(uid); i++)
        uid |= static_cast<uint32_t>(mHeader[Layout::UID + i]) << (8 * i);
    return uid;
}

void Ringlog::onFirstRef() {
    EventDispatcher::subscribe(uid(), EventDispatcher::ALL_EVENTS, this);
}

void Ringlog::onLastStrongRef(const void* /*id*/) {
    EventDispatcher::unsubscribe(uid(), EventDispatcher::ALL_EVENTS, this);
}

void Ringlog::onEvent(const EventType& type, const nsecs_t& time, const EventData& data) {
    // All records of one event go in under one lock, so that a reader never sees half of them.
    std::lock_guard lock(mMutex);
    RingSink sink(mRing);
    serializeEvent(type, time, data, sink);
}

void Ringlog::logFrameRepeated() {
    logDirectRecord(FRAME_REPEATED_RECORD, 0);
}

void Ringlog::logBackpressure() {
    logDirectRecord(BACKPRESSURE_RECORD, 0);
}

void Ringlog::logGFPSChangedEvent(const int& gfps) {
    logDirectRecord(GFPS_CHANGED_RECORD, gfps);
}

void Ringlog::logDirectRecord(uint32_t type, int32_t value) {
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    std::lock_guard lock(mMutex);
    mRing.push({static_cast<EventType>(type), value, now});
}

void Ringlog::writeToParcel(Parcel& out) {
    const size_t ringBytes = size_t{NUM_EVENTS} * sizeof(SerializableEvent);
    // Grown before the lock, so that the events wait only for the copy.
    const size_t needed = out.dataPosition() + 4 + HEADER_SIZE + 3 * 4 + 4 + ringBytes;
    status_t err = out.setDataCapacity(std::max(out.dataCapacity(), needed));

    std::lock_guard lock(mMutex);
    if (err == NO_ERROR) err = out.writeByteArray(mHeader.size(), mHeader.data());
    if (err == NO_ERROR) err = out.writeUint32(mRing.capacity());
    if (err == NO_ERROR) err = out.writeUint32(mRing.size());
    if (err == NO_ERROR) err = out.writeInt32(mRing.headSlot());
    if (err == NO_ERROR) {
        err = out.writeByteArray(ringBytes, reinterpret_cast<const uint8_t*>(mRing.data()));
    }
    if (err != NO_ERROR) {
        ILOG(1, "[%s] Ringlog::writeToParcel failed with error %d", mName.c_str(), err);
    }
}

}  // namespace android::Interpolation
