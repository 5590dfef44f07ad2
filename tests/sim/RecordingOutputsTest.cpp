#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/json.h>
#include <png.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <map>
#include <sstream>

#include "sim/CsvWriter.h"
#include "sim/PngWriter.h"
#include "sim/Summary.h"
#include "sim/TraceWriter.h"

namespace verolux::sim {
namespace {

constexpr nsecs_t MS = 1'000'000;

// Milliseconds from the start of the hand-made run.
constexpr nsecs_t at(nsecs_t ms) {
    return 1000 * MS + ms * MS;
}

// One second of a game in mode 0: frame 1 in slot 2 from queue to release, frame 2 without a slot
// and never released, frame 3 only dequeued; frames 1 and 2 first shown 200 and 150 ms after their
// queue time. Refreshes 100 ms apart of kinds new, blend, repeat, none and new showing content
// 100, 110, 130, nothing and 130 ms; three delay changes.
Recording handMade() {
    Recording r;
    r.layerName = "game";
    r.refreshPeriod = 16'500'000;
    r.startTime = at(0);
    r.endTime = at(1000);
    r.frames = {{1, 2, -1, -1, at(5), at(9), at(11), at(225), at(205)},
                {2, -1, -1, -1, at(105), -1, -1, -1, at(255)},
                {3}};
    // index, vsync, display time, kind, items, content, delay, CPU
    r.refreshes = {{0, at(100), -1, 64, {{1, 1.0f}}, at(100), -1, 10'000},
                   {1, at(200), at(190), 8, {{1, 1.0f}, {2, 0.25f}}, at(110), 1'234'567, 20'000},
                   {2, at(300), -1, 16, {{2, 1.0f}}, at(130), -1, 30'000},
                   {3, at(400), -1, 0, {}, -1, -1, 40'000},
                   {4, at(500), -1, 64, {{2, 1.0f}}, at(130), -1, 100'000}};
    r.delayChanges = {{at(0), 64 * MS}, {at(500), 60 * MS}, {at(900), 58 * MS}};
    r.scanlineWidth = 2;
    for (uint8_t y = 0; y < 5; y++)
        r.scanlines.push_back({y, 1, 200, y, 2, 200});
    return r;
}

// Mode 2, not timed: one repeat refresh, carrying its delay, with a 1-pixel scanline of 2.
Recording reference() {
    Recording r;
    r.mode = 2;
    r.scanlineWidth = 2;
    r.refreshes.push_back({0, -1, -1, 16, {}, -1, 32 * MS, 0});
    r.scanlines = {{1, 2, 3}};
    return r;
}

TEST(RecordingOutputsTest, summaryPrintsTheRunAndTheReferenceSideBySide) {
    const Summary ref = summarize(reference());
    EXPECT_EQ(
            "                                  run (mode 0)               reference (mode 2)\n"
            "run length                        1.000 s                    n/a\n"
            "game fps (frames queued)          2.00                       n/a\n"
            "displayed fps (new pictures)      3.00                       n/a\n"
            "refreshes                         5                          1\n"
            "blended (kind 8)                  20.0 %                     0.0 %\n"
            "repeated (kind 16)                20.0 %                     100.0 %\n"
            "new frame (kind 64)               40.0 %                     0.0 %\n"
            "no state                          20.0 %                     0.0 %\n"
            "display delay at start            64.0 ms                    32.0 ms\n"
            "display delay at end              58.0 ms (3 changes)        32.0 ms (0 changes)\n"
            "latency queue to display p50      150.00 ms (2 frames)       n/a (0 frames)\n"
            "latency queue to display p99      200.00 ms                  n/a\n"
            "judder (content step deviation)   5.000 ms                   n/a\n"
            "mean content step                 15.000 ms                  n/a\n"
            "library CPU per refresh, mean     40.0 us                    0.0 us\n"
            "library CPU per refresh, p99      100.0 us                   0.0 us\n",
            formatSummary(summarize(handMade()), &ref));
    EXPECT_THAT(formatSummary(summarize(handMade())),
                testing::StartsWith("                                  run (mode 0)\n"
                                    "run length                        1.000 s\n"));
}

TEST(RecordingOutputsTest, csvHasTheHeaderThenOneRowPerRefreshWithEmptyCellsForWhatIsAbsent) {
    std::ostringstream out;
    writeRefreshCsv(handMade(), out);
    EXPECT_EQ(
            "index,vsync_ns,display_time_ns,kind,frame0,alpha0,frame1,alpha1,content_ms,"
            "delay_ms,cpu_us\n"
            "0,100000000,,64,1,1,,,100.000,,10.000\n"
            "1,200000000,190000000,8,1,1,2,0.25,110.000,1.235,20.000\n"
            "2,300000000,,16,2,1,,,130.000,,30.000\n"
            "3,400000000,,,,,,,,,40.000\n"
            "4,500000000,,64,2,1,,,130.000,,100.000\n",
            out.str());
    EXPECT_EQ("verolux-sim: cannot write /nonexistent/r.csv: No such file or directory",
              writeRefreshCsvFile(handMade(), "/nonexistent/r.csv").error);
}

TEST(RecordingOutputsTest, traceParsesBackWithEveryKindOfEventForBothRuns) {
    const std::string path = testing::TempDir() + "verolux-" + std::to_string(getpid()) + ".json";
    const Recording ref = reference();
    ASSERT_TRUE(writeTraceFile(path, handMade(), &ref).ok());
    Json::Value trace;
    std::ifstream(path) >> trace;
    std::remove(path.c_str());

    EXPECT_EQ("ms", trace["displayTimeUnit"].asString());
    // "ph name ts+dur" per pid in file order, microseconds from the start of the run.
    std::map<int, std::vector<std::string>> events;
    std::map<std::string, Json::Value> run;  // the run's events by name
    for (const Json::Value& e : trace["traceEvents"]) {
        std::string text = e["ph"].asString() + " " + e["name"].asString() + " ";
        text += e["ph"] == "M" ? e["args"]["name"].asString() : std::to_string(e["ts"].asInt64());
        if (e.isMember("dur")) text += "+" + std::to_string(e["dur"].asInt64());
        if (text.find("sort_index") == std::string::npos) events[e["pid"].asInt()].push_back(text);
        if (e["pid"] == 1) run[e["name"].asString()] = e;
    }
    // A refresh lasts until the next vsync, the last one period; an unreleased frame to the end.
    EXPECT_THAT(events[1],
                testing::ElementsAre(
                        "M process_name run: mode 0 game", "M thread_name display",
                        "M thread_name composition", "M thread_name frames without a slot",
                        "M thread_name slot 2", "i vsync 100000", "X new 1 100000+100000",
                        "i vsync 200000", "X blend 1+2 200000+100000", "i vsync 300000",
                        "X repeat 2 300000+100000", "i vsync 400000", "X no state 400000+100000",
                        "i vsync 500000", "X new 2 500000+16500", "X frame 1 5000+220000",
                        "i render done 9000", "i acquire 11000", "i first display 205000",
                        "b frame 2 105000", "e frame 2 1000000", "n first display 255000",
                        "C display delay 0", "C display delay 500000", "C display delay 900000"));
    EXPECT_THAT(events[2],
                testing::ElementsAre("M process_name reference: mode 2", "M thread_name display",
                                     "M thread_name composition"));
    EXPECT_EQ(12, run["frame 1"]["tid"].asInt());  // 10 + slot
    EXPECT_EQ(200.0, run["frame 1"]["args"]["latency_ms"].asDouble());
    const Json::Value& blend = run["blend 1+2"]["args"];
    EXPECT_EQ(8, blend["kind"].asInt());
    EXPECT_EQ(1u, blend["frames"][0].asUInt64());
    EXPECT_EQ(2u, blend["frames"][1].asUInt64());
    EXPECT_EQ(0.25, blend["alphas"][1].asDouble());
}

// The picture at `path` read back by libpng as RGB, after checking its size; then removed.
std::vector<uint8_t> decode(const std::string& path, uint32_t width, uint32_t height) {
    png_image image{};
    image.version = PNG_IMAGE_VERSION;
    EXPECT_TRUE(png_image_begin_read_from_file(&image, path.c_str()));
    EXPECT_EQ(std::pair(width, height), std::pair(image.width, image.height));
    image.format = PNG_FORMAT_RGB;
    std::vector<uint8_t> rgb(PNG_IMAGE_SIZE(image));
    EXPECT_TRUE(png_image_finish_read(&image, nullptr, rgb.data(), 0, nullptr));
    std::remove(path.c_str());
    return rgb;
}

TEST(RecordingOutputsTest, pictureHasBothRunsSideBySideWithKindMarginsAndPadding) {
    const std::string path = testing::TempDir() + "verolux-" + std::to_string(getpid()) + ".png";
    const Recording run = handMade();
    const Recording ref = reference();
    ASSERT_TRUE(writeSpaceTimePng(path, run, &ref).ok());
    // 4 margin + 2 run + 4 separator + 4 margin + 2 reference; rows up to the longer run.
    const std::vector<uint8_t> rgb = decode(path, 16, 5);
    ASSERT_EQ(16u * 5 * 3, rgb.size());
    using Pixel = std::vector<int>;
    const auto at = [&](size_t x, size_t y) {
        const uint8_t* p = &rgb[(y * 16 + x) * 3];
        return Pixel{p[0], p[1], p[2]};
    };
    EXPECT_EQ((Pixel{40, 200, 70}), at(0, 0));     // new picture
    EXPECT_EQ((Pixel{40, 110, 255}), at(3, 1));    // blend
    EXPECT_EQ((Pixel{230, 40, 40}), at(0, 2));     // repeat
    EXPECT_EQ((Pixel{0, 0, 0}), at(0, 3));         // no state
    EXPECT_EQ((Pixel{2, 2, 200}), at(5, 2));       // the run's scanline
    EXPECT_EQ((Pixel{255, 255, 255}), at(9, 0));   // separator
    EXPECT_EQ((Pixel{230, 40, 40}), at(10, 0));    // the reference's repeat
    EXPECT_EQ((Pixel{1, 2, 3}), at(14, 0));        // its scanline
    EXPECT_EQ((Pixel{128, 128, 128}), at(15, 0));  // past a short scanline
    EXPECT_EQ((Pixel{128, 128, 128}), at(10, 1));  // past the reference's end

    ASSERT_TRUE(writeSpaceTimePng(path, run).ok());
    decode(path, 6, 5);
    EXPECT_EQ("verolux-sim: cannot draw x.png: no refreshes recorded",
              writeSpaceTimePng("x.png", Recording()).error);
}

}  // namespace
}  // namespace verolux::sim
