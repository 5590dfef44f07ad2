#pragma once

#include <atomic>
#include <ostream>
#include <string>
#include <vector>

#include "host/BufferCount.h"
#include "host/SettingsMessage.h"
#include "sim/Capture.h"
#include "sim/Options.h"
#include "sim/Recording.h"

namespace verolux::sim {

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
    bool interrupted = false;
    bool captureEnded = false;
    std::string dump;  // every layer's dump at the end of the run, before tear-down
    // Every layer's ring log as its parcel carries it, one after the other, read at the same time.
    std::vector<uint8_t> ringLogs;
};

// One run of verolux-sim in real time: the game and, unless left out, the same game (same seed
// or capture) in mode 2 beside it, then the game's further copies (--layers), on one display,
// each through the reference host. The records of each layer go to its sink from the calling
// thread, between the real-time threads' work.
class Simulation {
public:
    static constexpr uint32_t GAME_UID = 10'001;
    static constexpr uint32_t REFERENCE_UID = 10'002;
    // Copy n (from 2) of the game takes the uid 10'001 + n, after the reference's.
    static constexpr uint32_t copyUid(uint32_t copy) { return GAME_UID + copy; }
    static constexpr uint32_t BUFFER_HEIGHT = 4;
    // After the capture's last frame, long enough for it to reach the screen.
    static constexpr nsecs_t CAPTURE_TAIL = 250'000'000;

    // Delivers the settings to the layers' uids and plans the layers; the run starts a moment
    // later, at startTime(). Unless the settings set gameFpsLimit, it is the refresh rate, so that
    // the layers are interpolated.
    Simulation(const Options& options, std::vector<host::SettingValue> settings,
               const Capture* capture);

    const std::vector<LayerPlan>& layers() const { return mLayers; }
    nsecs_t refreshPeriod() const { return mRefreshPeriod; }
    nsecs_t startTime() const { return mStartTime; }
    // The display delay frames start with in the game's layer, or -1 when it applies none.
    nsecs_t initialDelay() const { return mInitialDelay; }

    // Runs until the duration has passed, the capture has ended or `interrupted` is set; sinks
    // holds one per layer. Progress lines go to `progress` when it is not null. As the settings
    // client does, it reads each layer's watchdog warnings back as they come and hands them to
    // the layer's sink.
    RunResult run(const std::vector<RecordSink*>& sinks, const std::atomic<bool>& interrupted,
                  std::ostream* progress);

private:
    const Options mOptions;
    const Capture* const mCapture;
    const nsecs_t mRefreshPeriod;
    std::vector<LayerPlan> mLayers;
    nsecs_t mInitialDelay = -1;
    nsecs_t mStartTime = 0;
    int64_t mStartWallMs = 0;  // the wall-clock time at startTime, which warnings carry
};

}  // namespace verolux::sim
