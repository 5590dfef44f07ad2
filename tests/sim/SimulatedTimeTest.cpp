#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>

#include "sim/EventQueue.h"
#include "sim/FolderRun.h"
#include "sim/Measures.h"
#include "sim/SettingsKeys.h"
#include "sim/Simulation.h"

namespace verolux::sim {
namespace {

namespace fs = std::filesystem;

TEST(EventQueueTest, playsEventsByTimeAndThoseDueTogetherInTheOrderPushed) {
    EventQueue<char> events;
    for (auto [time, name] : {std::pair{30, 'a'}, {10, 'b'}, {30, 'c'}, {20, 'd'}, {10, 'e'}})
        events.push(time, name);
    std::string played;
    while (!events.empty())
        played += events.pop().second;
    EXPECT_EQ("bedac", played);
}

// The measures of one layer, how many frames its queue held after each composition, and how long
// the engine held each frame from its queueing to its release.
struct Measured : RecordSink {
    explicit Measured(nsecs_t period) : measures(period) {}
    void onFrame(const FrameRecord& frame) override {
        measures.onFrame(frame);
        if (frame.queueTime < 0 || frame.releaseTime < 0) return;
        held += frame.releaseTime - frame.queueTime;
        released++;
    }
    void onRefresh(const RefreshRecord& refresh) override {
        measures.onRefresh(refresh);
        queued += refresh.queueLength;
    }
    void onDelayChange(nsecs_t time, nsecs_t delay) override {
        measures.onDelayChange(time, delay);
    }
    double meanQueueLength() const {
        const uint64_t refreshes = measures.result().refreshes;
        return refreshes > 0 ? static_cast<double>(queued) / refreshes : 0;
    }

    double meanHeldMs() const { return released > 0 ? held / 1e6 / released : 0; }

    Measures measures;
    uint64_t queued = 0;
    nsecs_t held = 0;
    uint64_t released = 0;
};

struct AgreementCase {
    uint32_t mode;
    const char* capture = nullptr;  // under sim/captures, or null for a generated game
    const char* setting = nullptr;  // key=value, or null for the defaults
};

std::ostream& operator<<(std::ostream& out, const AgreementCase& c) {
    return out << "mode " << c.mode << (c.capture != nullptr ? " on a capture" : "") << " "
               << (c.setting != nullptr ? c.setting : "");
}

class TimeAgreementTest : public testing::TestWithParam<AgreementCase> {
protected:
    // Under a second of play each way: the real-time run's noise sets the bounds below.
    Options options(TimeMode time) const {
        Options o;
        o.time = time;
        o.mode = GetParam().mode;
        o.hz = 120;
        o.fps = 50;
        o.durationSec = 0.6;
        o.durationGiven = true;
        o.reference = false;
        return o;
    }

    Measured run(TimeMode time) {
        std::optional<Capture> capture;
        if (GetParam().capture != nullptr) {
            Result<Capture> read = readCapture(std::string(VEROLUX_SOURCE_DIR "/sim/captures/") +
                                               GetParam().capture);
            EXPECT_TRUE(read.ok()) << read.error;
            capture = std::move(read.value);
        }
        std::vector<host::SettingValue> settings;
        if (GetParam().setting != nullptr) {
            settings.push_back(parseSettingAssignment(GetParam().setting).value);
        }
        Simulation simulation(options(time), settings, capture ? &*capture : nullptr);
        Measured measured(simulation.refreshPeriod());
        simulation.run({&measured}, false, nullptr);
        return measured;
    }
};

// Both times play the same game through the same host and decisions, the release side stepped in
// simulated time and on its thread in real time: what the screen showed, how long frames waited and
// how many the queue held agree within what a loaded machine changes in real time.
TEST_P(TimeAgreementTest, simulatedTimeShowsWhatRealTimeShows) {
    const Measured simulated = run(TimeMode::SIMULATED);
    const Measured real = run(TimeMode::REAL);
    const MeasuredLayer s = simulated.measures.result();
    const MeasuredLayer r = real.measures.result();
    if (r.skippedVsyncs > 2) GTEST_SKIP() << "the real-time run fell behind the display";

    ASSERT_GT(s.refreshes, 60u);
    auto share = [](const MeasuredLayer& m, Picture picture) {
        return static_cast<double>(m.pictures[static_cast<size_t>(picture)]) / m.refreshes;
    };
    for (Picture picture : {Picture::BLEND, Picture::NEW, Picture::REPEAT, Picture::HELD})
        EXPECT_NEAR(share(r, picture), share(s, picture), 0.15) << pictureName(picture);
    EXPECT_NEAR(static_cast<double>(r.framesShown), static_cast<double>(s.framesShown),
                std::max(3.0, 0.15 * r.framesShown));
    ASSERT_TRUE(s.errorP50Ms && s.errorP95Ms && r.errorP50Ms && r.errorP95Ms);
    EXPECT_NEAR(*r.errorP50Ms, *s.errorP50Ms, std::max(2.0, 0.25 * *r.errorP50Ms));
    EXPECT_NEAR(*r.errorP95Ms, *s.errorP95Ms, std::max(3.0, 0.25 * *r.errorP95Ms));
    ASSERT_TRUE(s.latencyP50Ms && r.latencyP50Ms);
    EXPECT_NEAR(*r.latencyP50Ms, *s.latencyP50Ms, std::max(4.0, 0.15 * *r.latencyP50Ms));
    EXPECT_NEAR(real.meanQueueLength(), simulated.meanQueueLength(), 0.75);
    EXPECT_NEAR(real.meanHeldMs(), simulated.meanHeldMs(), std::max(2.0, 0.1 * real.meanHeldMs()));
    EXPECT_EQ(r.startDelayMs, s.startDelayMs);
    if (r.endDelayMs) {
        EXPECT_NEAR(*r.endDelayMs, s.endDelayMs.value_or(-100), 4);
    }
}

INSTANTIATE_TEST_SUITE_P(EveryMode, TimeAgreementTest,
                         testing::Values(AgreementCase{0}, AgreementCase{1}, AgreementCase{2},
                                         AgreementCase{3}, AgreementCase{4}, AgreementCase{5},
                                         // Waits for a time: a release 4 ms before composition.
                                         AgreementCase{3, nullptr, "justInTimeMarginMs=4"},
                                         AgreementCase{0, "stutter30.frames.csv"}));

std::string contents(const fs::path& path) {
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

// Two simulated runs in one process, with a watchdog's warning (its wall-clock stamp) and the
// latency picker's sleeps: every file the same, byte for byte.
TEST(SimulatedTimeTest, twoRunsOfTheSameInputsWriteTheSameFiles) {
    const fs::path base = fs::path(testing::TempDir()) / ("verolux-" + std::to_string(getpid()));
    Options o;
    o.mode = 5;
    o.durationSec = 70;
    o.durationGiven = true;
    o.layers = 2;
    const std::vector<host::SettingValue> settings = {
            parseSettingAssignment("minAcceptableFps=40").value};
    std::vector<std::vector<std::pair<std::string, std::string>>> files;
    for (const char* name : {"first", "second"}) {
        o.outDir = (base / name).string();
        const Result<FolderRun> ran = runIntoFolder(o, settings, nullptr, false, nullptr);
        ASSERT_TRUE(ran.ok()) << ran.error;
        EXPECT_THAT(ran.value.summaryText, testing::HasSubstr("LOW_GAME_FPS"));
        auto& folder = files.emplace_back();
        for (const auto& entry : fs::directory_iterator(o.outDir))
            folder.emplace_back(entry.path().filename().string(), contents(entry.path()));
        std::sort(folder.begin(), folder.end());
    }
    fs::remove_all(base);
    ASSERT_EQ(files[0].size(), files[1].size());
    EXPECT_GE(files[0].size(), 13u);  // every file the run writes, the reference's too
    for (size_t i = 0; i < files[0].size(); i++) {
        EXPECT_EQ(files[0][i].first, files[1][i].first);
        EXPECT_TRUE(files[0][i].second == files[1][i].second) << files[0][i].first << " differs";
    }
}

}  // namespace
}  // namespace verolux::sim
