#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/json.h>
#include <png.h>
#include <unistd.h>

#include <cstdio>
#include <sstream>

#include "sim/CsvWriter.h"
#include "sim/SpaceTimeWindow.h"
#include "sim/Summary.h"
#include "sim/TraceWriter.h"
#include "support/Records.h"

namespace verolux::sim {
namespace {

constexpr nsecs_t MS = 1'000'000;
constexpr nsecs_t HZ120 = 8'333'333;

using test::refreshAt;

TEST(CsvTest, framesRefreshesAndPresentMonRowsHaveTheirColumns) {
    FrameRecord f;
    f.number = 7;
    f.startTime = 1000 + 1 * MS;
    f.dequeueTime = 1000 + 3 * MS;
    f.queueTime = 1000 + 10 * MS;
    f.renderDoneTime = 1000 + 14 * MS;
    f.acquireTime = 1000 + 15 * MS;
    f.firstPresentTime = 1000 + 30 * MS;
    f.lastPresentTime = 1000 + 40 * MS;
    f.releaseTime = 1000 + 45 * MS;
    FrameRecord dropped;
    dropped.number = 8;
    dropped.queueTime = 1000 + 26 * MS;

    std::ostringstream frames, refreshes, presentMon;
    FramesCsv(frames, 1000).onFrame(f);
    PresentMonCsv monitor(presentMon, 1000, "verolux-sim-run", 10001);
    monitor.onFrame(f);
    monitor.onFrame(dropped);
    RefreshRecord r = refreshAt(3, HZ120, Picture::BLEND, 1000 + 20 * MS);
    r.items[r.itemCount++] = {7, 1.0f, 0.75f};
    r.items[r.itemCount++] = {8, 0.25f, 0.25f};
    r.delay = 64 * MS;
    r.cpuTime = 35'000;
    r.clientComposed = true;
    r.refreshRate = 120;
    r.gameRateLimit = 45;
    r.gameRateLimitApplied = true;
    RefreshesCsv(refreshes, 0).onRefresh(r);

    EXPECT_EQ(
            "frame,start_ns,queue_ns,render_done_ns,acquire_ns,first_present_ns,"
            "last_present_ns,release_ns,dropped\n"
            "7,1000000,10000000,14000000,15000000,30000000,40000000,45000000,0\n",
            frames.str());
    EXPECT_EQ(
            "refresh,vsync_ns,present_ns,picture,frame0,alpha0,frame1,alpha1,content_ns,"
            "delay_ns,cpu_ns,refused,client,refresh_hz,game_limit_fps\n"
            "3,24999999,33333332,blend,7,1,8,0.25,20001000,64000000,35000,0,1,120,45\n",
            refreshes.str());
    EXPECT_EQ(
            "Application,ProcessID,SwapChainAddress,Runtime,SyncInterval,PresentFlags,Dropped,"
            "TimeInSeconds,MsBetweenPresents,MsInPresentAPI,MsUntilRenderComplete,"
            "MsUntilDisplayed,MsBetweenDisplayChange\n"
            "verolux-sim-run,10001,0x2711,Other,1,0,0,0.010000,0.000,2.000,4.000,20.000,0.000\n"
            "verolux-sim-run,10001,0x2711,Other,1,0,1,0.026000,16.000,0.000,0.000,0.000,0.000\n",
            presentMon.str());
}

TEST(TraceTest, streamsAValidTraceWithPictureSlicesCountersAndOptions) {
    std::ostringstream out;
    Json::Value options;
    options["mode"] = "0 retime";
    {
        TraceWriter trace(out, 0, options);
        RecordSink& layer = trace.addLayer(1, "run: mode 0 retime", HZ120);
        RefreshRecord r = refreshAt(0, HZ120, Picture::BLEND, 1 * MS);
        r.items[r.itemCount++] = {3, 1.0f, 0.5f};
        r.items[r.itemCount++] = {4, 0.5f, 0.5f};
        r.refreshRate = 120;
        r.gameRateLimit = 45;
        r.gameRateLimitApplied = true;
        layer.onRefresh(r);
        RefreshRecord refused = refreshAt(1, HZ120, Picture::HELD, 1 * MS);
        refused.refused = true;
        refused.refreshRate = 120;
        refused.gameRateLimit = 45;
        refused.gameRateLimitApplied = true;
        layer.onRefresh(refused);
        layer.onWarning({5 * MS, 0, 0, false, 29});
        layer.onDelayChange(0, 64 * MS);
        FrameRecord f;
        f.number = 3;
        f.slot = 1;
        f.startTime = 0;
        f.dequeueTime = 2 * MS;
        f.queueTime = 3 * MS;
        f.releaseTime = 20 * MS;
        layer.onFrame(f);
    }  // the writer ends the file
    Json::Value parsed;
    std::istringstream in(out.str());
    ASSERT_TRUE(Json::parseFromStream(Json::CharReaderBuilder(), in, &parsed, nullptr));
    EXPECT_EQ("0 retime", parsed["metadata"]["mode"].asString());
    std::vector<std::string> names;
    for (const Json::Value& e : parsed["traceEvents"]) {
        if (e["ph"] != "M") names.push_back(e["ph"].asString() + " " + e["name"].asString());
        if (e["name"] == "blend") {
            EXPECT_EQ(4u, e["args"]["frames"][1].asUInt64());
            EXPECT_EQ(0.5, e["args"]["weights"][1].asDouble());
            EXPECT_NEAR(8333.333, e["ts"].asDouble(), 0.001);  // at the present, in us
        }
    }
    EXPECT_THAT(names,
                testing::ElementsAre("X blend", "C queue length", "C content age",
                                     "C detected refresh rate", "C game-rate limit", "X held",
                                     "C queue length", "C content age", "i refused presentation",
                                     "i watchdog warning", "C display delay", "X wait for buffer",
                                     "X draw", "X frame 3"));
}

TEST(SpaceTimeWindowTest, keepsTheWindowOrTheLastStretchOfAShorterRun) {
    const std::string path = testing::TempDir() + "verolux-" + std::to_string(getpid()) + ".png";
    auto rowsOf = [&](SpaceTimeWindow& window) {
        for (uint64_t i = 0; i < 10; i++) {
            RefreshRecord r = refreshAt(i, 10, Picture::NEW, 0);
            r.scanline = {static_cast<uint8_t>(i), 0, 0, 9, 9, 9};
            window.onRefresh(r);
        }
        EXPECT_TRUE(window.writePng(path).ok());
        png_image image{};
        image.version = PNG_IMAGE_VERSION;
        EXPECT_TRUE(png_image_begin_read_from_file(&image, path.c_str()));
        image.format = PNG_FORMAT_RGB;
        std::vector<uint8_t> rgb(PNG_IMAGE_SIZE(image));
        EXPECT_TRUE(png_image_finish_read(&image, nullptr, rgb.data(), 0, nullptr));
        std::remove(path.c_str());
        std::vector<int> firstPixels;
        for (size_t y = 0; y < image.height; y++)
            firstPixels.push_back(rgb[y * 6]);
        return firstPixels;
    };
    // Presents at 10, 20, ... 100: the window [35, 65) holds refreshes 3 to 5.
    SpaceTimeWindow window(35, 65, 100);
    EXPECT_THAT(rowsOf(window), testing::ElementsAre(3, 4, 5));
    SpaceTimeWindow late(500, 530, 100);
    EXPECT_THAT(rowsOf(late), testing::ElementsAre(7, 8, 9));
}

TEST(SummaryTest, findingsSayWhetherMotionGotSmootherAndWhatItCost) {
    Summary run, reference;
    run.facts = {"run", 0, 10, 14, false, 14 * 8 * 1024 * 1024, "1920x1080", 76.8};
    reference.facts = {"reference", 2, 10, 3, false, 3 * 8 * 1024 * 1024, "1920x1080", 76.8};
    run.measured.errorP95Ms = 4.5;
    reference.measured.errorP95Ms = 8.3;
    run.measured.latencyP50Ms = 69.5;
    reference.measured.latencyP50Ms = 16.5;
    run.measured.gameFps.average = 76.8;
    reference.measured.gameFps.average = 30.0;  // held back
    reference.measured.bufferWaitMs = 1234;
    reference.measured.skippedVsyncs = 2;
    EXPECT_THAT(
            findings(run, &reference),
            testing::ElementsAre(
                    "Motion: smoother than without interpolation: 95 % of refreshes within 4.50 "
                    "ms of even motion, against 8.30 ms in mode 2; 0 stutters against 0.",
                    "Cost: +53.0 ms of latency at the median (69.5 against 16.5 ms from queue to "
                    "screen); +88.0 MiB of buffers (14 against 3).",
                    "Warning: reference: the game was held back to 30.0 fps against its own 76.8 "
                    "fps; it waited 1234 ms for a free buffer (raise --slots or queueSize).",
                    "Warning: reference: the simulated display skipped 2 vsyncs: the host fell "
                    "behind real time, so these measures are not what a device would show."));
    EXPECT_THAT(formatSummary(run), testing::HasSubstr("  buffers                               "
                                                       "14, 112.0 MiB at 1920x1080\n"));

    Summary copy = run;
    copy.facts.role = "run-2";
    copy.measured.pictures = {900, 300, 0, 0};
    copy.measured.latencyP99Ms = 80.25;
    copy.measured.skippedVsyncs = 3;
    copy.measured.warningCount = 1;
    copy.measured.interpolatedAtAll = true;
    EXPECT_EQ(
            "Copies of the run (the same game and mode, each a layer of its own):\n"
            "  run-2: animation error p95 4.50 ms, new pictures 120.0 per second, latency p50 / "
            "p99 69.50 / 80.25 ms, stutters 0, vsyncs skipped 3, warnings 1, interpolation on "
            "throughout\n",
            formatCopies({copy}));
    EXPECT_EQ("", formatCopies({}));
}

}  // namespace
}  // namespace verolux::sim
