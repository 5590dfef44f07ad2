#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/json.h>

#include <chrono>
#include <sstream>
#include <thread>

#include "sim/CsvWriter.h"
#include "sim/Simulation.h"
#include "sim/TraceWriter.h"

namespace verolux::sim {
namespace {

using namespace std::chrono_literals;
using std::chrono::steady_clock;

constexpr nsecs_t MS = 1'000'000;

Options shortRun(uint32_t mode) {
    Options options;
    options.mode = mode;
    options.durationSec = 0.8;
    options.width = 64;
    options.reference = false;
    options.quiet = true;
    // The fill-in picker keeps four frames queued before it releases one.
    options.slots = mode == 1 ? 5 : 3;
    return options;
}

// The reference host driving the engine as a compositor does, in each mode, for under a second.
class SimulationTest : public testing::TestWithParam<uint32_t> {};

TEST_P(SimulationTest, composesEveryRefreshAndHandsEveryBufferBack) {
    const Options options = shortRun(GetParam());
    Simulation simulation(options, {}, nullptr);
    const std::atomic<bool> interrupted{false};
    const auto start = steady_clock::now();
    const SimulationResult result = simulation.run(interrupted, nullptr);
    // The tear-down, included here, never waits on anything for long.
    EXPECT_LT(steady_clock::now() - start, 1500ms);

    const Recording& run = result.run;
    ASSERT_GE(run.refreshes.size(), 40u);  // 48 at 60 Hz, less what a busy machine drops
    ASSERT_GE(run.frames.size(), 15u);
    size_t shown = 0;
    size_t showable = 0;
    for (const RefreshRecord& refresh : run.refreshes) {
        // Once the game's first frame is ready, the layer always shows a picture.
        if (refresh.vsyncTime < run.startTime + 100 * MS) continue;
        showable++;
        shown += refresh.contentTime >= 0;
    }
    EXPECT_EQ(showable, shown);
    for (const FrameRecord& frame : run.frames) {
        EXPECT_GE(frame.queueTime, 0) << "frame " << frame.number;
        EXPECT_GE(frame.releaseTime, frame.queueTime) << "frame " << frame.number;
    }

    std::ostringstream csv;
    writeRefreshCsv(run, csv);
    std::istringstream lines(csv.str());
    std::string line;
    size_t rows = 0;
    std::getline(lines, line);
    const auto columns = std::count(line.begin(), line.end(), ',');
    while (std::getline(lines, line)) {
        EXPECT_EQ(columns, std::count(line.begin(), line.end(), ',')) << line;
        rows++;
    }
    EXPECT_EQ(run.refreshes.size(), rows);

    std::istringstream trace(Json::writeString(Json::StreamWriterBuilder(), buildTrace(run)));
    Json::Value parsed;
    std::string errors;
    ASSERT_TRUE(Json::parseFromStream(Json::CharReaderBuilder(), trace, &parsed, &errors)) << errors;
    EXPECT_GT(parsed["traceEvents"].size(), run.refreshes.size());
}

INSTANTIATE_TEST_SUITE_P(AllModes, SimulationTest, testing::Range(0u, 6u),
                         [](const testing::TestParamInfo<uint32_t>& info) {
                             return "mode" + std::to_string(info.param);
                         });

TEST(SimulationInterruptTest, stopsEarlyAndKeepsWhatItRecorded) {
    Options options = shortRun(0);
    options.durationSec = 30;
    options.reference = true;
    Simulation simulation(options, {}, nullptr);
    std::atomic<bool> interrupted{false};
    std::thread interrupter([&] {
        std::this_thread::sleep_for(300ms);
        interrupted = true;
    });
    const auto start = steady_clock::now();
    const SimulationResult result = simulation.run(interrupted, nullptr);
    interrupter.join();
    EXPECT_LT(steady_clock::now() - start, 2s);
    EXPECT_TRUE(result.interrupted);
    EXPECT_GE(result.run.refreshes.size(), 5u);
    ASSERT_TRUE(result.reference.has_value());
    EXPECT_EQ(2u, result.reference->mode);
}

}  // namespace
}  // namespace verolux::sim
