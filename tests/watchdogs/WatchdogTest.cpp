#include <limits>
#include <memory>

#include <binder/Parcel.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <ctime>

#include "ClientCompositionWatchdog.h"
#include "LatencyReductionWatchdog.h"
#include "PerformanceWatchdog.h"
#include "WatchdogWarningController.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/TestClock.h"

namespace android::Interpolation {
namespace {

using test::LogCapture;
using testing::_;
using testing::ElementsAre;
using testing::IsEmpty;
using Watchdog = PerformanceWatchdog<RealWatchdogInterface>;

constexpr nsecs_t SECOND = 1'000'000'000;

// The parcel's 32-bit words: five per warning (size, code, timestamp low and high, value).
std::vector<uint32_t> fetchWarnings(uint32_t uid) {
    Parcel parcel;
    WatchdogWarningController::writeWarningsToParcel(uid, &parcel);
    std::vector<uint32_t> words(parcel.dataSize() / 4);
    // An empty parcel has no data pointer, which memcpy may not be given even for no bytes.
    if (!words.empty()) std::memcpy(words.data(), parcel.data(), words.size() * 4);
    return words;
}

uint32_t bitsOf(float f) {
    uint32_t bits;
    std::memcpy(&bits, &f, sizeof(bits));
    return bits;
}

Settings limits(int32_t gameFps, int32_t minFps, int32_t maxFps) {
    Settings s;
    s.gameFpsLimit = gameFps;
    s.minAcceptableFps = minFps;
    s.maxAcceptableFps = maxFps;
    return s;
}

class WatchdogTest : public testing::Test {
protected:
    // Whether the uid's stored settings still interpolate: a warning resets them to the defaults.
    static bool interpolating(uint32_t uid) {
        SettingsController* controller = SettingsController::getInstance();
        std::lock_guard lock(controller->getMutex());
        return controller->getSettingsLocked(uid).gameFpsLimit >= 1;
    }

    // Takes the uid's stored settings at its first reference.
    sp<Watchdog> performanceWatchdog(uint32_t uid, const char* name, const Settings& s) {
        SettingsController::getInstance()->setSettings(uid, s);
        return new Watchdog(uid, String8(name), mInterface);
    }

    // One second of a game at `fps`, then `update` 1 ns after a timer armed at the start is due.
    template <typename Update>
    void playSecond(int fps, Update update) {
        for (int i = 0; i < fps; i++)
            mAggregator->record(EventAggregator::eGameFrames, mClock.now() + 1 + i * SECOND / fps);
        mClock.advance(SECOND + 1);
        update();
    }

    test::TestClock mClock{1000 * SECOND};
    const uint32_t mUid = test::nextTestUid();
    sp<EventAggregator> mAggregator = new EventAggregator();
    sp<RealWatchdogInterface> mInterface = new RealWatchdogInterface(mAggregator);
};

// The wall clock in ms as the controller reads it; time() reads a coarser clock that can lag it.
int64_t wallClockMs() {
    timespec now{};
    clock_gettime(CLOCK_REALTIME, &now);
    return int64_t{now.tv_sec} * 1000 + now.tv_nsec / 1'000'000;
}

TEST_F(WatchdogTest, warningsAreWrittenOnceOldestFirstAsTwentyByteRecords) {
    SettingsController::getInstance()->setSettings(mUid, limits(60, 0, -1));
    const int64_t before = wallClockMs();
    WatchdogWarningController::addWarning(mUid, LOW_GAME_FPS, 42, true);
    WatchdogWarningController::addWarning(mUid, LATENCY_REDUCTION_UNSTABLE, 0.5f, true);
    WatchdogWarningController::addWarning(mUid, HIGH_GAME_FPS, 99, /*record=*/false);
    WatchdogWarningController::addWarning(mUid, static_cast<WarningCode>(7), 3, true);
    EXPECT_FALSE(interpolating(mUid));

    WatchdogWarningController::writeWarningsToParcel(mUid, nullptr);  // leaves them in place
    LogCapture log(1);
    const std::vector<uint32_t> w = fetchWarnings(mUid);
    EXPECT_THAT(log.texts(), ElementsAre("Invalid WatchdogWarning code 7"));
    EXPECT_EQ(w, (std::vector<uint32_t>{20, 0, w[2], w[3], 42, 20, 1, w[7], w[8], bitsOf(0.5f), 20,
                                        7, w[12], w[13], 0}));
    const int64_t timestamp = w[2] | int64_t{w[3]} << 32;  // of the first, little-endian
    EXPECT_TRUE(timestamp >= before && timestamp <= wallClockMs());
    EXPECT_THAT(fetchWarnings(mUid), IsEmpty());

    for (int i = 0; i < 11; i++)
        WatchdogWarningController::addWarning(mUid, LOW_GAME_FPS, i, true);
    const std::vector<uint32_t> newest = fetchWarnings(mUid);
    ASSERT_EQ(50u, newest.size());
    EXPECT_EQ(std::pair(1u, 10u), std::pair(newest[4], newest[49]));  // values of first and last
}

// A fall below 75 % and then 50 % of a rate is a loading screen: no low-rate decision then.
class SteepDropTest : public WatchdogTest,
                      public testing::WithParamInterface<std::tuple<int, bool>> {};

TEST_P(SteepDropTest, fallToThreeQuartersThenHalfIsALoadingScreen) {
    const auto [middle, loading] = GetParam();
    sp<Watchdog> watchdog = performanceWatchdog(mUid, "game", limits(60, 20, -1));
    const auto update = [&] { watchdog->update(); };
    for (int i = 0; i < 61; i++)  // past the grace period
        playSecond(60, update);
    LogCapture log(2);
    playSecond(middle, update);
    playSecond(25, update);
    EXPECT_EQ(loading, watchdog->hasRecentSteepDrop());
    // The last second's lines: its rate, then a decision unless a loading screen was seen.
    EXPECT_EQ(loading, log.texts().back() == "PerformanceWatchdog::update [game] currentFPS 25");
}

INSTANTIATE_TEST_SUITE_P(Rates, SteepDropTest,
                         testing::Values(std::tuple(40, true), std::tuple(46, false)));

// A game at a constant 10 fps: too fast for one watchdog at once, too slow for the other only
// once the first 60 s have passed.
TEST_F(WatchdogTest, lowRateWaitsOutTheGracePeriodButHighRateDoesNot) {
    const uint32_t highUid = test::nextTestUid();
    LogCapture log(1);
    sp<Watchdog> low = performanceWatchdog(mUid, "low", limits(30, 28, -1));
    sp<Watchdog> high = performanceWatchdog(highUid, "high", limits(30, 0, 5));
    const auto updateBoth = [&] {
        low->update();
        high->update();
    };
    for (int i = 0; i < 60; i++)  // the grace period, and the second its end is noticed in
        playSecond(10, updateBoth);
    playSecond(10, updateBoth);
    EXPECT_THAT(log.texts(),
                ElementsAre("PerformanceWatchdog<WatchdogInterface>::onSettingsChanged Warning! "
                            "Interpolation FPS (30) is set lower or near to min acceptable FPS "
                            "(28). Min acceptable FPS has been lowered accordingly (25).",
                            "PerformanceWatchdog::makeMaxDecision [high] UID " +
                                    std::to_string(highUid) +
                                    " average FPS 10.000000 TOO HIGH (higher than 5), disabling "
                                    "Verolux",
                            "PerformanceWatchdog::makeDecision [low] UID " + std::to_string(mUid) +
                                    " average FPS 10.000000 TOO LOW (less than 25), disabling "
                                    "Verolux"));
    EXPECT_FALSE(interpolating(highUid));
    EXPECT_THAT(fetchWarnings(highUid), IsEmpty());  // reset, not recorded
    EXPECT_THAT(fetchWarnings(mUid), ElementsAre(20, LOW_GAME_FPS, _, _, 10));

    // New settings make a switched-off watchdog measure again, unless both limits are below 1.
    LogCapture quiet(2);
    low->onSettingsChanged(limits(30, 5, -1));
    high->onSettingsChanged(limits(60, 0, 0));
    playSecond(10, updateBoth);
    EXPECT_THAT(quiet.texts(),
                ElementsAre("PerformanceWatchdog::update [low] currentFPS 10",
                            "PerformanceWatchdog::makeDecision [low] average FPS 10.000000 is OK"));
}

// 30 s until measuring, 300 s until decisions; the stability covers the whole measured time.
class LatencyReductionTest : public WatchdogTest,
                             public testing::WithParamInterface<std::tuple<int, bool>> {};

TEST_P(LatencyReductionTest, decidesFromTheStabilityOverTheWholeMeasuredTime) {
    const auto [oddSecondFps, warns] = GetParam();
    sp<LatencyReductionWatchdog> watchdog =
            new LatencyReductionWatchdog(mUid, String8("game"), mAggregator);
    for (int second = 1; second <= 300; second++) {
        playSecond(second % 2 == 0 ? 60 : oddSecondFps, [&] { watchdog->update(); });
        if (second == 30) {
            EXPECT_TRUE(std::isnan(watchdog->getStability()));
        }
    }
    const float stability = watchdog->getStability();
    if (warns) {
        EXPECT_THAT(fetchWarnings(mUid),
                    ElementsAre(20, LATENCY_REDUCTION_UNSTABLE, _, _, bitsOf(stability)));
    } else {
        EXPECT_EQ(1.0f, stability);
        EXPECT_THAT(fetchWarnings(mUid), IsEmpty());
    }
}

INSTANTIATE_TEST_SUITE_P(Rates, LatencyReductionTest,
                         testing::Values(std::tuple(60, false), std::tuple(20, true)));

TEST_F(WatchdogTest, latencyReductionNeverWarnsOnNothingMeasured) {
    sp<LatencyReductionWatchdog> watchdog =
            new LatencyReductionWatchdog(mUid, String8("game"), mAggregator);
    watchdog->enableDecisions();
    watchdog->makeDecision();  // 0 / 0
    EXPECT_THAT(fetchWarnings(mUid), IsEmpty());
}

// Counting starts 10 s after the first reference; the verdict is a log line only.
TEST_F(WatchdogTest, clientCompositionReportsShareAndRunWithoutSwitchingOff) {
    Settings s = limits(60, 0, -1);
    s.maxConsecutiveGlCompositions = 0;
    s.maxPercentGlCompositions = 0.4f;
    SettingsController::getInstance()->setSettings(mUid, s);
    sp<ClientCompositionWatchdog> watchdog = new ClientCompositionWatchdog(mUid, String8("game"));
    LogCapture log(2);
    const auto compose = [&](bool client) {
        if (client) watchdog->onClientComposition();
        watchdog->onPostComposition();
    };
    compose(true);
    mClock.advance(10 * SECOND + 1);
    compose(true);  // enables counting as it ends
    compose(false);
    compose(true);
    watchdog->suspend();
    compose(true);  // not counted, and forgotten
    watchdog->resume();
    compose(false);
    const std::string post = "ClientCompositionWatchdog::onPostComposition [game] ";
    const std::string decision = "ClientCompositionWatchdog::makeDecision [game] too many client ";
    EXPECT_THAT(log.texts(),
                ElementsAre(post + "0.000000% client composed frames (0 in a row)",
                            decision + "frames (0 >= 0 in a row), stopping interpolation",
                            post + "50.000000% client composed frames (1 in a row)",
                            decision + "frames (50.000000% > 40.000000%), stopping interpolation",
                            "ClientCompositionWatchdog::suspend [game] ",
                            "ClientCompositionWatchdog::resume [game] ",
                            post + "33.333333% client composed frames (0 in a row)",
                            decision + "frames (0 >= 0 in a row), stopping interpolation"));
    EXPECT_TRUE(interpolating(mUid));
}

}  // namespace
}  // namespace android::Interpolation
