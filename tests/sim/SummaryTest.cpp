#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "sim/Summary.h"

namespace verolux::sim {
namespace {

constexpr nsecs_t MS = 1'000'000;

RefreshRecord refresh(uint32_t kind, double contentMs, nsecs_t cpuUs) {
    RefreshRecord r;
    r.kind = kind;
    r.contentTime = contentMs < 0 ? -1 : contentMs * MS;
    r.cpuTime = cpuUs * 1000;
    return r;
}

// One second: four frames queued 100 ms apart and a fifth only dequeued; three of them shown
// 150, 150 and 200 ms after their queue time. Five refreshes of kinds new, blend, repeat, none,
// new, showing content 100, 120, 120, nothing, 180 ms, at 10, 20, 30, 40 and 100 us of CPU.
Recording oneSecond() {
    Recording recording;
    recording.mode = 0;
    recording.startTime = 1000 * MS;
    recording.endTime = 2000 * MS;
    const nsecs_t queued[] = {0, 100, 200, 300, -1};
    const nsecs_t shown[] = {150, 250, 400, -1, -1};
    for (int i = 0; i < 5; i++) {
        FrameRecord frame;
        frame.number = i + 1;
        frame.queueTime = queued[i] < 0 ? -1 : recording.startTime + queued[i] * MS;
        frame.firstDisplayTime = shown[i] < 0 ? -1 : recording.startTime + shown[i] * MS;
        recording.frames.push_back(frame);
    }
    recording.refreshes = {refresh(64, 100, 10), refresh(8, 120, 20), refresh(16, 120, 30),
                           refresh(0, -1, 40), refresh(64, 180, 100)};
    recording.delayChanges = {{1000 * MS, 64 * MS}, {1500 * MS, 60 * MS}, {1900 * MS, 58 * MS}};
    return recording;
}

TEST(SummaryTest, countsRatesSharesLatencyJudderAndCpuOfAHandMadeRun) {
    const Summary s = summarize(oneSecond());
    EXPECT_EQ(1.0, s.runSec);
    EXPECT_EQ(4.0, s.gameFps);
    EXPECT_EQ(3.0, s.displayedFps);  // content 100, 120 and 180; 120 again is no new picture
    EXPECT_DOUBLE_EQ(0.2, s.blendShare);
    EXPECT_DOUBLE_EQ(0.2, s.repeatShare);
    EXPECT_DOUBLE_EQ(0.4, s.newShare);
    EXPECT_DOUBLE_EQ(0.2, s.noStateShare);
    EXPECT_EQ(64.0, s.startDelayMs);
    EXPECT_EQ(58.0, s.endDelayMs);
    EXPECT_EQ(3u, s.displayedFrames);
    // Sorted 150, 150, 200: rank ceil(1.5) = 2 and ceil(2.97) = 3.
    EXPECT_EQ(150.0, s.latencyP50Ms);
    EXPECT_EQ(200.0, s.latencyP99Ms);
    // Steps 20 and 0; the empty refresh breaks the pair around it.
    EXPECT_EQ(10.0, s.meanStepMs);
    EXPECT_EQ(10.0, s.judderMs);
    EXPECT_EQ(40.0, s.cpuMeanUs);
    EXPECT_EQ(100.0, s.cpuP99Us);
}

TEST(SummaryTest, printsTheRunAndTheReferenceSideBySide) {
    Recording reference;
    reference.mode = 2;
    reference.refreshes = {refresh(16, -1, 0)};
    reference.refreshes[0].delay = 32 * MS;
    const Summary run = summarize(oneSecond());
    const Summary ref = summarize(reference);

    EXPECT_EQ(
            "                                  run (mode 0)               reference (mode 2)\n"
            "run length                        1.000 s                    n/a\n"
            "game fps (frames queued)          4.00                       n/a\n"
            "displayed fps (new pictures)      3.00                       n/a\n"
            "refreshes                         5                          1\n"
            "blended (kind 8)                  20.0 %                     0.0 %\n"
            "repeated (kind 16)                20.0 %                     100.0 %\n"
            "new frame (kind 64)               40.0 %                     0.0 %\n"
            "no state                          20.0 %                     0.0 %\n"
            "display delay at start            64.0 ms                    32.0 ms\n"
            "display delay at end              58.0 ms (3 changes)        32.0 ms (0 changes)\n"
            "latency queue to display p50      150.00 ms (3 frames)       n/a (0 frames)\n"
            "latency queue to display p99      200.00 ms                  n/a\n"
            "judder (content step deviation)   10.000 ms                  n/a\n"
            "mean content step                 10.000 ms                  n/a\n"
            "library CPU per refresh, mean     40.0 us                    0.0 us\n"
            "library CPU per refresh, p99      100.0 us                   0.0 us\n",
            formatSummary(run, &ref));
    EXPECT_THAT(formatSummary(run),
                testing::StartsWith("                                  run (mode 0)\n"
                                    "run length                        1.000 s\n"));
}

}  // namespace
}  // namespace verolux::sim
