#include "sim/Simulation.h"

#include <chrono>
#include <cmath>
#include <cstdio>
#include <limits>
#include <memory>
#include <thread>

#include <binder/Parcel.h>

#include "SettingsController.h"
#include "Tunables.h"
#include "WatchdogWarningController.h"
#include "host/LayerHost.h"
#include "sim/BufferQueue.h"
#include "sim/Compositor.h"
#include "sim/FenceSignaller.h"
#include "sim/Game.h"
#include "sim/LayerRecorder.h"
#include "sim/RecordQueue.h"
#include "sim/WarningLedger.h"

namespace verolux::sim {

using android::Interpolation::InterpolationMode;

namespace {

constexpr nsecs_t MS = 1'000'000;
constexpr nsecs_t SECOND = 1'000'000'000;
constexpr int32_t GAME_FPS_LIMIT_ID = 0;
constexpr int32_t APPLY_DELAY_TO_FRAMES_ID = 116;
// Enough for the caller to open its outputs before the first vsync.
constexpr nsecs_t START_MARGIN = 250 * MS;
constexpr auto DRAIN_PERIOD = std::chrono::milliseconds(50);

// Everything one simulated layer needs, torn down in the order of its members' destruction.
struct SimulatedLayer {
    SimulatedLayer(const Options& options, const LayerPlan& plan)
        : queue(plan.buffers.count, options.width, Simulation::BUFFER_HEIGHT),
          recorder(new LayerRecorder(plan.uid, records)) {
        host::LayerHost::Config config;
        config.name = android::String8(plan.name.c_str());
        config.uid = plan.uid;
        config.mode = static_cast<InterpolationMode>(plan.mode);
        config.frameListCapacity = plan.buffers.count;
        layerHost =
                std::make_unique<host::LayerHost>(config, [this](const android::FrameItem& frame) {
                    queue.release(frame.mTextureSlot, frame.mIndex);
                    recorder->frameReleased(frame.mIndex, systemTime(SYSTEM_TIME_MONOTONIC));
                });
    }

    RecordQueue records;
    BufferQueue queue;
    const android::sp<LayerRecorder> recorder;
    std::unique_ptr<host::LayerHost> layerHost;
    std::unique_ptr<Game> game;
};

// Reads the uid's warnings back as the settings client does, and records them on the run's clock.
void readWarnings(uint32_t uid, nsecs_t startTime, int64_t startWallMs, LayerRecorder& recorder) {
    android::Parcel parcel;
    android::Interpolation::WatchdogWarningController::writeWarningsToParcel(uid, &parcel);
    parcel.setDataPosition(0);
    DecodedWarnings decoded = decodeWarnings(parcel);
    for (WarningRecord& warning : decoded.warnings) {
        warning.time = warningRunTime(warning.wallMs, startTime, startWallMs);
        recorder.warning(warning);
    }
    if (!decoded.error.empty()) {
        fprintf(stderr, "verolux-sim: the warnings of uid %u: %s\n", uid, decoded.error.c_str());
    }
}

}  // namespace

Simulation::Simulation(const Options& options, std::vector<host::SettingValue> settings,
                       const Capture* capture)
    : mOptions(options),
      mCapture(capture),
      mRefreshPeriod(static_cast<nsecs_t>(std::llround(SECOND / options.hz))) {
    // Interpolation needs the display delay in front of each frame's display time; the user's own
    // settings come after, so they can still turn it off.
    std::vector<host::SettingValue> message;
    if (options.mode == 0) message.push_back({APPLY_DELAY_TO_FRAMES_ID, true});
    message.push_back({GAME_FPS_LIMIT_ID, static_cast<int32_t>(std::lround(options.hz))});
    message.insert(message.end(), settings.begin(), settings.end());

    mLayers.push_back({"run", "game", GAME_UID, options.mode, {}});
    if (options.reference) mLayers.push_back({"reference", "reference", REFERENCE_UID, 2, {}});
    for (uint32_t copy = 2; copy <= options.layers; copy++) {
        const std::string n = std::to_string(copy);
        mLayers.push_back({"run-" + n, "game-" + n, copyUid(copy), options.mode, {}});
    }
    for (LayerPlan& layer : mLayers) {
        host::deliverSettings(layer.uid, message);
        layer.buffers = options.slots > 0
                                ? host::BufferCount{options.slots, true}
                                : host::bufferCountFor(layer.uid,
                                                       static_cast<InterpolationMode>(layer.mode),
                                                       mRefreshPeriod);
    }
    if (options.mode == 0 && android::Interpolation::applyDelayToFrames.load()) {
        mInitialDelay = android::Interpolation::defaultDelay.load() * MS;
    }
    mStartTime = systemTime(SYSTEM_TIME_MONOTONIC) + START_MARGIN;
    timespec wall{};
    clock_gettime(CLOCK_REALTIME, &wall);
    mStartWallMs = int64_t{wall.tv_sec} * 1000 + wall.tv_nsec / MS +
                   (mStartTime - systemTime(SYSTEM_TIME_MONOTONIC)) / MS;
}

RunResult Simulation::run(const std::vector<RecordSink*>& sinks,
                          const std::atomic<bool>& interrupted, std::ostream* progress) {
    std::vector<std::unique_ptr<SimulatedLayer>> layers;
    for (const LayerPlan& plan : mLayers)
        layers.push_back(std::make_unique<SimulatedLayer>(mOptions, plan));
    // The layers' observers subscribed as they were created; this hands them their settings.
    android::Interpolation::SettingsController::getInstance()->notifyChanges();

    FenceSignaller gpu;
    GameConfig gameConfig{mOptions.fps,  mOptions.jitterMs, mOptions.renderMs,
                          mOptions.seed, mCapture,          mOptions.loop};
    std::vector<DisplayedLayer> displayed;
    for (auto& layer : layers) {
        layer->recorder->startListening();
        layer->game = std::make_unique<Game>(gameConfig, layer->queue, *layer->layerHost, gpu,
                                             *layer->recorder);
        displayed.push_back({&layer->queue, layer->layerHost.get(), layer->recorder.get()});
    }
    Compositor compositor(mRefreshPeriod, mOptions.width, displayed,
                          mOptions.clientCompositionShare, mOptions.seed);

    const bool untilCaptureEnds = mCapture != nullptr && !mOptions.durationGiven && !mOptions.loop;
    const nsecs_t end =
            untilCaptureEnds
                    ? std::numeric_limits<nsecs_t>::max()
                    : mStartTime + static_cast<nsecs_t>(std::llround(mOptions.durationSec * SECOND));
    const double expectedSec = untilCaptureEnds ? mCapture->span() / 1e9 : mOptions.durationSec;
    for (size_t i = 0; i < layers.size(); i++) {
        layers[i]->recorder->start(mStartTime, i == 0 ? mInitialDelay : -1);
        layers[i]->layerHost->start();
        layers[i]->game->start(mStartTime);
    }
    compositor.start(mStartTime);

    auto drain = [&] {
        for (size_t i = 0; i < layers.size(); i++) {
            readWarnings(mLayers[i].uid, mStartTime, mStartWallMs, *layers[i]->recorder);
            layers[i]->records.drainInto(*sinks[i]);
        }
    };
    RunResult result;
    nsecs_t nextReport = mStartTime + SECOND;
    while (true) {
        std::this_thread::sleep_for(DRAIN_PERIOD);
        drain();
        const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
        if (interrupted.load()) {
            result.interrupted = true;
            break;
        }
        if (now >= end) break;
        // Every layer plays the same capture; the run is over once all have played it out.
        bool captureOver = mCapture != nullptr && !mOptions.loop;
        for (auto& layer : layers) {
            const nsecs_t last = layer->game->captureEndTime();
            captureOver = captureOver && last >= 0 && now >= last + CAPTURE_TAIL;
        }
        if (captureOver) {
            result.captureEnded = true;
            break;
        }
        if (progress != nullptr && now >= nextReport) {
            const LayerRecorder& recorder = *layers.front()->recorder;
            char line[160];
            snprintf(line, sizeof(line), "  %5.1f / %.1f s   frames %zu   refreshes %zu",
                     static_cast<double>(now - mStartTime) / SECOND, expectedSec,
                     recorder.frameCount(), recorder.refreshCount());
            *progress << line;
            if (recorder.currentDelay() >= 0) {
                *progress << "   delay " << recorder.currentDelay() / MS << " ms";
            }
            *progress << std::endl;
            nextReport += SECOND;
        }
    }

    // Producers and the display stop first, so that nothing composes or queues while the hosts
    // tear down; the hosts then hand back every frame still queued.
    for (auto& layer : layers)
        layer->game->stop();
    compositor.stop();
    for (auto& layer : layers) {
        android::String8 dump;
        layer->layerHost->dump(dump);
        result.dump += std::string(dump.c_str()) + "\n";
        android::Parcel ringLog;
        layer->layerHost->writeRingLog(ringLog);
        result.ringLogs.insert(result.ringLogs.end(), ringLog.data(),
                               ringLog.data() + ringLog.dataSize());
    }
    for (auto& layer : layers)
        layer->layerHost->stop();
    gpu.stop();
    result.endTime = std::min(systemTime(SYSTEM_TIME_MONOTONIC), end);
    for (auto& layer : layers) {
        layer->recorder->stopListening();
        layer->recorder->finish();
    }
    drain();
    return result;
}

}  // namespace verolux::sim
