#pragma once

#include <atomic>
#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include "host/BufferCount.h"
#include "host/SettingsMessage.h"
#include "sim/Capture.h"
#include "sim/Options.h"
#include "sim/Recording.h"

namespace verolux::sim {

class Compositor;
struct Scenario;

// A simulated layer as planned: the game in the chosen mode, the same game in mode 2 beside it,
// or another copy of the game in the chosen mode.
struct LayerPlan {
    std::string role;  // "run", "reference", or "run-2" and on for the copies
    std::string name;  // the layer's name in the library's log lines and dumps
    uint32_t uid = 0;
    uint32_t mode = 0;
    host::BufferCount buffers;
};

struct RunResult {
    nsecs_t endTime = -1;
    double displayHz = 0;  // the display's refresh rate at the end
    bool interrupted = false;
    bool captureEnded = false;
    double wallSeconds = 0;  // how long the run took on the wall clock
    // Every layer's dump at the end of the run, before tear-down; in simulated time with its
    // object addresses written as "(address)".
    std::string dump;
    // Every layer's ring log as its parcel carries it, one after the other, read at the same time.
    std::vector<uint8_t> ringLogs;
};

// One run of verolux-sim: the game and, unless left out, the same game (same seed or capture) in
// mode 2 beside it, then the game's further copies (--layers), on one display, each through the
// reference host. The records of each layer go to its sink from the calling thread.
//
// In real time the game, the display, the GPU and each layer's release side run on threads of
// their own, and the calling thread hands the records on between their work. In simulated time
// the calling thread plays every event in time order (a frame's start, its rendering done, a
// vsync and its composition, a release decision, a reading of the warnings) with the process's
// clock (ClockOverride) set to each event's time, from SIMULATED_CLOCK_START on; no thread is
// started and nothing waits. Layers release through LayerHost::stepRelease(), the same decisions
// as the release thread's. A scenario's changes are events of that queue too: the display's rate,
// bursts of client composition, settings delivered to every layer's game; its game segments
// change the game as it plays (GameScript). Scenarios play in simulated time only.
//
// Several runs may follow one another in one process, each as if it were the first: a run resets
// the library's process-wide state that it would otherwise inherit from the one before (its uids'
// settings and warnings, the process-wide tunables). Simulated runs cannot overlap: the clock is
// the process's.
class Simulation {
public:
    static constexpr uint32_t GAME_UID = 10'001;
    static constexpr uint32_t REFERENCE_UID = 10'002;
    // Copy n (from 2) of the game takes the uid 10'001 + n, after the reference's.
    static constexpr uint32_t copyUid(uint32_t copy) { return GAME_UID + copy; }
    static constexpr uint32_t BUFFER_HEIGHT = 4;
    // After the capture's last frame, long enough for it to reach the screen.
    static constexpr nsecs_t CAPTURE_TAIL = 250'000'000;
    // The monotonic clock when a simulated run begins, and the wall clock (ms since the epoch) at
    // its startTime(): midnight UTC, 1 January 2024, so that a warning's time of day is its time
    // in the run.
    static constexpr nsecs_t SIMULATED_CLOCK_START = 100'000'000'000;
    static constexpr int64_t SIMULATED_WALL_CLOCK_AT_START_MS = 1'704'067'200'000;

    // Delivers the settings to the layers' uids and plans the layers; the run starts a moment
    // later, at startTime(). Unless the settings set gameFpsLimit, it is the refresh rate, so that
    // the layers are interpolated.
    Simulation(const Options& options, std::vector<host::SettingValue> settings,
               const Capture* capture, const Scenario* scenario = nullptr);

    const std::vector<LayerPlan>& layers() const { return mLayers; }
    nsecs_t refreshPeriod() const { return mRefreshPeriod; }
    nsecs_t startTime() const { return mStartTime; }
    // The display delay frames start with in the game's layer, or -1 when it applies none.
    nsecs_t initialDelay() const { return mInitialDelay; }

    // Runs until the duration has passed, the capture has ended or `interrupted` is set; sinks
    // holds one per layer. Progress lines go to `progress` when it is not null: every second of
    // the run in real time, every second of wall-clock time in simulated time. As the settings
    // client does, it reads each layer's watchdog warnings back as they come and hands them to
    // the layer's sink. Call it once.
    RunResult run(const std::vector<RecordSink*>& sinks, const std::atomic<bool>& interrupted,
                  std::ostream* progress);

private:
    struct Layer;
    class SimulatedTimeLoop;

    // The end of a run of the given duration, or the largest time when it lasts until the
    // capture ends.
    nsecs_t plannedEnd() const;
    double plannedSeconds() const;
    // The game, the display and the release sides on threads, until the run is over.
    void runInRealTime(std::vector<std::unique_ptr<Layer>>& layers, Compositor& compositor,
                       const std::vector<RecordSink*>& sinks, const std::atomic<bool>& interrupted,
                       std::ostream* progress, RunResult& result);
    void readWarnings(Layer& layer);

    const Options mOptions;
    const Capture* const mCapture;
    const Scenario* const mScenario;
    const nsecs_t mRefreshPeriod;
    std::vector<LayerPlan> mLayers;
    nsecs_t mInitialDelay = -1;
    nsecs_t mStartTime = 0;
    int64_t mStartWallMs = 0;  // the wall-clock time at startTime, which warnings carry
};

}  // namespace verolux::sim
