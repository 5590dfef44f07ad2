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

Options shortRun(uint32_t mode) {
    Options options;
    options.mode = mode;
    options.durationSec = 0.8;
    options.reference = false;
    options.slots = mode == 1 ? 5 : 3;  // the fill-in picker keeps four frames queued
    return options;
}

// The reference host driving the engine as a compositor does, in each mode, for under a second.
class SimulationTest : public testing::TestWithParam<uint32_t> {};

TEST_P(SimulationTest, composesEveryRefreshAndHandsEveryBufferBack) {
    const auto start = steady_clock::now();
    const Recording run = Simulation(shortRun(GetParam()), {}, nullptr).run(false, nullptr).run;
    EXPECT_LT(steady_clock::now() - start, 1500ms);  // tear-down included
    ASSERT_GE(run.refreshes.size(), 40u);            // 48 at 60 Hz, less what a busy machine drops
    ASSERT_GE(run.frames.size(), 15u);
    // Once the game's first frame is ready, the layer always shows a picture.
    for (const RefreshRecord& refresh : run.refreshes)
        EXPECT_TRUE(refresh.vsyncTime < run.startTime + 100'000'000 || refresh.contentTime >= 0)
                << "refresh " << refresh.index;
    for (const FrameRecord& frame : run.frames)
        EXPECT_TRUE(frame.queueTime >= 0 && frame.releaseTime >= frame.queueTime) << frame.number;

    std::stringstream csv;  // a header and a row per refresh, 11 cells each
    writeRefreshCsv(run, csv);
    size_t lines = 0;
    for (std::string line; std::getline(csv, line); lines++)
        EXPECT_EQ(10, std::count(line.begin(), line.end(), ',')) << line;
    EXPECT_EQ(run.refreshes.size() + 1, lines);

    std::istringstream text(Json::writeString(Json::StreamWriterBuilder(), buildTrace(run)));
    Json::Value trace;
    std::string errors;
    ASSERT_TRUE(Json::parseFromStream(Json::CharReaderBuilder(), text, &trace, &errors)) << errors;
    EXPECT_GT(trace["traceEvents"].size(), run.refreshes.size());
}

INSTANTIATE_TEST_SUITE_P(AllModes, SimulationTest, testing::Range(0u, 6u));

TEST(SimulationInterruptTest, stopsEarlyAndKeepsWhatItRecorded) {
    Options options = shortRun(0);
    options.durationSec = 30;
    options.reference = true;
    std::atomic<bool> interrupted{false};
    std::thread interrupter([&] {
        std::this_thread::sleep_for(300ms);
        interrupted = true;
    });
    const auto start = steady_clock::now();
    const SimulationResult result = Simulation(options, {}, nullptr).run(interrupted, nullptr);
    interrupter.join();
    EXPECT_LT(steady_clock::now() - start, 2s);
    EXPECT_TRUE(result.interrupted);
    EXPECT_GE(result.run.refreshes.size(), 5u);
    ASSERT_TRUE(result.reference.has_value());
    EXPECT_EQ(2u, result.reference->mode);
}

}  // namespace
}  // namespace verolux::sim
