#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "sim/Capture.h"

namespace verolux::sim {
namespace {

Result<Capture> parse(const std::string& text, size_t maxFrames = MAX_CAPTURE_FRAMES) {
    return parseCapture(std::string_view(text), "capture.csv", maxFrames);
}

std::vector<std::pair<nsecs_t, nsecs_t>> times(const Result<Capture>& capture) {
    EXPECT_TRUE(capture.ok()) << capture.error;
    std::vector<std::pair<nsecs_t, nsecs_t>> out;
    for (const CaptureFrame& f : capture.value.frames)
        out.emplace_back(f.queueTime, f.renderDoneTime);
    return out;
}

TEST(CaptureTest, readsQueueAndRenderDoneTimesFromWhereverTheirColumnsAre) {
    // Relative to the first frame's queue time; an empty render-done cell is unknown.
    EXPECT_THAT(times(parse("\xEF\xBB\xBF"
                            "frame, render_done_ns ,display_ns,queue_ns\r\n"
                            "0,1008,,1000\r\n1,,2100,1033\r\n\r\n2, 1080 ,2200,1066\r\n")),
                testing::ElementsAre(std::pair(0, 8), std::pair(33, -1), std::pair(66, 80)));
    EXPECT_THAT(times(parse("queue_ns\n0\n5\n5")),
                testing::ElementsAre(std::pair(0, -1), std::pair(5, -1), std::pair(5, -1)));
}

TEST(CaptureTest, badInputNamesTheFileAndTheLine) {
    const std::string header = "frame,queue_ns,render_done_ns\n0,0,10\n";
    const std::vector<std::pair<std::string, std::string>> cases = {
            {header + "1,abc,20\n", ":3: queue_ns is not a number"},
            {header + "1,2.5,20\n", ":3: queue_ns is not a number"},
            {header + "1,,20\n", ":3: queue_ns is empty"},
            {header + "1,-5,20\n", ":3: queue_ns is out of range (0 to 24 hours in nanoseconds)"},
            {header + "1,99999999999999999999,\n", ":3: queue_ns is not a number"},
            {header + "\n1,40,x\n", ":4: render_done_ns is not a number"},
            {header + "1,40,39\n", ":3: render_done_ns is earlier than queue_ns"},
            {header + "1,40,50\n2,39,50\n", ":4: queue_ns is earlier than the previous frame's"},
            {header + "1,40\n", ":3: expected 3 cells, found 2"},
            {"frame,display_ns\n0,0\n",
             ":1: the header names neither queue_ns nor PresentMon's MsBetweenPresents"},
            {"TimeInSeconds,MsBetweenPresents\n1.5,x\n", ":2: MsBetweenPresents is not a number"},
            {"TimeInSeconds,MsBetweenPresents\n1.5,1\n1.4,1\n",
             ":3: TimeInSeconds is earlier than the previous frame's"},
            {"queue_ns,queue_ns\n0,0\n", ":1: column \"queue_ns\" appears twice"},
            {"queue_ns\n0\n" + std::string(5000, '1'), ":3: line is longer than 4096 characters"},
            {"queue_ns\n\n", ": no frames after the header"},
            {"", ": empty, expected a header line naming queue_ns"},
    };
    for (const auto& [text, message] : cases) {
        EXPECT_EQ("verolux-sim: capture.csv" + message, parse(text).error) << text;
    }
    EXPECT_EQ("verolux-sim: capture.csv:5: more than 3 frames",
              parse("queue_ns\n0\n1\n2\n3\n", 3).error);
    EXPECT_EQ("verolux-sim: cannot read capture /nonexistent/c.csv: No such file or directory",
              readCapture("/nonexistent/c.csv").error);
    // An endless line is refused after 4 KiB, not read whole.
    EXPECT_EQ("verolux-sim: /dev/zero:1: line is longer than 4096 characters",
              readCapture("/dev/zero").error);
}

TEST(CaptureTest, readsTheGamesOwnSwapChainFromAPresentMonFile) {
    // The game presents three times, the overlay once; render times in ms, "NA" unknown.
    const auto capture =
            parse("Application,ProcessID,SwapChainAddress,Runtime,TimeInSeconds,MsBetweenPresents,"
                  "MsUntilRenderComplete\n"
                  "game.exe,10,0x1,DXGI,2.5,16.0,4.5\n"
                  "overlay.exe,11,0x9,DXGI,2.505,16.0,1.0\n"
                  "game.exe,10,0x1,DXGI,2.516,16.0,NA\n"
                  "game.exe,10,0x1,DXGI,2.5331,17.1,2.0\n");
    EXPECT_EQ("PresentMon", capture.value.format);
    EXPECT_THAT(times(capture),
                testing::ElementsAre(std::pair(0, 4'500'000), std::pair(16'000'000, -1),
                                     std::pair(33'100'000, 35'100'000)));
    // Without TimeInSeconds the presents add up from MsBetweenPresents.
    EXPECT_THAT(times(parse("MsBetweenPresents\n10\n12.5\n")),
                testing::ElementsAre(std::pair(0, -1), std::pair(12'500'000, -1)));
}

TEST(CaptureTest, theShippedCaptureIsValid) {
    auto capture = readCapture(VEROLUX_SOURCE_DIR "/sim/captures/stutter30.frames.csv");
    ASSERT_TRUE(capture.ok()) << capture.error;
    const auto& frames = capture.value.frames;
    ASSERT_EQ(300u, frames.size());
    EXPECT_GT(frames[61].queueTime - frames[60].queueTime, 80'000'000);  // a long frame: 83 ms
    EXPECT_EQ(-1, frames[100].renderDoneTime);
    // The pace asked of a run that replayed the first 61 frames: 60 intervals of 33.3 ms.
    EXPECT_NEAR(30.0, capture.value.fpsOverFirst(61), 0.2);
    EXPECT_NEAR(1e9 / capture.value.meanInterval(), capture.value.fpsOverFirst(1000), 1e-9);
    // Three intervals over 1 ns once made a mean of 0 and an infinite rate.
    EXPECT_EQ(1, parse("queue_ns\n0\n0\n0\n1\n").value.meanInterval());
}

}  // namespace
}  // namespace verolux::sim
