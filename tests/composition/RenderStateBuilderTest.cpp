#include <android/log.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <limits>

#include "FillInRenderStateBuilder.h"
#include "MirrorSurfaceFlingerRenderState.h"
#include "NoInterpRenderStateBuilder.h"
#include "RetimeRenderStateBuilder.h"
#include "UnlimitedRenderStateBuilder.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"

namespace android::Interpolation {
namespace {

using test::LogCapture;
using test::makeFrame;
using test::RecordingReceiver;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr uint32_t BLEND = eBlendedCompositionEvent;
constexpr uint32_t REPEAT = eRepeatedCompositionEvent;
constexpr uint32_t NEW = eNewFrameCompositionEvent;
constexpr uint32_t COMPOSED = eBufferComposedEvent;

std::vector<nsecs_t> idsOf(const RenderState& state) {
    std::vector<nsecs_t> ids;
    for (const RenderItem& item : state.items)
        ids.push_back(item.frame.mID);
    return ids;
}

class RenderStateBuilderTest : public testing::Test {
protected:
    RenderStateBuilderTest() {
        EventDispatcher::subscribe(mUid, BLEND | REPEAT | NEW | COMPOSED, mEvents);
    }
    ~RenderStateBuilderTest() override {
        EventDispatcher::unsubscribe(mUid, EventDispatcher::ALL_EVENTS, mEvents);
    }

    sp<RenderStateBuilder> builder(uint32_t mode) {
        return RenderStateBuilder::newBuilderFromMode(mName, mUid, mList,
                                                      static_cast<InterpolationMode>(mode));
    }

    void queue(nsecs_t id, bool acquired = true, sp<Fence> fence = Fence::NO_FENCE) {
        mList->insertFrame(makeFrame(id, acquired, fence));
    }

    // Composes at `t` and unlocks what the state held, as a host does; returns the state and
    // leaves the kind event it caused in mKinds.
    RenderState compose(const sp<RenderStateBuilder>& builder, nsecs_t t = 0) {
        mEvents->clear();
        RenderState state = builder->lockStateFor(t);
        for (const RenderItem& item : state.items)
            mList->unlock(item.frame.mID);
        return state;
    }

    const uint32_t mUid = test::nextTestUid();
    String8 mName{"game#1"};
    sp<FrameList> mList = new FrameList(mUid);
    sp<RecordingReceiver> mEvents = new RecordingReceiver();
};

TEST_F(RenderStateBuilderTest, factoryMapsModesToBuilders) {
    EXPECT_NE(nullptr, dynamic_cast<RetimeRenderStateBuilder*>(builder(0).get()));
    EXPECT_NE(nullptr, dynamic_cast<FillInRenderStateBuilder*>(builder(1).get()));
    for (uint32_t mode : {2, 3, 5}) {
        EXPECT_NE(nullptr, dynamic_cast<MirrorSurfaceFlingerRenderState*>(builder(mode).get()));
    }
    EXPECT_NE(nullptr, dynamic_cast<UnlimitedRenderStateBuilder*>(builder(4).get()));
    EXPECT_NE(nullptr, dynamic_cast<RetimeRenderStateBuilder*>(builder(6).get()));
    EXPECT_NE(nullptr, dynamic_cast<RetimeRenderStateBuilder*>(builder(UINT32_MAX).get()));
}

TEST_F(RenderStateBuilderTest, announcesTheKindThenTheComposedStateAndLocksItsFrames) {
    sp<RenderStateBuilder> mirror = builder(2);
    queue(10);
    LogCapture log(2);
    RenderState state = mirror->lockStateFor(123);

    const auto events = mEvents->events();
    ASSERT_EQ(2u, events.size());
    EXPECT_EQ(NEW, events[0].type);
    EXPECT_EQ(COMPOSED, events[1].type);
    EXPECT_THAT(idsOf(std::get<RenderState>(events[1].data)), ElementsAre(10));
    EXPECT_EQ(1.0f, std::get<RenderState>(events[1].data).items[0].alpha);
    EXPECT_THAT(idsOf(state), ElementsAre(10));
    EXPECT_TRUE(log.contains("RenderStateBuilder::lockStateFor [game#1] uid " +
                             std::to_string(mUid) + " displayTime 123"));
    log.clear();
    mList->unlock(10);
    EXPECT_THAT(log.texts(), ElementsAre("FrameList::unlock unlocking 10"));
}

TEST_F(RenderStateBuilderTest, emptyStateIsWarnedAboutAtAnyLogLevelAndStillAnnounced) {
    sp<RenderStateBuilder> unlimited = builder(4);
    queue(10, /*acquired=*/false, Fence::createPending());
    LogCapture log(0);
    EXPECT_THAT(compose(unlimited).items, IsEmpty());
    EXPECT_THAT(mEvents->types(), ElementsAre(COMPOSED));  // no kind: nothing was ready
    EXPECT_THAT(std::get<RenderState>(mEvents->events()[0].data).items, IsEmpty());
    const auto lines = log.lines();
    ASSERT_EQ(1u, lines.size());
    EXPECT_EQ(ANDROID_LOG_WARN, lines[0].priority);
    EXPECT_EQ("[game#1] RenderStateBuilder: created RenderState with no frames", lines[0].text);
}

TEST_F(RenderStateBuilderTest, fillInStepsFromTheLastPictureAndBlendsHalfWayToASingleNewFrame) {
    sp<RenderStateBuilder> fillIn = builder(1);
    queue(10);
    queue(15, /*acquired=*/false, Fence::createPending());
    EXPECT_THAT(idsOf(compose(fillIn)), ElementsAre(10));  // L = 0 is not queued: the next frame
    EXPECT_THAT(mEvents->types(), ElementsAre(NEW, COMPOSED));

    EXPECT_THAT(idsOf(compose(fillIn)), ElementsAre(10));  // nothing newer is ready
    EXPECT_THAT(mEvents->types(), ElementsAre(REPEAT, COMPOSED));

    mList->clearEveryFrame();
    queue(10);
    queue(20);  // one new frame: the fill-in blend
    RenderState blend = compose(fillIn);
    EXPECT_THAT(idsOf(blend), ElementsAre(10, 20));
    EXPECT_THAT(mEvents->types(), ElementsAre(BLEND, COMPOSED));
    EXPECT_EQ(1.0f, blend.items[0].alpha);
    EXPECT_EQ(0u, blend.items[0].blend);
    EXPECT_EQ(0.5f, blend.items[1].alpha);
    EXPECT_EQ(1u, blend.items[1].blend);

    queue(15);  // the blend's time is the last picture now
    queue(30);
    EXPECT_THAT(idsOf(compose(fillIn)), ElementsAre(20));  // two newer frames: no blend
    EXPECT_THAT(mEvents->types(), ElementsAre(NEW, COMPOSED));
}

TEST_F(RenderStateBuilderTest, lastPictureTimeTruncatesEachTerm) {
    sp<RenderStateBuilder> fillIn = builder(1);
    queue(5);
    queue(11);
    mEvents->clear();
    compose(fillIn);  // L = 0 is not queued: shows 5
    EXPECT_THAT(idsOf(compose(fillIn)), ElementsAre(5, 11));
    // L is now 5/2 + 11/2 = 7 (not 8): a frame at 7 is the last picture, 11 the next.
    queue(7);
    EXPECT_THAT(idsOf(compose(fillIn)), ElementsAre(7, 11));
}

TEST_F(RenderStateBuilderTest, mirrorShowsTheLatestAcquiredFrameOrTheEmptyFrame) {
    sp<RenderStateBuilder> mirror = builder(3);
    queue(10, /*acquired=*/false, Fence::createSignalled(1));
    RenderState none = compose(mirror);
    ASSERT_EQ(1u, none.items.size());
    EXPECT_EQ(std::numeric_limits<uint64_t>::max(), none.items[0].frame.mIndex);
    EXPECT_EQ(1.0f, none.items[0].alpha);
    EXPECT_THAT(mEvents->types(), ElementsAre(REPEAT, COMPOSED));  // empty frame's mID 0 == L

    queue(20);
    queue(30, /*acquired=*/false);
    EXPECT_THAT(idsOf(compose(mirror)), ElementsAre(20));
    EXPECT_THAT(mEvents->types(), ElementsAre(NEW, COMPOSED));
    EXPECT_THAT(idsOf(compose(mirror)), ElementsAre(20));
    EXPECT_THAT(mEvents->types(), ElementsAre(REPEAT, COMPOSED));
}

TEST_F(RenderStateBuilderTest, unlimitedShowsTheNewestReadyFrame) {
    sp<RenderStateBuilder> unlimited = builder(4);
    queue(10);
    queue(20, /*acquired=*/false, Fence::createSignalled(1));
    EXPECT_THAT(idsOf(compose(unlimited)), ElementsAre(20));
    EXPECT_THAT(idsOf(compose(unlimited)), ElementsAre(20));
    EXPECT_THAT(mEvents->types(), ElementsAre(REPEAT, COMPOSED));
}

TEST_F(RenderStateBuilderTest, noInterpAdvancesOnlyToAcquiredFrames) {
    String8 name("game#2");
    sp<RenderStateBuilder> noInterp = new NoInterpRenderStateBuilder(name, mUid, mList);
    FrameItem first = makeFrame(10, /*acquired=*/false, Fence::createSignalled(1));
    mList->insertFrame(first);  // ready, but not acquired
    EXPECT_THAT(compose(noInterp).items, IsEmpty());
    EXPECT_THAT(mEvents->types(), ElementsAre(NEW, COMPOSED));

    first.mAcquired = true;
    mList->insertFrame(first);
    EXPECT_THAT(idsOf(compose(noInterp)), ElementsAre(10));
    queue(20, /*acquired=*/false, Fence::createSignalled(1));
    EXPECT_THAT(idsOf(compose(noInterp)), ElementsAre(10));  // the last picture again
    EXPECT_THAT(mEvents->types(), ElementsAre(REPEAT, COMPOSED));
}

}  // namespace
}  // namespace android::Interpolation
