#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "Delayer.h"
#include "Tunables.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"
#include "support/TestClock.h"

namespace android {
namespace {

using namespace Interpolation;
using test::LogCapture;
using testing::ElementsAre;

constexpr nsecs_t MS = 1'000'000, SECOND = 1000 * MS;

class DelayerTest : public testing::Test {
protected:
    DelayerTest() { EventDispatcher::subscribe(mUid, eDelayChangedEvent, mEvents); }
    ~DelayerTest() override { defaultDelay.store(mDefaultDelay); }

    void apply(bool smartDelay, int32_t gameFps, int32_t delayMs = 64) {
        Settings s;
        s.smartDelay = smartDelay;
        s.gameFpsLimit = gameFps;
        s.delayMs = delayMs;
        s.delayUpdatePeriodSec = mPeriodSec;
        mDelayer->onSettingsChanged(s);
    }

    // Counts `processed` frames, `hits` of them hits, each miss followed by the frames it ignores.
    void tick(int processed, int hits) {
        for (int i = 0; i < processed; i++) {
            mDelayer->processFrame(i < hits ? Delayer::eHit : Delayer::eMiss);
            for (int j = 0; i >= hits && j < Delayer::IGNORE_AFTER_MISS; j++)
                mDelayer->processFrame(Delayer::eHit);
        }
        mDelayer->updateFrameDelayTick();
    }

    std::vector<nsecs_t> announced() const {
        std::vector<nsecs_t> delays;
        for (const auto& event : mEvents->events())
            delays.push_back(std::get<nsecs_t>(event.data));
        return delays;
    }

    float mPeriodSec = 5;
    const int32_t mDefaultDelay = defaultDelay.exchange(64);
    test::TestClock mClock;
    const uint32_t mUid = test::nextTestUid();
    sp<test::RecordingReceiver> mEvents = new test::RecordingReceiver();
    sp<Delayer> mDelayer = new Delayer(mUid, String8("game"));
};

TEST_F(DelayerTest, countsPastIgnoredFramesAndStepsByHalfThenFullUpToTheLimits) {
    LogCapture log(2);
    for (int i = 0; i < Delayer::IGNORE_AT_START; i++)
        EventDispatcher::broadcastEvent(mUid, eBlendedCompositionEvent, i, 0);
    mDelayer->updateFrameDelayTick();
    tick(100, 90);
    tick(100, 90);
    // A miss from the bus, then five ignored frames of every kind: 99 hits of 100 are on target.
    for (auto type : {eNewFrameCompositionEvent, eRepeatedCompositionEvent,
                      eNewFrameCompositionEvent, eBlendedCompositionEvent})
        EventDispatcher::broadcastEvent(mUid, type, 0, 0);
    mDelayer->processFrame(Delayer::eMiss);
    mDelayer->processFrame(static_cast<Delayer::FrameType>(7));
    tick(99, 99);
    mDelayer->onEvent(eFrameReceivedEvent, 0, 0);
    tick(100, 90);  // on target reset the direction
    tick(100, 100);
    tick(100, 100);
    mDelayer->setDelayNs(100 * MS);
    tick(100, 90);
    mDelayer->setDelayNs(30 * MS + 999'999);  // kept in whole milliseconds
    tick(100, 100);
    const std::vector<std::string> logged = {
            "Attempting to update the frame delay with 0 processed frames.",
            "Interpolation rate too low (0.900000), increasing delay by 1ms to 65ms",
            "Interpolation rate too low (0.900000), increasing delay by 2ms to 67ms",
            "Interpolation rate is on target (0.990000), keeping delay at 67ms",
            "Delayer::onEvent EventType 1 not handled",
            "Interpolation rate too low (0.900000), increasing delay by 1ms to 68ms",
            "Interpolation rate is high (1.000000), decreasing delay by 1ms to 67ms",
            "Interpolation rate is high (1.000000), decreasing delay by 2ms to 65ms",
            "Interpolation rate too low (0.900000), but delay is already at max (100ms)!",
            "Interpolation rate too high (1.000000), but delay is already at min (30ms)!"};
    EXPECT_EQ(logged, log.texts());
    EXPECT_THAT(announced(), ElementsAre(65 * MS, 67 * MS, 67 * MS, 68 * MS, 67 * MS, 65 * MS,
                                         100 * MS, 30 * MS));
}

TEST_F(DelayerTest, settingsRescaleTheDelayByGameFpsAndTimeTheUpdatesWhileAutomatic) {
    LogCapture log(2);
    auto ticksAt = [&](nsecs_t now) {
        mClock.set(now);
        mDelayer->pollUpdateTimer();
        return log.count("Attempting to update the frame delay with 0 processed frames.");
    };
    mClock.set(10 * SECOND);
    mPeriodSec = 2;
    apply(true, 60);  // automatic delay goes on, so this FPS waits; the update is due after 12 s
    EXPECT_THAT(log.texts(),
                ElementsAre("Delayer: Delay calculated every 2.000000s",
                            "Delayer: AutoDelay enabled yes", "Delayer: Hit target 0.991000",
                            "Delayer: Hit Threshold 0.008000", "Delayer: Delay change rate 2ms"));
    EXPECT_EQ(0, ticksAt(12 * SECOND));
    EXPECT_EQ(1, ticksAt(12 * SECOND + 1));
    mPeriodSec = 3;
    apply(true, 60);  // one second more of period moves the next update from 14 s to 15 s
    EXPECT_EQ("Cold start auto-delay: 33333333", log.texts()[6]);
    EXPECT_EQ(1, ticksAt(15 * SECOND));
    EXPECT_EQ(2, ticksAt(100 * SECOND));  // once per poll, however late
    apply(true, 60);                      // unchanged
    apply(true, 0);                       // no target
    apply(true, 30);                      // 33 ms * 46,666,666 / 33,333,333
    log.clear();
    logLevel = 1;
    apply(true, 5);  // 46 ms * 180 / 46.67
    mDelayer->setDelayNs(25 * MS + 500'000);
    mDelayer->setDelayNs(46 * MS - 1);
    EXPECT_THAT(log.texts(), ElementsAre("Trying to set delay too high (177ms), clamping to 100ms",
                                         "Trying to set delay too low (25ms), clamping to 30ms"));
    EXPECT_THAT(announced(), ElementsAre(33 * MS, 46 * MS, 100 * MS, 30 * MS, 45 * MS));
    EXPECT_EQ(100 * SECOND, mEvents->events()[2].time);

    apply(false, 0, 120);                  // only switches it off, and the updates
    EXPECT_EQ(0, ticksAt(1000 * SECOND));  // the log was cleared since the last update
    mEvents->clear();
    logLevel = 2;
    for (int32_t delayMs : {120, 120, 40})
        apply(false, 0, delayMs);
    EXPECT_EQ(1, log.count("Delayer: Delay 120ms"));
    EXPECT_EQ(1, log.count("Delayer: Delay 40ms"));
    EXPECT_EQ(3, log.count("Delayer: AutoDelay enabled no"));
    mDelayer->setDelayNs(120 * MS);
    EXPECT_THAT(announced(), ElementsAre(120 * MS, 40 * MS, 120 * MS));
    String8 dump("x");
    mDelayer->dumpState(dump, "  ");
    EXPECT_STREQ("x  Delay=120ms\n", dump.c_str());
}

}  // namespace
}  // namespace android
