#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <thread>
#include <tuple>

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
    // 48 refreshes at 60 Hz and 24 frames at 30 fps, less what a busy machine or a sanitizer
    // build drops (a third of the refreshes under AddressSanitizer on two shared cores).
    ASSERT_GE(sink.refreshes.size(), 24u);
    ASSERT_GE(sink.frames.size(), 12u);
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

// The reference and a further copy of the game, each a layer of its own beside the run.
TEST(SimulationInterruptTest, stopsEarlyAndKeepsWhatEveryLayerRecorded) {
    Options options = shortRun(0);
    options.durationSec = 30;
    options.reference = true;
    options.layers = 2;
    Simulation simulation(options, {}, nullptr);
    std::vector<std::tuple<std::string, std::string, uint32_t, uint32_t>> plans;
    for (const LayerPlan& plan : simulation.layers())
        plans.emplace_back(plan.role, plan.name, plan.uid, plan.mode);
    EXPECT_THAT(plans, testing::ElementsAre(std::tuple("run", "game", 10'001u, 0u),
                                            std::tuple("reference", "reference", 10'002u, 2u),
                                            std::tuple("run-2", "game-2", 10'003u, 0u)));
    std::atomic<bool> interrupted{false};
    std::thread interrupter([&] {
        std::this_thread::sleep_for(500ms);
        interrupted = true;
    });
    CollectingSink run, reference, copy;
    const auto start = steady_clock::now();
    const RunResult result = simulation.run({&run, &reference, &copy}, interrupted, nullptr);
    interrupter.join();
    EXPECT_LT(steady_clock::now() - start, 2s);
    EXPECT_TRUE(result.interrupted);
    for (const CollectingSink* sink : {&run, &reference, &copy})
        EXPECT_GE(sink->refreshes.size(), 5u);
    EXPECT_NE(std::string::npos, result.dump.find("[game-2]")) << result.dump;
}

}  // namespace
}  // namespace verolux::sim
