#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/json.h>

#include <filesystem>
#include <fstream>
#include <map>

#include "sim/TraceWriter.h"

namespace verolux::sim {
namespace {

using testing::ElementsAre;

constexpr nsecs_t MS = 1'000'000;
constexpr nsecs_t START = 7000 * MS;

// Two refreshes 16.5 ms apart; frame 1 in slot 2 from queue at 1 ms to release at 40 ms, frame 2
// without a slot and never released; one delay change.
Recording smallRun(uint32_t mode) {
    Recording r;
    r.mode = mode;
    r.layerName = "game";
    r.refreshPeriod = 16'500'000;
    r.startTime = START;
    r.endTime = START + 50 * MS;
    // number, slot, content, dequeue, queue, render done, acquire, release, first display
    r.frames = {{1, 2, -1, -1, START + 1 * MS, START + 5 * MS, START + 6 * MS, START + 40 * MS,
                 START + 10 * MS},
                {2, -1, -1, -1, START + 20 * MS}};
    // index, vsync, display time, kind, items
    r.refreshes = {{0, START + 10 * MS, -1, 64, {{1, 1.0f, 0, 1.0f}}},
                   {1, START + 26'500'000, -1, 8, {{1, 1.0f, 0, 0.75f}, {2, 0.25f, 0, 0.25f}}}};
    r.delayChanges = {{START + 2 * MS, 64 * MS}};
    return r;
}

TEST(TraceWriterTest, theFileParsesBackWithEveryKindOfEventForBothRuns) {
    const auto dir = std::filesystem::temp_directory_path() / "verolux-trace-test";
    std::filesystem::create_directories(dir);
    const std::string path = (dir / "trace.json").string();
    const Recording run = smallRun(0);
    const Recording reference = smallRun(2);
    ASSERT_TRUE(writeTraceFile(path, run, &reference).ok());

    Json::Value trace;
    std::ifstream in(path);
    std::string errors;
    ASSERT_TRUE(Json::parseFromStream(Json::CharReaderBuilder(), in, &trace, &errors)) << errors;
    std::filesystem::remove_all(dir);

    EXPECT_EQ("ms", trace["displayTimeUnit"].asString());
    std::map<int, std::vector<std::string>> names;  // "ph name" per pid, in file order
    const Json::Value* frameSlice = nullptr;
    const Json::Value* blend = nullptr;
    for (const Json::Value& e : trace["traceEvents"]) {
        std::string name = e["name"].asString();
        if (name == "thread_name" || name == "process_name")
            name += "=" + e["args"]["name"].asString();
        if (e["ph"] != "M" || name.find('=') != std::string::npos) {
            names[e["pid"].asInt()].push_back(e["ph"].asString() + " " + name);
        }
        if (e["pid"] == 1 && name == "frame 1") frameSlice = &e;
        if (e["pid"] == 1 && name == "blend 1+2") blend = &e;
    }
    EXPECT_THAT(names[1],
                ElementsAre("M process_name=run: mode 0 game", "M thread_name=display",
                            "M thread_name=composition", "M thread_name=frames without a slot",
                            "M thread_name=slot 2", "i vsync", "X new 1", "i vsync", "X blend 1+2",
                            "X frame 1", "i render done", "i acquire", "i first display",
                            "b frame 2", "e frame 2", "C display delay"));
    EXPECT_EQ("M process_name=reference: mode 2 game", names[2].front());
    EXPECT_EQ(names[1].size(), names[2].size());

    // Microseconds from the start of the run; the slot's thread is 10 + slot.
    ASSERT_NE(nullptr, frameSlice);
    EXPECT_EQ(1000.0, (*frameSlice)["ts"].asDouble());
    EXPECT_EQ(39000.0, (*frameSlice)["dur"].asDouble());
    EXPECT_EQ(12, (*frameSlice)["tid"].asInt());
    EXPECT_EQ(9.0, (*frameSlice)["args"]["latency_ms"].asDouble());
    // The last refresh lasts one period.
    ASSERT_NE(nullptr, blend);
    EXPECT_EQ(26500.0, (*blend)["ts"].asDouble());
    EXPECT_EQ(16500.0, (*blend)["dur"].asDouble());
    EXPECT_EQ(8, (*blend)["args"]["kind"].asInt());
    const Json::Value& frames = (*blend)["args"]["frames"];
    ASSERT_EQ(2u, frames.size());
    EXPECT_EQ(1u, frames[0].asUInt64());
    EXPECT_EQ(2u, frames[1].asUInt64());
    EXPECT_EQ(0.25, (*blend)["args"]["alphas"][1].asDouble());
}

}  // namespace
}  // namespace verolux::sim
