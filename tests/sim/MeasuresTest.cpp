#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>

#include "sim/LayerRecorder.h"
#include "sim/Measures.h"
#include "support/Records.h"

namespace verolux::sim {
namespace {

constexpr nsecs_t MS = 1'000'000;
constexpr nsecs_t HZ120 = 8'333'333;
constexpr nsecs_t HZ60 = 16'666'667;

using test::refreshAt;

struct Scenario {
    const char* name;
    nsecs_t period;
    // The picture and content time at refresh i.
    std::function<std::pair<Picture, double>(uint64_t i)> screen;
    double errorMs;     // p50, p95, p99 and max of |animation error|
    double overHalf;    // share of refreshes off by over half a period
    double displayFps;  // average
    uint64_t stutters;
};

// Numbers checkable by hand: 120 refreshes of each.
const Scenario SCENARIOS[] = {
        // Mode 2, an even 60 fps game on 120 Hz: every frame shown twice, so the content steps
        // 16.67 then 0 ms while the screen steps 8.33: off by exactly one refresh period each time.
        {"even60On120", HZ120,
         [](uint64_t i) {
             return std::pair(i % 2 == 0 ? Picture::NEW : Picture::REPEAT,
                              static_cast<double>(i / 2 * 2 * HZ120));
         },
         8.333, 1.0, 60.0, 0},
        // Perfectly interpolated: the content moves exactly with the present times.
        {"interpolated", HZ120,
         [](uint64_t i) { return std::pair(Picture::BLEND, static_cast<double>(i * HZ120)); }, 0, 0,
         120.0, 0},
};

class MeasuresTest : public testing::TestWithParam<Scenario> {};

TEST_P(MeasuresTest, animationErrorAndDisplayRateOfAHandMadeScreen) {
    const Scenario& s = GetParam();
    Measures measures(s.period);
    for (uint64_t i = 0; i < 120; i++) {
        const auto [picture, content] = s.screen(i);
        measures.onRefresh(refreshAt(i, s.period, picture, content));
    }
    const MeasuredLayer m = measures.result();
    for (const auto& value : {m.errorP50Ms, m.errorP95Ms, m.errorP99Ms, m.errorMaxMs})
        EXPECT_NEAR(s.errorMs, *value, 0.001);
    EXPECT_DOUBLE_EQ(s.overHalf, *m.errorOverHalfPeriodShare);
    EXPECT_NEAR(s.displayFps, *m.displayFps.average, 0.01);
    EXPECT_NEAR(s.displayFps, *m.displayFps.low1, 0.01);
    EXPECT_EQ(s.stutters, m.stutterCount);
    EXPECT_EQ(0u, m.skippedVsyncs);
}

INSTANTIATE_TEST_SUITE_P(Screens, MeasuresTest, testing::ValuesIn(SCENARIOS),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(MeasuresHitchTest, oneHundredMillisecondHitchIsOneStutter) {
    // 60 fps on 60 Hz, but frame 30 stays on screen for 100 ms (six refreshes): five repeats.
    Measures measures(HZ60);
    uint64_t frame = 0;
    for (uint64_t i = 0; i < 120; i++) {
        const bool held = i > 30 && i <= 35;
        if (!held && i > 0) frame++;
        measures.onRefresh(refreshAt(i, HZ60, held ? Picture::REPEAT : Picture::NEW,
                                     static_cast<double>(frame * HZ60)));
    }
    // Frames queued every 16.67 ms and shown 20 ms later; frame 3 never shown.
    for (uint64_t n = 1; n <= 10; n++) {
        FrameRecord f;
        f.number = n;
        f.startTime = static_cast<nsecs_t>(n) * HZ60 - 2 * MS;
        f.dequeueTime = f.startTime + (n == 5 ? 3 * MS : 0);
        f.queueTime = static_cast<nsecs_t>(n) * HZ60;
        if (n != 3) f.firstPresentTime = f.queueTime + 20 * MS;
        measures.onFrame(f);
    }
    const MeasuredLayer m = measures.result();
    ASSERT_EQ(1u, m.stutterCount);
    EXPECT_EQ(36 * HZ60 + HZ60, m.stutters[0].time);  // the present that ended the gap
    EXPECT_NEAR(100.0, m.stutters[0].gap / 1e6, 0.001);
    EXPECT_NEAR(16.667, *m.medianGapMs, 0.001);
    EXPECT_NEAR(60.0, *m.gameFps.average, 0.01);
    EXPECT_EQ(9u, m.framesShown);
    EXPECT_EQ(1u, m.framesDropped);
    EXPECT_NEAR(20.0, *m.latencyP50Ms, 0.001);
    EXPECT_NEAR(3.0, m.bufferWaitMs, 1e-9);

    // A display that fell behind skips vsyncs: refresh indices jump.
    Measures late(HZ60);
    for (uint64_t index : {0, 1, 4})
        late.onRefresh(refreshAt(index, HZ60, Picture::NEW, 0));
    EXPECT_EQ(2u, late.result().skippedVsyncs);
}

// Records what a LayerRecorder passes on.
struct CollectingSink : RecordSink {
    void onFrame(const FrameRecord& frame) override { frames.push_back(frame); }
    void onRefresh(const RefreshRecord& refresh) override { refreshes.push_back(refresh); }
    std::vector<FrameRecord> frames;
    std::vector<RefreshRecord> refreshes;
};

TEST(LayerRecorderTest, namesWhatTheScreenShowedAndPassesFramesOnInOrder) {
    CollectingSink sink;
    // Held as the simulator holds it: a reference-counted object frees its counts with the last
    // strong reference.
    const android::sp<LayerRecorder> recorder = new LayerRecorder(1, sink);
    for (uint64_t n = 1; n <= 3; n++) {
        recorder->frameDequeued(n, static_cast<int>(n), 1000 * static_cast<nsecs_t>(n), 0, 0);
        recorder->frameQueued(n, 10 * static_cast<nsecs_t>(n), 10 * static_cast<nsecs_t>(n));
    }
    // Items (frame, weight): a blend, the same blend, a single new frame, an empty state, the
    // frame from before the empty state again.
    const std::vector<std::vector<std::pair<uint64_t, float>>> states = {
            {{1, 0.25f}, {2, 0.75f}}, {{1, 0.25f}, {2, 0.75f}}, {{2, 1.0f}}, {}, {{2, 1.0f}}};
    for (size_t i = 0; i < states.size(); i++) {
        RefreshRecord r;
        r.index = i;
        r.presentTime = 100 * static_cast<nsecs_t>(i + 1);
        for (const auto& [frame, weight] : states[i])
            r.items[r.itemCount++] = {frame, weight, weight};
        recorder->composed(r);
        recorder->refreshed(r);
    }
    recorder->frameReleased(2, 600);  // waits for frame 1
    recorder->frameReleased(1, 700);
    recorder->finish();  // frame 3, never released

    std::vector<std::string> pictures;
    std::vector<double> contents;
    for (const RefreshRecord& r : sink.refreshes) {
        pictures.push_back(pictureName(r.picture));
        contents.push_back(r.contentTime);
    }
    EXPECT_THAT(pictures, testing::ElementsAre("blend", "repeat", "new", "held", "repeat"));
    EXPECT_THAT(contents, testing::ElementsAre(1750, 1750, 2000, 2000, 2000));
    ASSERT_EQ(3u, sink.frames.size());
    EXPECT_EQ(std::vector<uint64_t>({1, 2, 3}),
              std::vector<uint64_t>(
                      {sink.frames[0].number, sink.frames[1].number, sink.frames[2].number}));
    EXPECT_TRUE(sink.frames[0].dropped());  // never the larger weight
    EXPECT_EQ(100, sink.frames[1].firstPresentTime);
    EXPECT_EQ(500, sink.frames[1].lastPresentTime);  // held and shown again
    EXPECT_EQ(600, sink.frames[1].releaseTime);
}

}  // namespace
}  // namespace verolux::sim
