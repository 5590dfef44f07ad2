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

using Interpolation::EventDispatcher;
using Interpolation::Settings;
using test::LogCapture;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr nsecs_t MS = 1'000'000;
constexpr nsecs_t SECOND = 1'000'000'000;

Settings settings(bool smartDelay, int32_t gameFps, int32_t delayMs = 64) {
    Settings s;
    s.smartDelay = smartDelay;
    s.gameFpsLimit = gameFps;
    s.delayMs = delayMs;
    return s;
}

class DelayerTest : public testing::Test {
protected:
    DelayerTest() { EventDispatcher::subscribe(mUid, Interpolation::eDelayChangedEvent, mEvents); }
    ~DelayerTest() override {
        mDelayer.clear();
        EventDispatcher::unsubscribe(mUid, Interpolation::eDelayChangedEvent, mEvents);
        Interpolation::defaultDelay.store(mDefaultDelay);
    }

    // Counts `processed` frames, `hits` of them hits, then re-estimates. Each miss is followed by
    // the frames it makes the delayer ignore.
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

    const int32_t mDefaultDelay = Interpolation::defaultDelay.exchange(64);
    const uint32_t mUid = test::nextTestUid();
    sp<test::RecordingReceiver> mEvents = new test::RecordingReceiver();
    sp<Delayer> mDelayer = new Delayer(mUid, String8("game"));
};

TEST_F(DelayerTest, ignoresTheFirstTwentyFramesAndFiveAfterEachMiss) {
    LogCapture log(2);
    for (int i = 0; i < Delayer::IGNORE_AT_START; i++)
        EventDispatcher::broadcastEvent(mUid, Interpolation::eBlendedCompositionEvent, i, 0);
    mDelayer->updateFrameDelayTick();
    EXPECT_THAT(log.texts(),
                ElementsAre("Attempting to update the frame delay with 0 processed frames."));

    // A miss from the bus, then five uncounted frames of every kind.
    EventDispatcher::broadcastEvent(mUid, Interpolation::eNewFrameCompositionEvent, 0, 0);
    for (auto type :
         {Interpolation::eRepeatedCompositionEvent, Interpolation::eNewFrameCompositionEvent,
          Interpolation::eBlendedCompositionEvent})
        EventDispatcher::broadcastEvent(mUid, type, 0, 0);
    mDelayer->processFrame(Delayer::eMiss);
    mDelayer->processFrame(static_cast<Delayer::FrameType>(7));
    log.clear();
    tick(99, 99);  // 99 hits of 100: 0.99 is within 0.991 +- 0.008
    mDelayer->onEvent(Interpolation::eFrameReceivedEvent, 0, 0);
    EXPECT_THAT(log.texts(),
                ElementsAre("Interpolation rate is on target (0.990000), keeping delay at 64ms",
                            "Delayer::onEvent EventType 1 not handled"));
    EXPECT_THAT(announced(), ElementsAre(64 * MS));
}

TEST_F(DelayerTest, firstMoveAndReversalsTakeHalfAStepRepeatsTheFullOneUpToTheLimits) {
    tick(Delayer::IGNORE_AT_START, Delayer::IGNORE_AT_START);  // all ignored
    LogCapture log(2);
    tick(100, 90);
    tick(100, 90);
    tick(100, 100);  // a reversal
    tick(100, 100);
    tick(100, 99);  // on target resets the direction
    tick(100, 90);
    mDelayer->setDelayNs(100 * MS);
    tick(100, 90);
    mDelayer->setDelayNs(30 * MS + 999'999);  // kept in whole milliseconds
    tick(100, 100);
    EXPECT_THAT(
            log.texts(),
            ElementsAre("Interpolation rate too low (0.900000), increasing delay by 1ms to 65ms",
                        "Interpolation rate too low (0.900000), increasing delay by 2ms to 67ms",
                        "Interpolation rate is high (1.000000), decreasing delay by 1ms to 66ms",
                        "Interpolation rate is high (1.000000), decreasing delay by 2ms to 64ms",
                        "Interpolation rate is on target (0.990000), keeping delay at 64ms",
                        "Interpolation rate too low (0.900000), increasing delay by 1ms to 65ms",
                        "Interpolation rate too low (0.900000), but delay is already at max "
                        "(100ms)!",
                        "Interpolation rate too high (1.000000), but delay is already at min "
                        "(30ms)!"));
    EXPECT_THAT(announced(), ElementsAre(65 * MS, 67 * MS, 66 * MS, 64 * MS, 64 * MS, 65 * MS,
                                         100 * MS, 30 * MS));
}

TEST_F(DelayerTest, clampsOnlyWhileAutomaticDelayIsOn) {
    test::TestClock clock(7 * SECOND);
    mDelayer->onSettingsChanged(settings(true, 0));  // on, with no game FPS yet
    LogCapture log(1);
    mDelayer->setDelayNs(120 * MS);
    mDelayer->setDelayNs(25 * MS + 500'000);
    mDelayer->setDelayNs(46 * MS - 1);
    // Still on while these apply: without a game FPS they set no delay.
    mDelayer->onSettingsChanged(settings(false, 0, 45));
    mDelayer->setDelayNs(120 * MS);
    EXPECT_THAT(log.texts(), ElementsAre("Trying to set delay too high (120ms), clamping to 100ms",
                                         "Trying to set delay too low (25ms), clamping to 30ms"));
    EXPECT_THAT(announced(), ElementsAre(100 * MS, 30 * MS, 45 * MS, 120 * MS));
    EXPECT_EQ(7 * SECOND, mEvents->events()[0].time);

    String8 dump("x");
    mDelayer->dumpState(dump, "  ");
    EXPECT_STREQ("x  Delay=120ms\n", dump.c_str());
}

TEST_F(DelayerTest, gameFpsSetsAColdStartDelayAndThenRescalesIt) {
    LogCapture log(2);
    // Automatic delay is off until the first settings arrive, so their game FPS is not used yet.
    mDelayer->onSettingsChanged(settings(true, 60));
    EXPECT_THAT(log.texts(),
                ElementsAre("Delayer: Delay calculated every 5.000000s",
                            "Delayer: AutoDelay enabled yes", "Delayer: Hit target 0.991000",
                            "Delayer: Hit Threshold 0.008000", "Delayer: Delay change rate 2ms"));
    EXPECT_THAT(announced(), IsEmpty());

    EXPECT_EQ(33'333'333, mDelayer->getExpectedDelay(16'666'666));
    mDelayer->onSettingsChanged(settings(true, 60));
    EXPECT_EQ("Cold start auto-delay: 33333333", log.texts()[5]);
    mDelayer->onSettingsChanged(settings(true, 60));  // unchanged
    mDelayer->onSettingsChanged(settings(true, 0));   // no target
    mDelayer->onSettingsChanged(settings(true, 30));  // 33 ms * 46,666,666 / 33,333,333
    mDelayer->onSettingsChanged(settings(true, 5));   // 46 ms * 180 / 46.67 = 177 ms
    EXPECT_THAT(announced(), ElementsAre(33 * MS, 46 * MS, 100 * MS));

    mDelayer->onSettingsChanged(settings(false, 0, 120));  // only switches it off
    mEvents->clear();
    log.clear();
    for (int32_t delayMs : {120, 120, 40})
        mDelayer->onSettingsChanged(settings(false, 0, delayMs));
    EXPECT_EQ(1, log.count("Delayer: Delay 120ms"));
    EXPECT_EQ(1, log.count("Delayer: Delay 40ms"));
    EXPECT_EQ(3, log.count("Delayer: AutoDelay enabled no"));
    EXPECT_THAT(announced(), ElementsAre(120 * MS, 40 * MS));
}

TEST_F(DelayerTest, updateTimerFollowsThePeriodAndStopsWithAutomaticDelay) {
    test::TestClock clock(10 * SECOND);
    sp<Delayer> delayer = new Delayer(test::nextTestUid(), String8("timed"));
    LogCapture log(1);
    auto ticksAt = [&](nsecs_t now) {
        clock.set(now);
        delayer->pollUpdateTimer();
        return log.count("Attempting to update the frame delay with 0 processed frames.");
    };
    Settings s = settings(true, 0);
    s.delayUpdatePeriodSec = 2.0f;
    delayer->onSettingsChanged(s);  // re-armed: due after 12 s
    EXPECT_EQ(0, ticksAt(12 * SECOND));
    EXPECT_EQ(1, ticksAt(12 * SECOND + 1));
    // Next due at 14 s; one second more of period moves it to 15 s.
    s.delayUpdatePeriodSec = 3.0f;
    delayer->onSettingsChanged(s);
    EXPECT_EQ(1, ticksAt(15 * SECOND));
    EXPECT_EQ(2, ticksAt(100 * SECOND));  // once per poll, however late
    s.smartDelay = false;
    delayer->onSettingsChanged(s);
    EXPECT_EQ(2, ticksAt(1000 * SECOND));
}

}  // namespace
}  // namespace android
