#include "sim/Simulation.h"

#include <chrono>
#include <cinttypes>
#include <cmath>
#include <cstdio>
#include <memory>
#include <thread>

#include "SettingsController.h"
#include "Tunables.h"
#include "host/LayerHost.h"
#include "sim/BufferQueue.h"
#include "sim/Compositor.h"
#include "sim/FenceSignaller.h"
#include "sim/Game.h"
#include "sim/LayerRecorder.h"

namespace verolux::sim {

using android::Interpolation::InterpolationMode;

namespace {

constexpr nsecs_t MS = 1'000'000;
constexpr nsecs_t SECOND = 1'000'000'000;
constexpr int32_t APPLY_DELAY_TO_FRAMES_ID = 116;

// Everything one simulated layer needs, torn down in the order of its members' destruction.
struct SimulatedLayer {
    SimulatedLayer(const Options& options, const std::string& name, uint32_t uid, uint32_t mode,
                   nsecs_t refreshPeriod)
        : queue(options.slots, options.width, Simulation::BUFFER_HEIGHT),
          recorder(new LayerRecorder(name, uid, mode, refreshPeriod, options.width,
                                     static_cast<size_t>(options.durationSec * options.fps * 2 + 64),
                                     static_cast<size_t>(options.durationSec * options.hz + 64))) {
        host::LayerHost::Config config;
        config.name = android::String8(name.c_str());
        config.uid = uid;
        config.mode = static_cast<InterpolationMode>(mode);
        const int32_t queueSize = android::Interpolation::queueSize.load();
        config.frameListCapacity = queueSize >= 1 ? queueSize : options.slots;
        layerHost =
                std::make_unique<host::LayerHost>(config, [this](const android::FrameItem& frame) {
                    queue.release(frame.mTextureSlot, frame.mIndex);
                    recorder->frameReleased(frame.mIndex, systemTime(SYSTEM_TIME_MONOTONIC));
                });
    }

    BufferQueue queue;
    const android::sp<LayerRecorder> recorder;
    std::unique_ptr<host::LayerHost> layerHost;
    std::unique_ptr<Game> game;
};

}  // namespace

Simulation::Simulation(const Options& options, std::vector<host::SettingValue> settings,
                       const Capture* capture)
    : mOptions(options), mSettings(std::move(settings)), mCapture(capture) {}

SimulationResult Simulation::run(const std::atomic<bool>& interrupted, std::ostream* progress) {
    const nsecs_t refreshPeriod = static_cast<nsecs_t>(std::llround(SECOND / mOptions.hz));

    // Interpolation needs the display delay in front of each frame's display time; the user's own
    // settings come after, so they can still turn it off.
    std::vector<host::SettingValue> message;
    if (mOptions.mode == 0) message.push_back({APPLY_DELAY_TO_FRAMES_ID, true});
    message.insert(message.end(), mSettings.begin(), mSettings.end());
    host::deliverSettings(GAME_UID, message);
    if (mOptions.reference) host::deliverSettings(REFERENCE_UID, message);

    std::vector<std::unique_ptr<SimulatedLayer>> layers;
    layers.push_back(std::make_unique<SimulatedLayer>(mOptions, "game", GAME_UID, mOptions.mode,
                                                      refreshPeriod));
    if (mOptions.reference) {
        layers.push_back(std::make_unique<SimulatedLayer>(mOptions, "reference", REFERENCE_UID, 2,
                                                          refreshPeriod));
    }
    // The layers' observers subscribed as they were created; this hands them their settings.
    android::Interpolation::SettingsController::getInstance()->notifyChanges();

    const bool delayed = mOptions.mode == 0 && android::Interpolation::applyDelayToFrames.load();
    const nsecs_t initialDelay = delayed ? android::Interpolation::defaultDelay.load() * MS : -1;

    FenceSignaller gpu;
    GameConfig gameConfig{mOptions.fps, mOptions.jitterMs, mOptions.renderMs, mOptions.seed,
                          mCapture};
    std::vector<DisplayedLayer> displayed;
    for (auto& layer : layers) {
        layer->recorder->startListening();
        layer->game = std::make_unique<Game>(gameConfig, layer->queue, *layer->layerHost, gpu,
                                             *layer->recorder);
        displayed.push_back({&layer->queue, layer->layerHost.get(), layer->recorder.get()});
    }
    Compositor compositor(refreshPeriod, mOptions.width, displayed);

    const nsecs_t start = systemTime(SYSTEM_TIME_MONOTONIC) + 20 * MS;
    const nsecs_t end = start + static_cast<nsecs_t>(std::llround(mOptions.durationSec * SECOND));
    for (auto& layer : layers) {
        layer->recorder->start(start, layer.get() == layers.front().get() ? initialDelay : -1);
        layer->layerHost->start();
        layer->game->start(start);
    }
    compositor.start(start);

    SimulationResult result;
    nsecs_t nextReport = start + SECOND;
    while (true) {
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
        if (interrupted.load()) {
            result.interrupted = true;
            break;
        }
        if (now >= end) break;
        if (progress != nullptr && now >= nextReport) {
            LayerRecorder& recorder = *layers.front()->recorder;
            const nsecs_t delay = recorder.currentDelay();
            char line[160];
            snprintf(line, sizeof(line), "  %5.1f / %.1f s   frames %zu   refreshes %zu",
                     static_cast<double>(now - start) / SECOND, mOptions.durationSec,
                     recorder.frameCount(), recorder.refreshCount());
            *progress << line;
            if (delay >= 0) *progress << "   delay " << delay / MS << " ms";
            *progress << std::endl;
            nextReport += SECOND;
        }
    }

    // Producers and the display stop first, so that nothing composes or queues while the hosts
    // tear down; the hosts then hand back every frame still queued.
    for (auto& layer : layers)
        layer->game->stop();
    compositor.stop();
    for (auto& layer : layers)
        layer->layerHost->stop();
    gpu.stop();
    const nsecs_t finished = systemTime(SYSTEM_TIME_MONOTONIC);
    for (auto& layer : layers)
        layer->recorder->stopListening();

    result.run = layers.front()->recorder->finish(std::min(finished, end));
    if (layers.size() > 1) result.reference = layers[1]->recorder->finish(std::min(finished, end));
    return result;
}

}  // namespace verolux::sim
