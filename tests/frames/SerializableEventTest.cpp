#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <tuple>

#include "SerializableEvent.h"
#include "support/Frames.h"
#include "support/LogCapture.h"

namespace android::Interpolation {
namespace {

using Record = std::tuple<uint32_t, int32_t, nsecs_t>;  // type, value, time

struct Case {
    uint32_t type;
    EventData data;
    std::vector<Record> records;
    std::string message;  // logged at level 2, or at level 1 for an unknown type
};

RenderState stateOf(std::initializer_list<nsecs_t> ids) {
    RenderState state;
    for (nsecs_t id : ids)
        state.items.push_back({test::makeFrame(id), 1.0f, 0});
    return state;
}

TEST(SerializableEventTest, flattensEveryTypeAsTheLogFormatSays) {
    constexpr nsecs_t T = 1'000;
    const FrameItem frame = test::makeFrame(70'005);  // slot 70005 % 64 = 53, mID 70005
    const std::string no = "make_serializable ";
    const std::vector<Case> cases = {
            {eFrameReceivedEvent, frame, {{1, 53, T}}, ""},
            {eFrameReleasedEvent, 3, {}, no + "eFrameReleasedEvent received with no FrameItem data"},
            {eFrameListSizeChangedEvent, 3, {{4, 3, T}}, ""},
            {eFrameListSizeChangedEvent,
             true,
             {},
             no + "eFrameListSizeChangedEvent received with no integer data"},
            {eBlendedCompositionEvent, 3, {{8, 0, T}}, ""},
            {eBlendedCompositionEvent, stateOf({5, 6}), {{8, 0, T}}, ""},
            {eBlendedCompositionEvent, stateOf({5}), {{64, 0, T}}, ""},
            {eBlendedCompositionEvent, RenderState{}, {{64, 0, T}}, ""},
            {eRepeatedCompositionEvent, frame, {{16, 0, T}}, ""},
            {eNewFrameCompositionEvent, true, {{64, 0, T}}, ""},
            {ePresentationRefusedEvent, 0, {{0x20000, 0, T}}, ""},
            {eDelayChangedEvent, nsecs_t{-1'500'000}, {{32, -1, T}}, ""},
            {eDelayChangedEvent, nsecs_t{999'999}, {{32, 0, T}}, ""},
            {eDelayChangedEvent, 40, {}, no + "eDelayChangedEvent contained no nsecs_t data"},
            {eBufferRequestedEvent, 7, {{0x80, 7, T}}, ""},
            {eBufferReleasedEvent, frame, {}, no + "eBufferReleasedEvent contained no integer data"},
            {eFrameDesiredEvent, frame, {{0x800, 53, 70'005}}, ""},
            {eRealFPSChangedEvent, 29, {{0x2000, 29, T}}, ""},
            {eBufferComposedEvent, stateOf({1, 66}), {{0x100000, 1, T}, {0x100000, 2, T}}, ""},
            {eBufferComposedEvent, RenderState{}, {}, ""},
            {eBufferComposedEvent, 1, {}, no + "eBufferComposedEvent contained no RenderState data"},
            {eCompositionEstimateEvent, nsecs_t{777}, {{0x200000, 0, 777}}, ""},
            {eReleaseDelayed, nsecs_t{0x1'8000'0005}, {{0x400000, INT32_MIN + 5, T}}, ""},
            {eClientCompositionExceptionCheck, true, {{0x800000, 1, T}}, ""},
            {eClientCompositionExceptionCheck,
             1,
             {},
             no + "eClientCompositionExceptionCheck contained no boolean data"},
            {0, 0, {}, no + "EventType 0 not handled"},
            {0x4000, 0, {}, no + "EventType 16384 not handled"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(testing::Message() << "type " << c.type << ", alternative " << c.data.index());
        const bool unknown = c.message.find("not handled") != std::string::npos;
        for (int level : {1, 2}) {
            test::LogCapture log(level);
            std::vector<Record> records;
            for (const SerializableEvent& r : make_serializable(EventType(c.type), T, c.data))
                records.emplace_back(r.type, r.value, r.time);
            EXPECT_EQ(c.records, records);
            const bool logged = !c.message.empty() && (level == 2 || unknown);
            EXPECT_EQ(logged ? std::vector<std::string>{c.message} : std::vector<std::string>{},
                      log.texts());
        }
    }
}

}  // namespace
}  // namespace android::Interpolation
