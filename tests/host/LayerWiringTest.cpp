#include <gtest/gtest.h>

#include <cmath>
#include <memory>
#include <optional>

#include "Ringlog.h"
#include "SettingsController.h"
#include "WatchdogWarningController.h"
#include "host/LayerHost.h"
#include "host/RefreshClassifier.h"
#include "sim/WarningLedger.h"
#include "support/Frames.h"
#include "support/TestClock.h"
#include "tools/ringlog/RinglogReader.h"

namespace verolux::host {
namespace {

using namespace android;
using namespace android::Interpolation;
using Counter = EventAggregator::Counter;

constexpr nsecs_t SECOND = 1'000'000'000;
constexpr int32_t GAME_FPS_LIMIT = 0;
constexpr int32_t MIN_ACCEPTABLE_FPS = 26;

RenderState stateOf(std::initializer_list<std::pair<FrameItem, float>> items) {
    RenderState state;
    for (const auto& [frame, alpha] : items)
        state.items.push_back({frame, alpha, state.items.empty() ? 0u : 1u});
    return state;
}

TEST(RefreshClassifierTest, countsEachRefreshOnceAndTheFramesNewerOnesOvertook) {
    const FrameItem f1 = test::makeFrame(1), f2 = test::makeFrame(2), f5 = test::makeFrame(5);
    const FrameItem rendering = test::makeFrame(6, false, Fence::createPending());
    struct Step {
        bool presented;
        RenderState state;
        bool latchedByHost;
        std::optional<Counter> counter;  // none: nothing on screen yet
        uint64_t skipped;
    };
    const Step steps[] = {
            {true, {}, false, std::nullopt, 0},
            {true, stateOf({{f1, 1}}), false, Counter::eOriginalFrames, 0},
            {true, stateOf({{f1, 1}, {f2, 0.5f}}), false, Counter::eInterpolatedFrames, 0},
            {true, stateOf({{f1, 1}, {f2, 0.5f}}), false, Counter::eRepeatedFrames, 0},
            {true, stateOf({{f1, 1}, {f2, 0.75f}}), false, Counter::eInterpolatedFrames, 0},
            {false, {}, false, Counter::eRepeatedFrames, 0},  // refused: the picture stays
            {true, {}, false, Counter::eRepeatedFrames, 0},   // empty: the compositor keeps it
            {true, stateOf({{f5, 1}}), true, Counter::eUninterpolatedFrames, 2},  // 3 and 4
            {true, stateOf({{rendering, 1}}), false, Counter::eMissedFrames, 0},
    };
    RefreshClassifier classifier;
    for (size_t i = 0; i < std::size(steps); i++) {
        const Step& step = steps[i];
        const auto outcome = classifier.classify(step.presented, step.state, step.latchedByHost);
        EXPECT_EQ(step.counter.has_value(), outcome.counted) << "step " << i;
        EXPECT_EQ(step.counter.value_or(Counter::eRepeatedFrames), outcome.counter) << "step " << i;
        EXPECT_EQ(step.skipped, outcome.skippedFrames) << "step " << i;
    }
}

// The reference host driven refresh by refresh on the test clock, as a compositor drives it.
class WiredHost {
public:
    WiredHost(uint32_t uid, InterpolationMode mode) {
        LayerHost::Config config;
        config.name = String8("game");
        config.uid = uid;
        config.mode = mode;
        mHost = std::make_unique<LayerHost>(config, [](const FrameItem&) {});
        for (auto& buffer : mBuffers)
            buffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
    }

    // One refresh now; whether the layer presented.
    bool refresh(const test::TestClock& clock) {
        const nsecs_t vsync = clock.now();
        const bool presents = mHost->onVsync(vsync);
        const RenderState& state = presents ? mHost->compose(vsync) : mNothing;
        mLastState = state;
        mHost->onCompositionDone(state, vsync, mPresentFence);
        return presents;
    }

    void queueFrame(const test::TestClock& clock) {
        mFrames++;
        const int slot = static_cast<int>(mFrames % mBuffers.size());
        const sp<Fence> fence = Fence::createSignalled(clock.now());
        mHost->onBufferDequeued(slot, clock.now(), clock.now());
        mHost->onBufferQueued(mFrames, slot, mBuffers[slot], clock.now(), fence);
        mHost->onBufferAcquired(mFrames, slot, mBuffers[slot], clock.now(), fence);
    }

    LayerHost& host() { return *mHost; }
    uint64_t frames() const { return mFrames; }
    const RenderState& lastState() const { return mLastState; }

private:
    std::unique_ptr<LayerHost> mHost;
    std::array<sp<GraphicBuffer>, 8> mBuffers;
    uint64_t mFrames = 0;
    const RenderState mNothing;
    RenderState mLastState;
    const std::shared_ptr<FenceTime> mPresentFence =
            std::make_shared<FenceTime>(Fence::createSignalled(0));
};

struct DisplayRate {
    double hz;
    int detected;       // in multiples of 5 Hz
    int presentations;  // per second: at most the render-rate agent's default 120
};

class DisplayRateTest : public testing::TestWithParam<DisplayRate> {};

TEST_P(DisplayRateTest, detectsTheRefreshRateAndPresentsAtMostAtTheRenderRate) {
    test::TestClock clock(1000 * SECOND);
    WiredHost wired(test::nextTestUid(), eRetimeMode);
    const auto period = static_cast<nsecs_t>(std::llround(1e9 / GetParam().hz));
    EXPECT_EQ(60, wired.host().status().refreshRate);  // until a second of vsyncs is in
    int presentations = 0;
    for (nsecs_t start = clock.now(); clock.now() < start + 2 * SECOND; clock.advance(period)) {
        // A game at the display's rate: every presentation shows a new frame.
        wired.queueFrame(clock);
        const bool presents = wired.refresh(clock);
        if (clock.now() >= start + SECOND) presentations += presents;
    }
    EXPECT_EQ(GetParam().detected, wired.host().status().refreshRate);
    EXPECT_NEAR(GetParam().presentations, presentations, 1);
}

INSTANTIATE_TEST_SUITE_P(Displays, DisplayRateTest,
                         testing::Values(DisplayRate{60, 60, 60}, DisplayRate{90, 90, 90},
                                         DisplayRate{144, 145, 120}),
                         [](const testing::TestParamInfo<DisplayRate>& info) {
                             return std::to_string(static_cast<int>(info.param.hz)) + "Hz";
                         });

TEST(LayerSwitchOffTest, aLowRateWarningReachesTheLedgerAndTheHostLatchesFramesItself) {
    test::TestClock clock(1000 * SECOND);
    const uint32_t uid = test::nextTestUid();
    deliverSettings(uid, {{GAME_FPS_LIMIT, 60}, {MIN_ACCEPTABLE_FPS, 40}});
    WiredHost wired(uid, eRetimeMode);
    SettingsController::getInstance()->notifyChanges();
    ASSERT_TRUE(wired.host().status().interpolating);

    // A 30 fps game on a 60 Hz display: interpolated through the watchdog's 60 s of grace, then
    // switched off once the reset settings are delivered.
    const nsecs_t period = 16'666'667;
    auto play = [&](int seconds) {
        for (int refresh = 0; refresh < seconds * 60; refresh++) {
            if (refresh % 2 == 0) wired.queueFrame(clock);
            wired.refresh(clock);
            clock.advance(period);
        }
    };
    play(59);
    EXPECT_TRUE(wired.host().status().interpolating);
    play(4);
    EXPECT_FALSE(wired.host().status().interpolating);
    wired.queueFrame(clock);
    wired.refresh(clock);
    ASSERT_EQ(1u, wired.lastState().items.size());
    EXPECT_EQ(wired.frames(), wired.lastState().items[0].frame.mIndex);  // the newest, whole

    Parcel parcel;
    WatchdogWarningController::writeWarningsToParcel(uid, &parcel);
    parcel.setDataPosition(0);
    const sim::DecodedWarnings decoded = sim::decodeWarnings(parcel);
    EXPECT_EQ("", decoded.error);
    ASSERT_EQ(1u, decoded.warnings.size());
    EXPECT_EQ(LOW_GAME_FPS, decoded.warnings[0].code);
    EXPECT_FALSE(decoded.warnings[0].floatValue);
    EXPECT_NEAR(30, decoded.warnings[0].value, 1);

    String8 dump;
    wired.host().dump(dump);
    const std::string text = dump.c_str();
    EXPECT_NE(std::string::npos, text.find("Log: game fps=30, actual fps=30")) << text;
    EXPECT_NE(std::string::npos, text.find("  Version: 1.5\n")) << text;
    EXPECT_NE(std::string::npos, text.find("interpolation off")) << text;
    EXPECT_NE(std::string::npos, text.find("  Settings: { 0, 64, true,")) << text;
}

TEST(LayerRingLogTest, recordsWhatOnlyTheHostSeesBesideTheBusEvents) {
    test::TestClock clock(1000 * SECOND);
    const uint32_t uid = test::nextTestUid();
    WiredHost wired(uid, eNoInterpMode);
    wired.queueFrame(clock);                         // and the game-rate agent's first limit
    for (int refresh = 0; refresh < 2; refresh++) {  // the frame, then the same picture again
        clock.advance(SECOND / 60);
        wired.refresh(clock);
    }
    wired.host().onBufferBackpressure();

    Parcel parcel;
    wired.host().writeRingLog(parcel);
    const ringlog::RinglogFile file = ringlog::parseRinglog(parcel.data(), parcel.dataSize());
    ASSERT_TRUE(file.ok()) << file.error;
    ASSERT_EQ(1u, file.dumps.size());
    EXPECT_EQ(uid, file.dumps[0].header.uid);
    std::vector<uint32_t> direct;
    bool busEventsToo = false;
    for (const SerializableEvent& record : file.dumps[0].records) {
        if (record.type == Ringlog::FRAME_REPEATED_RECORD ||
            record.type == Ringlog::BACKPRESSURE_RECORD ||
            record.type == Ringlog::GFPS_CHANGED_RECORD) {
            direct.push_back(record.type);
        }
        busEventsToo |= record.type == eFrameReceivedEvent;
    }
    EXPECT_TRUE(busEventsToo);
    EXPECT_EQ((std::vector<uint32_t>{Ringlog::GFPS_CHANGED_RECORD, Ringlog::FRAME_REPEATED_RECORD,
                                     Ringlog::BACKPRESSURE_RECORD}),
              direct);
}

TEST(WarningLedgerTest, decodesEachRecordByItsCodeAndStopsAtABrokenOne) {
    Parcel parcel;
    const std::pair<int32_t, float> records[] = {{LOW_GAME_FPS, 0},
                                                 {LATENCY_REDUCTION_UNSTABLE, 0.5f}};
    for (const auto& [code, stability] : records) {
        parcel.writeInt32(20);
        parcel.writeInt32(code);
        parcel.writeInt64(1'700'000'000'123);
        code == LOW_GAME_FPS ? parcel.writeInt32(29) : parcel.writeFloat(stability);
    }
    parcel.writeInt32(20);
    parcel.writeInt32(HIGH_GAME_FPS);  // cut short
    parcel.setDataPosition(0);
    sim::DecodedWarnings decoded = sim::decodeWarnings(parcel);
    EXPECT_EQ("a warning record cut short after 2 whole ones", decoded.error);
    ASSERT_EQ(2u, decoded.warnings.size());
    decoded.warnings[0].time = 61'500'000'000;
    decoded.warnings[1].time = 90 * SECOND;
    EXPECT_EQ("   61.50 s  22:13:20.123 UTC  run        LOW_GAME_FPS                29",
              sim::ledgerLine(decoded.warnings[0], 0, "run"));
    EXPECT_EQ("   90.00 s  22:13:20.123 UTC  reference  LATENCY_REDUCTION_UNSTABLE  0.500",
              sim::ledgerLine(decoded.warnings[1], 0, "reference"));
    EXPECT_EQ("code 7", sim::warningCodeName(7));

    // On the run's clock; a wall-clock time from a broken parcel once overflowed the conversion.
    constexpr nsecs_t START = 5 * SECOND;
    constexpr int64_t START_WALL_MS = 1'700'000'000'000;
    constexpr nsecs_t DAY = 24 * 3600 * SECOND;
    EXPECT_EQ(START + 1'500'000'000,
              sim::warningRunTime(START_WALL_MS + 1500, START, START_WALL_MS));
    EXPECT_EQ(START + DAY, sim::warningRunTime(INT64_MAX, START, START_WALL_MS));
    EXPECT_EQ(START - DAY, sim::warningRunTime(INT64_MIN, START, START_WALL_MS));
}

}  // namespace
}  // namespace verolux::host
