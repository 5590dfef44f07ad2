#include <limits>
#include <memory>

#include <android/log.h>
#include <binder/Parcel.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "FillInRenderStateBuilder.h"
#include "MirrorSurfaceFlingerRenderState.h"
#include "NoInterpRenderStateBuilder.h"
#include "RetimeRenderStateBuilder.h"
#include "Settings.h"
#include "UnlimitedRenderStateBuilder.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"

namespace android::Interpolation {
namespace {

using test::LogCapture;
using test::makeFrame;
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
    // leaves the events it caused in mEvents.
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
    sp<test::RecordingReceiver> mEvents = new test::RecordingReceiver();
};

TEST_F(RenderStateBuilderTest, factoryMapsModesToBuilders) {
    EXPECT_NE(nullptr, dynamic_cast<RetimeRenderStateBuilder*>(builder(0).get()));
    EXPECT_NE(nullptr, dynamic_cast<FillInRenderStateBuilder*>(builder(1).get()));
    for (uint32_t mode : {2, 3, 5})
        EXPECT_NE(nullptr, dynamic_cast<MirrorSurfaceFlingerRenderState*>(builder(mode).get()));
    EXPECT_NE(nullptr, dynamic_cast<UnlimitedRenderStateBuilder*>(builder(4).get()));
    EXPECT_NE(nullptr, dynamic_cast<RetimeRenderStateBuilder*>(builder(6).get()));
    EXPECT_NE(nullptr, dynamic_cast<RetimeRenderStateBuilder*>(builder(UINT32_MAX).get()));
}

TEST_F(RenderStateBuilderTest, mirrorShowsTheLatestAcquiredFrameOrTheEmptyFrame) {
    sp<RenderStateBuilder> mirror = builder(3);
    queue(10, /*acquired=*/false, Fence::createSignalled(1));
    RenderState none = compose(mirror);
    ASSERT_EQ(1u, none.items.size());
    EXPECT_EQ(std::numeric_limits<uint64_t>::max(), none.items[0].frame.mIndex);
    EXPECT_EQ(1.0f, none.items[0].alpha);
    EXPECT_THAT(mEvents->types(), ElementsAre(REPEAT, COMPOSED));  // empty frame's mID 0 == L

    // The kind, then the composed state; the state's frame stays locked until the host unlocks it.
    queue(20);
    queue(30, /*acquired=*/false);
    mEvents->clear();
    LogCapture log(2);
    EXPECT_THAT(idsOf(mirror->lockStateFor(123)), ElementsAre(20));
    EXPECT_THAT(mEvents->types(), ElementsAre(NEW, COMPOSED));
    const RenderState composed = std::get<RenderState>(mEvents->events()[1].data);
    EXPECT_THAT(idsOf(composed), ElementsAre(20));
    EXPECT_EQ(1.0f, composed.items[0].alpha);
    mList->unlock(20);
    EXPECT_THAT(log.texts(), ElementsAre("RenderStateBuilder::lockStateFor [game#1] uid " +
                                                 std::to_string(mUid) + " displayTime 123",
                                         "FrameList::unlock unlocking 20"));
    EXPECT_THAT(idsOf(compose(mirror)), ElementsAre(20));
    EXPECT_THAT(mEvents->types(), ElementsAre(REPEAT, COMPOSED));
}

TEST_F(RenderStateBuilderTest, unlimitedShowsTheNewestFrameIfReadyAndWarnsOfAnEmptyState) {
    sp<RenderStateBuilder> unlimited = builder(4);
    queue(10);
    queue(20, /*acquired=*/false, Fence::createPending());
    LogCapture log(0);
    EXPECT_THAT(compose(unlimited).items, IsEmpty());
    EXPECT_THAT(mEvents->types(), ElementsAre(COMPOSED));  // no kind: the newest was not ready
    EXPECT_THAT(std::get<RenderState>(mEvents->events()[0].data).items, IsEmpty());
    const auto lines = log.lines();
    ASSERT_EQ(1u, lines.size());
    EXPECT_EQ(ANDROID_LOG_WARN, lines[0].priority);
    EXPECT_EQ("[game#1] RenderStateBuilder: created RenderState with no frames", lines[0].text);

    queue(30, /*acquired=*/false, Fence::createSignalled(1));
    EXPECT_THAT(idsOf(compose(unlimited)), ElementsAre(30));
    EXPECT_THAT(idsOf(compose(unlimited)), ElementsAre(30));
    EXPECT_THAT(mEvents->types(), ElementsAre(REPEAT, COMPOSED));
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
    compose(fillIn);  // L = 0 is not queued: shows 5
    EXPECT_THAT(idsOf(compose(fillIn)), ElementsAre(5, 11));
    // L is now 5/2 + 11/2 = 7 (not 8): a frame at 7 is the last picture, 11 the next.
    queue(7);
    EXPECT_THAT(idsOf(compose(fillIn)), ElementsAre(7, 11));
}

TEST_F(RenderStateBuilderTest, noInterpAdvancesOnlyToAcquiredFrames) {
    sp<RenderStateBuilder> noInterp = new NoInterpRenderStateBuilder(mName, mUid, mList);
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

class RetimeRenderStateBuilderTest : public RenderStateBuilderTest {
protected:
    RenderState compose(nsecs_t t) { return RenderStateBuilderTest::compose(mBuilder, t); }

    sp<RetimeRenderStateBuilder> mBuilder = new RetimeRenderStateBuilder(mName, mUid, mList);
};

TEST_F(RetimeRenderStateBuilderTest,
       blendsWithTheLayersCurveAndShowsTheEarlierFrameAloneOnceAtAlphaZero) {
    // Until its settings arrive the builder's curve is empty, which is the identity.
    queue(1000);
    queue(2000);
    EXPECT_THAT(idsOf(compose(1000)), ElementsAre(1000));  // alpha 0: the earlier frame alone...
    EXPECT_THAT(mEvents->types(), ElementsAre(BLEND, COMPOSED));
    RenderState again = compose(1000);  // ...only once: then the later one joins it at alpha 0
    EXPECT_THAT(idsOf(again), ElementsAre(1000, 2000));
    EXPECT_EQ(0.0f, again.items[1].alpha);
    EXPECT_EQ(1u, again.items[1].blend);
    EXPECT_FLOAT_EQ(0.3f, compose(1300).items[1].alpha);

    SettingsController* controller = SettingsController::getInstance();
    Parcel noChanges;
    noChanges.writeInt32(0);
    noChanges.setDataPosition(0);
    controller->updateSettings(mUid, noChanges);
    controller->notifyChanges();  // the default curve: 0 until 0.2, 1 from 0.8

    LogCapture log(2);
    RenderState state = compose(1500);
    EXPECT_THAT(idsOf(state), ElementsAre(1000, 2000));
    EXPECT_THAT(mEvents->types(), ElementsAre(BLEND, COMPOSED));
    EXPECT_EQ(1.0f, state.items[0].alpha);
    EXPECT_EQ(0u, state.items[0].blend);
    EXPECT_EQ(0.5f, state.items[1].alpha);
    EXPECT_EQ(1u, state.items[1].blend);
    EXPECT_TRUE(
            log.contains("Interpolation::RetimeRenderStateBuilder [game#1] getFramesFor: "
                         "Retime interpolating with alpha 0.500000"));

    EXPECT_THAT(idsOf(compose(1900)), ElementsAre(2000));  // alpha 1: only the later frame
    EXPECT_THAT(mEvents->types(), ElementsAre(BLEND, COMPOSED));
}

TEST_F(RetimeRenderStateBuilderTest, positionIsComputedInSinglePrecision) {
    // 2^24 / (2^24 + 1) is 1 in single precision: alpha 1 keeps only the later frame, where
    // double precision would blend both.
    const nsecs_t before = 1'000'000'000;
    const nsecs_t after = before + (1 << 24) + 1;
    queue(before);
    queue(after);
    EXPECT_THAT(idsOf(compose(before + (1 << 24))), ElementsAre(after));
}

TEST_F(RetimeRenderStateBuilderTest, showsTheOneUsableNeighbour) {
    queue(1000);
    queue(2000, /*acquired=*/false, Fence::createPending());
    EXPECT_THAT(idsOf(compose(1500)), ElementsAre(1000));  // the later frame is not ready
    EXPECT_THAT(mEvents->types(), ElementsAre(NEW, COMPOSED));
    EXPECT_THAT(idsOf(compose(1600)), ElementsAre(1000));
    EXPECT_THAT(mEvents->types(), ElementsAre(REPEAT, COMPOSED));
    EXPECT_THAT(idsOf(compose(500)), ElementsAre(1000));  // nothing before the display time
    EXPECT_THAT(mEvents->types(), ElementsAre(NEW, COMPOSED));
}

TEST_F(RetimeRenderStateBuilderTest, fallsBackToTheLastPictureThenTheNewestValidFrame) {
    queue(10);
    EXPECT_THAT(idsOf(compose(15)), ElementsAre(10));
    // Two unready frames in front: the look-ups around the display time find nothing usable.
    queue(5, /*acquired=*/false, Fence::createPending());
    queue(7, /*acquired=*/false, Fence::createPending());
    EXPECT_THAT(idsOf(compose(20)), ElementsAre(10));
    EXPECT_THAT(mEvents->types(), ElementsAre(REPEAT, COMPOSED));

    mList->clearFrameAtLocking(10);
    queue(30, /*acquired=*/false, Fence::createSignalled(1));
    EXPECT_THAT(idsOf(compose(20)), ElementsAre(30));
    EXPECT_THAT(mEvents->types(), ElementsAre(REPEAT, COMPOSED));

    mList->clearFrameAtLocking(30);
    LogCapture log(1);
    EXPECT_THAT(compose(20).items, IsEmpty());
    EXPECT_THAT(mEvents->types(), ElementsAre(REPEAT, COMPOSED));
    EXPECT_TRUE(log.contains("Interpolation::RetimeRenderStateBuilder [game#1]: no valid frame!"));
}

TEST_F(RetimeRenderStateBuilderTest, buildSeesOneWholeCurveWhileSettingsChange) {
    // Two curves with different values at x = 0.5: any third alpha is a torn read.
    Settings low, high;
    low.alphaFunction = Function({0.0f, 0.1f, 1.0f, 0.2f}, false);
    high.alphaFunction =
            Function({0.0f, 0.0f, 0.25f, 0.9f, 0.5f, 0.9f, 0.75f, 0.9f, 1.0f, 1.0f}, false);
    queue(1000);
    queue(2000);
    mBuilder->onSettingsChanged(low);
    std::atomic<bool> done{false};
    std::thread settingsThread([&] {
        for (int i = 0; !done; i++)
            mBuilder->onSettingsChanged(i % 2 ? low : high);
    });
    const float lowAlpha = low.alphaFunction.getY(0.5f);
    const float highAlpha = high.alphaFunction.getY(0.5f);
    int torn = 0;
    for (int i = 0; i < 2000; i++) {
        const float alpha = compose(1500).items.at(1).alpha;
        if (alpha != lowAlpha && alpha != highAlpha) torn++;
    }
    done = true;
    settingsThread.join();
    EXPECT_EQ(0, torn);
}

}  // namespace
}  // namespace android::Interpolation
