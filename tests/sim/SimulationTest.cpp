#include <gtest/gtest.h>

#include <chrono>
#include <thread>

#include "sim/Simulation.h"

namespace verolux::sim {
namespace {

using namespace std::chrono_literals;
using std::chrono::steady_clock;

Options shortRun(uint32_t mode) {
    Options options;
    options.mode = mode;
    options.durationSec = 0.8;
    options.durationGiven = true;
    options.reference = false;
    return options;
}

struct CollectingSink : RecordSink {
    void onFrame(const FrameRecord& frame) override { frames.push_back(frame); }
    void onRefresh(const RefreshRecord& refresh) override { refreshes.push_back(refresh); }
    std::vector<FrameRecord> frames;
    std::vector<RefreshRecord> refreshes;
};

// The reference host driving the engine as a compositor does, in each mode, for under a second.
class SimulationTest : public testing::TestWithParam<uint32_t> {};

TEST_P(SimulationTest, showsAPictureAtEveryRefreshAndHandsEveryBufferBack) {
    Simulation simulation(shortRun(GetParam()), {}, nullptr);
    // Sized for the mode: the fill-in picker keeps four frames queued.
    EXPECT_EQ(GetParam() == 1   ? 5u
              : GetParam() == 0 ? 8u
                                : 3u,
              simulation.layers().front().buffers.count);
    CollectingSink sink;
    const auto start = steady_clock::now();
    const RunResult result = simulation.run({&sink}, false, nullptr);
    EXPECT_LT(steady_clock::now() - start, 1500ms);  // tear-down included
    EXPECT_FALSE(result.interrupted);
    ASSERT_GE(sink.refreshes.size(), 40u);  // 48 at 60 Hz, less what a busy machine drops
    ASSERT_GE(sink.frames.size(), 15u);
    // Once the game's first frame is on screen, the layer always shows a picture.
    for (const RefreshRecord& refresh : sink.refreshes)
        EXPECT_TRUE(refresh.presentTime < simulation.startTime() + 150'000'000 ||
                    refresh.contentTime >= 0)
                << "refresh " << refresh.index;
    for (size_t i = 0; i < sink.frames.size(); i++) {
        const FrameRecord& frame = sink.frames[i];
        EXPECT_EQ(i + 1, frame.number);
        EXPECT_TRUE(frame.queueTime < 0 || frame.releaseTime >= frame.queueTime) << frame.number;
    }
}

INSTANTIATE_TEST_SUITE_P(AllModes, SimulationTest, testing::Range(0u, 6u));

TEST(SimulationInterruptTest, stopsEarlyAndKeepsWhatItRecorded) {
    Options options = shortRun(0);
    options.durationSec = 30;
    options.reference = true;
    Simulation simulation(options, {}, nullptr);
    ASSERT_EQ(2u, simulation.layers().size());
    EXPECT_EQ(2u, simulation.layers()[1].mode);
    std::atomic<bool> interrupted{false};
    std::thread interrupter([&] {
        std::this_thread::sleep_for(500ms);
        interrupted = true;
    });
    CollectingSink run, reference;
    const auto start = steady_clock::now();
    const RunResult result = simulation.run({&run, &reference}, interrupted, nullptr);
    interrupter.join();
    EXPECT_LT(steady_clock::now() - start, 2s);
    EXPECT_TRUE(result.interrupted);
    EXPECT_GE(run.refreshes.size(), 5u);
    EXPECT_GE(reference.refreshes.size(), 5u);
}

}  // namespace
}  // namespace verolux::sim
