#include <limits>
#include <memory>

#include <binder/Parcel.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "RetimeRenderStateBuilder.h"
#include "Settings.h"
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
constexpr uint32_t KINDS = BLEND | REPEAT | NEW;

Settings withCurve(std::vector<float> points, bool bound) {
    Settings settings;
    settings.alphaFunction = Function(std::move(points), bound);
    return settings;
}

class RetimeRenderStateBuilderTest : public testing::Test {
protected:
    RetimeRenderStateBuilderTest() { EventDispatcher::subscribe(mUid, KINDS, mKinds); }
    ~RetimeRenderStateBuilderTest() override { EventDispatcher::unsubscribe(mUid, KINDS, mKinds); }

    void queue(nsecs_t id, bool acquired = true, sp<Fence> fence = Fence::NO_FENCE) {
        mList->insertFrame(makeFrame(id, acquired, fence));
    }

    // Composes at t and unlocks the state's frames; the kind announced is left in mKinds.
    RenderState compose(nsecs_t t) {
        mKinds->clear();
        RenderState state = mBuilder->lockStateFor(t);
        for (const RenderItem& item : state.items)
            mList->unlock(item.frame.mID);
        return state;
    }

    static std::vector<nsecs_t> idsOf(const RenderState& state) {
        std::vector<nsecs_t> ids;
        for (const RenderItem& item : state.items)
            ids.push_back(item.frame.mID);
        return ids;
    }

    const uint32_t mUid = test::nextTestUid();
    String8 mName{"game#3"};
    sp<FrameList> mList = new FrameList(mUid);
    sp<RetimeRenderStateBuilder> mBuilder = new RetimeRenderStateBuilder(mName, mUid, mList);
    sp<RecordingReceiver> mKinds = new RecordingReceiver();
};

TEST_F(RetimeRenderStateBuilderTest, blendsTheNeighboursWithTheCurveOfTheLayersSettings) {
    // Until its settings arrive the builder's curve is empty, which is the identity.
    queue(1000);
    queue(2000);
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
    EXPECT_THAT(mKinds->types(), ElementsAre(BLEND));
    EXPECT_EQ(1.0f, state.items[0].alpha);
    EXPECT_EQ(0u, state.items[0].blend);
    EXPECT_EQ(0.5f, state.items[1].alpha);
    EXPECT_EQ(1u, state.items[1].blend);
    EXPECT_TRUE(
            log.contains("Interpolation::RetimeRenderStateBuilder [game#3] getFramesFor: "
                         "Retime interpolating with alpha 0.500000"));

    EXPECT_THAT(idsOf(compose(1900)), ElementsAre(2000));  // alpha 1: only the later frame
    EXPECT_THAT(mKinds->types(), ElementsAre(BLEND));
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

TEST_F(RetimeRenderStateBuilderTest, alphaZeroShowsTheEarlierFrameAloneOnlyOnce) {
    queue(1000);
    queue(2000);
    EXPECT_THAT(idsOf(compose(1000)), ElementsAre(1000));
    EXPECT_THAT(mKinds->types(), ElementsAre(BLEND));
    // The earlier frame is the last picture now: the later one joins it at alpha 0.
    RenderState again = compose(1000);
    EXPECT_THAT(idsOf(again), ElementsAre(1000, 2000));
    EXPECT_EQ(0.0f, again.items[1].alpha);
    EXPECT_EQ(1u, again.items[1].blend);
}

TEST_F(RetimeRenderStateBuilderTest, showsTheOneUsableNeighbour) {
    queue(1000);
    queue(2000, /*acquired=*/false, Fence::createPending());
    EXPECT_THAT(idsOf(compose(1500)), ElementsAre(1000));  // the later frame is not ready
    EXPECT_THAT(mKinds->types(), ElementsAre(NEW));
    EXPECT_THAT(idsOf(compose(1600)), ElementsAre(1000));
    EXPECT_THAT(mKinds->types(), ElementsAre(REPEAT));

    EXPECT_THAT(idsOf(compose(500)), ElementsAre(1000));  // nothing before the display time
    EXPECT_THAT(mKinds->types(), ElementsAre(NEW));
}

TEST_F(RetimeRenderStateBuilderTest, fallsBackToTheLastPictureThenTheNewestValidFrame) {
    queue(10);
    EXPECT_THAT(idsOf(compose(15)), ElementsAre(10));
    // Two unready frames in front: the look-ups around the display time find nothing usable.
    queue(5, /*acquired=*/false, Fence::createPending());
    queue(7, /*acquired=*/false, Fence::createPending());
    EXPECT_THAT(idsOf(compose(20)), ElementsAre(10));
    EXPECT_THAT(mKinds->types(), ElementsAre(REPEAT));

    mList->clearFrameAtLocking(10);
    queue(30, /*acquired=*/false, Fence::createSignalled(1));
    EXPECT_THAT(idsOf(compose(20)), ElementsAre(30));
    EXPECT_THAT(mKinds->types(), ElementsAre(REPEAT));

    mList->clearFrameAtLocking(30);
    LogCapture log(1);
    EXPECT_THAT(compose(20).items, IsEmpty());
    EXPECT_THAT(mKinds->types(), ElementsAre(REPEAT));
    EXPECT_TRUE(log.contains("Interpolation::RetimeRenderStateBuilder [game#3]: no valid frame!"));
}

TEST_F(RetimeRenderStateBuilderTest, buildSeesOneWholeCurveWhileSettingsChange) {
    // Two curves with different values at x = 0.5: any third alpha is a torn read.
    const Settings low = withCurve({0.0f, 0.1f, 1.0f, 0.2f}, false);
    const Settings high =
            withCurve({0.0f, 0.0f, 0.25f, 0.9f, 0.5f, 0.9f, 0.75f, 0.9f, 1.0f, 1.0f}, false);
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
