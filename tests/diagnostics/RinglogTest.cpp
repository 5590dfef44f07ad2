#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <limits>
#include <memory>

#include <binder/Parcel.h>

#include <algorithm>
#include <atomic>
#include <cstring>
#include <ctime>
#include <thread>

#include "LogOutput.h"
#include "Ringlog.h"
#include "support/Frames.h"
#include "support/LogCapture.h"

namespace android::Interpolation {
namespace {

using testing::ElementsAre;
using testing::FieldsAre;
using testing::Ge;

constexpr size_t RING_BYTES = size_t{Ringlog::NUM_EVENTS} * 16;

template <typename T>
T at(const Parcel& parcel, size_t offset) {
    T value;
    memcpy(&value, parcel.data() + offset, sizeof(T));
    return value;
}

template <typename T>
void put(std::vector<uint8_t>& bytes, size_t offset, T value) {
    memcpy(bytes.data() + offset, &value, sizeof(T));
}

// The ring's slots straight from a parcel: after the header's 4 + 184 bytes, capacity, count and
// newest index, the ring's length word.
struct RingView {
    explicit RingView(const Parcel& parcel) : parcel(parcel) {}
    uint32_t count() const { return at<uint32_t>(parcel, 192); }
    int32_t newest() const { return at<int32_t>(parcel, 196); }
    SerializableEvent slot(size_t i) const { return at<SerializableEvent>(parcel, 204 + 16 * i); }
    const Parcel& parcel;
};

TEST(RinglogTest, freshRingWritesItsHeaderAndTheWholeZeroRing) {
    for (const std::string& name : {std::string("game"), std::string(70, 'x') + "tail"}) {
        String8 layer(name.c_str());
        const int64_t before = time(nullptr);
        sp<Ringlog> ring = new Ringlog(layer, eJustInTimeMode, 4321);
        const int64_t after = time(nullptr);
        Parcel parcel;
        ring->writeToParcel(parcel);

        ASSERT_EQ(4 + 184 + 3 * 4 + 4 + RING_BYTES, parcel.dataSize());
        std::vector<uint8_t> expected(184, 0);
        put<int64_t>(expected, 8, 6);
        put<uint32_t>(expected, 16, 1);
        put<uint32_t>(expected, 20, 5);
        put<uint32_t>(expected, 24, 39);
        put<uint32_t>(expected, 28, 3);
        memcpy(expected.data() + 32, INTERPOLATION_CHECKSUM, 64);
        const auto created = at<int64_t>(parcel, 4 + 96);
        EXPECT_TRUE(created >= before && created <= after) << created;
        put<int64_t>(expected, 96, created);
        put<int64_t>(expected, 104, 184);
        put<uint32_t>(expected, 112, 4321);
        memcpy(expected.data() + 116, name.data(), std::min<size_t>(name.size(), 64));
        EXPECT_EQ(184, at<int32_t>(parcel, 0));
        EXPECT_EQ(expected, std::vector<uint8_t>(parcel.data() + 4, parcel.data() + 188));

        EXPECT_EQ(Ringlog::NUM_EVENTS, at<uint32_t>(parcel, 188));
        EXPECT_EQ(0u, RingView(parcel).count());
        EXPECT_EQ(-1, RingView(parcel).newest());
        EXPECT_EQ(static_cast<int32_t>(RING_BYTES), at<int32_t>(parcel, 200));
        const uint8_t* ringBytes = parcel.data() + 204;
        EXPECT_TRUE(
                std::all_of(ringBytes, ringBytes + RING_BYTES, [](uint8_t b) { return b == 0; }));
    }
}

TEST(RinglogTest, directRecordsWrapAfterTheCapacity) {
    String8 layer("game");
    sp<Ringlog> ring = new Ringlog(layer, eRetimeMode, test::nextTestUid());
    const nsecs_t before = systemTime(SYSTEM_TIME_MONOTONIC);
    ring->logFrameRepeated();
    ring->logBackpressure();
    for (int gfps = 2; gfps <= static_cast<int>(Ringlog::NUM_EVENTS); gfps++)
        ring->logGFPSChangedEvent(gfps);  // the 62,488th record overwrites the first
    Parcel parcel;
    ring->writeToParcel(parcel);
    const RingView view(parcel);
    EXPECT_EQ(std::make_tuple(Ringlog::NUM_EVENTS, 0), std::make_tuple(view.count(), view.newest()));
    EXPECT_THAT((std::vector{view.slot(0), view.slot(1), view.slot(2)}),
                ElementsAre(FieldsAre(0x4000u, 62487, Ge(before)),
                            FieldsAre(0x8000u, 0, Ge(before)),  // now the oldest
                            FieldsAre(0x4000u, 2, Ge(before))));
}

TEST(RinglogTest, recordsEveryEventOfItsUidWithAllOfAnEventsRecordsAtOnce) {
    const uint32_t uid = test::nextTestUid();
    String8 layer("game");
    sp<Ringlog> ring = new Ringlog(layer, eRetimeMode, uid);
    RenderState pair;
    pair.items = {{test::makeFrame(1), 1.0f, 0}, {test::makeFrame(66), 0.5f, 1}};
    EventDispatcher::broadcastEvent(uid, eBufferComposedEvent, 7, pair);
    Parcel parcel;
    ring->writeToParcel(parcel);
    EXPECT_EQ(2u, RingView(parcel).count());
    EXPECT_THAT((std::vector{RingView(parcel).slot(0), RingView(parcel).slot(1)}),
                ElementsAre(FieldsAre(0x100000u, 1, 7), FieldsAre(0x100000u, 2, 7)));

    // A reader never sees part of an event: with a thousand items per state, a lock per record
    // would let some of the snapshots below land inside one. Only the last item has slot 2.
    RenderState large;
    large.items.assign(999, {test::makeFrame(1), 1.0f, 0});
    large.items.push_back({test::makeFrame(2), 1.0f, 0});
    std::atomic<bool> stop{false};
    std::thread composer([&] {
        for (nsecs_t t = 0; !stop; t++)
            EventDispatcher::broadcastEvent(uid, eBufferComposedEvent, t, large);
    });
    int torn = 0;
    for (int i = 0; i < 2000; i++) {
        Parcel snapshot;
        ring->writeToParcel(snapshot);
        const RingView view(snapshot);
        if (view.slot(view.newest()).value != 2) torn++;
    }
    stop = true;
    composer.join();
    EXPECT_EQ(0, torn);

    // Unsubscribed with its last reference: the uid has no subscriber left.
    ring.clear();
    test::LogCapture log(1);
    EventDispatcher::broadcastEvent(uid, eRepeatedCompositionEvent, 0, 0);
    EXPECT_THAT(log.texts(),
                ElementsAre("EventDispatcher::broadcastEventLocked no subscribers for uid " +
                            std::to_string(uid)));
}

}  // namespace
}  // namespace android::Interpolation
