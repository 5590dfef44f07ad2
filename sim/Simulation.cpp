#include "sim/Simulation.h"

#include <cctype>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <limits>
#include <memory>
#include <optional>
#include <thread>

#include <binder/Parcel.h>

#include "FrameItem.h"
#include "SettingsController.h"
#include "Tunables.h"
#include "WatchdogWarningController.h"
#include "host/LayerHost.h"
#include "sim/BufferQueue.h"
#include "sim/ClockOverride.h"
#include "sim/Compositor.h"
#include "sim/EventQueue.h"
#include "sim/FenceSignaller.h"
#include "sim/Game.h"
#include "sim/LayerRecorder.h"
#include "sim/Outputs.h"
#include "sim/RecordQueue.h"
#include "sim/Scenario.h"
#include "sim/WarningLedger.h"

namespace verolux::sim {

using android::Interpolation::InterpolationMode;
using android::Interpolation::ReleasePicker;
using Next = host::LayerHost::ReleaseStep::Next;

namespace {

constexpr nsecs_t MS = 1'000'000;
constexpr nsecs_t SECOND = 1'000'000'000;
constexpr nsecs_t LATEST = std::numeric_limits<nsecs_t>::max();
constexpr int32_t GAME_FPS_LIMIT_ID = 0;
constexpr int32_t APPLY_DELAY_TO_FRAMES_ID = 116;
// Enough for the caller to open its outputs before the first vsync.
constexpr nsecs_t START_MARGIN = 250 * MS;
// How often the records of a real-time run are handed on, and the warnings of any run read back.
constexpr nsecs_t DRAIN_PERIOD = 50 * MS;

// The process-wide tunables as the process started with them: every run starts from them, and its
// settings message changes what it sets.
struct Tunables {
    int32_t logLevel;
    int32_t queueSize;
    int32_t defaultDelay;
    bool keepTwoHwcLayers;
    bool applyDelayToFrames;

    static Tunables current() {
        namespace I = android::Interpolation;
        return {I::logLevel.load(), I::queueSize.load(), I::defaultDelay.load(),
                I::keepTwoHwcLayers.load(), I::applyDelayToFrames.load()};
    }
    void restore() const {
        namespace I = android::Interpolation;
        I::logLevel = logLevel;
        I::queueSize = queueSize;
        I::defaultDelay = defaultDelay;
        I::keepTwoHwcLayers = keepTwoHwcLayers;
        I::applyDelayToFrames = applyDelayToFrames;
    }
};

// Taken before main(): the library's tunables are constant-initialised.
const Tunables PROCESS_START_TUNABLES = Tunables::current();

// Leaves nothing of an earlier run in this process for the uid: its settings go back to the
// defaults (which the run's message then changes), and warnings nobody read are dropped.
void forgetEarlierRuns(uint32_t uid) {
    android::Interpolation::SettingsController::getInstance()->setSettings(
            uid, android::Interpolation::defaultSettings);
    android::Parcel unread;
    android::Interpolation::WatchdogWarningController::writeWarningsToParcel(uid, &unread);
}

// The dump with each object address ("0x" and at least six hex digits) written as "(address)":
// addresses differ from process to process, and a simulated run's files do not.
std::string withoutAddresses(const std::string& dump) {
    constexpr size_t SHORTEST_ADDRESS = 6;
    std::string out;
    out.reserve(dump.size());
    for (size_t i = 0; i < dump.size();) {
        size_t end = i;
        if (dump.compare(i, 2, "0x") == 0) {
            end = i + 2;
            while (end < dump.size() && isxdigit(static_cast<unsigned char>(dump[end])))
                end++;
        }
        if (end - i >= 2 + SHORTEST_ADDRESS) {
            out += "(address)";
            i = end;
        } else {
            out += dump[i++];
        }
    }
    return out;
}

}  // namespace

// Everything one simulated layer needs, torn down in the order of its members' destruction.
struct Simulation::Layer {
    // The recorder's records go to `sink`, or, in real time, to `records` for the calling thread.
    Layer(const Options& options, const LayerPlan& plan, RecordSink* sink)
        : plan(plan),
          queue(plan.buffers.count, options.width, Simulation::BUFFER_HEIGHT),
          recorder(new LayerRecorder(plan.uid, sink != nullptr ? *sink : records)) {
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

    const LayerPlan plan;
    RecordQueue records;
    BufferQueue queue;
    const android::sp<LayerRecorder> recorder;
    std::unique_ptr<host::LayerHost> layerHost;
    std::unique_ptr<Game> game;
};

// Plays a run's events in time order on the calling thread, the process's clock at each event's
// time. After each event it lets every layer's release side decide again when an event it
// decides on came while it waited, and every game that waits for a buffer try again, until
// neither has anything to do: on threads, both would wake at once. A layer's release side also
// decides right after the layer's composition, before the display records the refresh, as the
// release thread, woken by the composition, does while the display goes on.
class Simulation::SimulatedTimeLoop final : public FenceScheduler {
public:
    struct Event {
        enum class Kind : uint8_t {
            VSYNC,
            FRAME_START,
            RENDER_DONE,
            RELEASE,
            READ_WARNINGS,
            SCENARIO,
        };

        explicit Event(Kind kind, size_t layer = 0, uint64_t generation = 0,
                       android::sp<android::Fence> fence = nullptr)
            : kind(kind),
              layer(static_cast<uint32_t>(layer)),
              generation(generation),
              fence(std::move(fence)) {}

        Kind kind;
        uint32_t layer;
        // RELEASE: the wait it ends, stale once the layer moved on; SCENARIO: the change's index.
        uint64_t generation;
        android::sp<android::Fence> fence;
    };

    SimulatedTimeLoop(Simulation& simulation, std::vector<std::unique_ptr<Layer>>& layers)
        : mSimulation(simulation), mLayers(layers), mRelease(layers.size()) {}

    void signalAt(android::sp<android::Fence> fence, nsecs_t time) override {
        push(time, Event(Event::Kind::RENDER_DONE, 0, 0, std::move(fence)));
    }

    void run(Compositor& compositor, const std::atomic<bool>& interrupted, std::ostream* progress,
             RunResult& result);

private:
    // A layer's release side: what it waits for, since which count of its decision events.
    struct ReleaseSide {
        Next waiting = Next::DECIDE;  // DECIDE: not waiting
        uint64_t generation = 0;
        uint64_t eventsSeen = 0;
    };

    // One of a scenario's changes, at its time.
    struct ScenarioChange {
        enum class Kind : uint8_t { DISPLAY_RATE, CLIENT_SHARE, SETTINGS };
        nsecs_t time;
        Kind kind;
        double value;  // the rate in Hz, or the share
        const std::vector<host::SettingValue>* settings;
    };

    // More decisions than frames a queue can hold, at one time, is a policy that never waits.
    static constexpr int MAX_DECISIONS_AT_ONCE = 72;
    static constexpr int MAX_SETTLING_ROUNDS = 1000;

    void push(nsecs_t time, Event event) { mEvents.push(std::max(time, mNow), std::move(event)); }
    void scheduleScenario();
    void play(Event& event, Compositor& compositor);
    void change(const ScenarioChange& change, Compositor& compositor);
    void settle();
    // Lets the layer's release side decide again when it waits and an event it decides on came.
    bool decideIfWoken(size_t layer);
    void decideReleases(size_t layer);
    void scheduleNextFrame(size_t layer);
    // The end of the run as far as known: the duration's, or the end of the capture's tail once
    // every layer has played it out.
    nsecs_t end(RunResult& result) const;
    void reportProgress(std::ostream& out, std::chrono::steady_clock::time_point wallStart) const;

    Simulation& mSimulation;
    std::vector<std::unique_ptr<Layer>>& mLayers;
    std::vector<ReleaseSide> mRelease;
    EventQueue<Event> mEvents;
    nsecs_t mNow = 0;
    double mHz = 0;  // the display's rate, and its period
    nsecs_t mPeriod = 0;
    double mPendingHz = 0;  // the display's rate from its next vsync on; 0: no change
    std::vector<ScenarioChange> mChanges;
};

void Simulation::SimulatedTimeLoop::run(Compositor& compositor, const std::atomic<bool>& interrupted,
                                        std::ostream* progress, RunResult& result) {
    using WallClock = std::chrono::steady_clock;
    const WallClock::time_point wallStart = WallClock::now();
    WallClock::time_point nextReport = wallStart + std::chrono::seconds(1);
    mNow = systemTime(SYSTEM_TIME_MONOTONIC);
    const nsecs_t start = mSimulation.mStartTime;
    // Each release side decides once as its thread would when it starts; the rest follows.
    for (size_t i = 0; i < mLayers.size(); i++) {
        decideReleases(i);
        push(mLayers[i]->game->nextFrameStart(), Event(Event::Kind::FRAME_START, i));
    }
    compositor.setAfterComposition([this](size_t layer) { decideIfWoken(layer); });
    mHz = mSimulation.mOptions.hz;
    mPeriod = mSimulation.mRefreshPeriod;
    push(start, Event(Event::Kind::VSYNC));
    scheduleScenario();
    push(start + DRAIN_PERIOD, Event(Event::Kind::READ_WARNINGS));

    nsecs_t end = this->end(result);
    while (!mEvents.empty() && mEvents.nextTime() < end) {
        auto [time, event] = mEvents.pop();
        mNow = time;
        ClockOverride::setNow(time);
        play(event, compositor);
        settle();
        if (event.kind != Event::Kind::VSYNC) continue;
        end = this->end(result);
        if (interrupted.load()) {
            result.interrupted = true;
            end = time;
            break;
        }
        if (progress != nullptr && WallClock::now() >= nextReport) {
            reportProgress(*progress, wallStart);
            nextReport += std::chrono::seconds(1);
        }
    }
    // The clock stands at the end while the run is torn down.
    if (end != LATEST) mNow = std::max(mNow, end);
    ClockOverride::setNow(mNow);
    result.endTime = mNow;
    result.displayHz = mHz;
}

void Simulation::SimulatedTimeLoop::scheduleScenario() {
    const Scenario* scenario = mSimulation.mScenario;
    if (scenario == nullptr) return;
    const nsecs_t start = mSimulation.mStartTime;
    auto at = [start](double sec) {
        return start + static_cast<nsecs_t>(std::llround(sec * SECOND));
    };
    using Kind = ScenarioChange::Kind;
    for (const DisplayChange& display : scenario->display)
        mChanges.push_back({at(display.at), Kind::DISPLAY_RATE, display.hz, nullptr});
    // At the end of a burst the share goes back to the run's own.
    for (const ClientCompositionBurst& burst : scenario->clientComposition) {
        mChanges.push_back({at(burst.from), Kind::CLIENT_SHARE, burst.share, nullptr});
        mChanges.push_back({at(burst.until), Kind::CLIENT_SHARE,
                            mSimulation.mOptions.clientCompositionShare, nullptr});
    }
    for (const SettingsDelivery& delivery : scenario->deliveries)
        mChanges.push_back({at(delivery.at), Kind::SETTINGS, 0, &delivery.settings});
    for (size_t i = 0; i < mChanges.size(); i++)
        push(mChanges[i].time, Event(Event::Kind::SCENARIO, 0, i));
}

void Simulation::SimulatedTimeLoop::change(const ScenarioChange& change, Compositor& compositor) {
    switch (change.kind) {
        case ScenarioChange::Kind::DISPLAY_RATE:
            // The vsync already due comes at the old rate; the display runs at the new one after.
            mPendingHz = change.value;
            break;
        case ScenarioChange::Kind::CLIENT_SHARE:
            compositor.setClientCompositionShare(change.value);
            break;
        case ScenarioChange::Kind::SETTINGS:
            // As the controlling service delivers them: to every layer's game.
            for (const auto& layer : mLayers)
                host::deliverSettings(layer->plan.uid, *change.settings);
            break;
    }
}

void Simulation::SimulatedTimeLoop::play(Event& event, Compositor& compositor) {
    Layer& layer = *mLayers[event.layer];
    switch (event.kind) {
        case Event::Kind::VSYNC:
            compositor.refresh(mNow);
            if (mPendingHz > 0) {
                mHz = mPendingHz;
                mPendingHz = 0;
                mPeriod = static_cast<nsecs_t>(std::llround(SECOND / mHz));
                compositor.setRefreshPeriod(mPeriod, mNow + mPeriod);
            }
            push(mNow + mPeriod, Event(Event::Kind::VSYNC));
            break;
        case Event::Kind::SCENARIO:
            change(mChanges[event.generation], compositor);
            break;
        case Event::Kind::FRAME_START:
            if (layer.game->tryProduce()) scheduleNextFrame(event.layer);
            break;
        case Event::Kind::RENDER_DONE:
            event.fence->signal(mNow);
            break;
        case Event::Kind::RELEASE: {
            ReleaseSide& side = mRelease[event.layer];
            if (event.generation != side.generation) break;  // ended by an event already
            if (side.waiting == Next::SLEEP_UNTIL) layer.layerHost->finishSleepingRelease();
            side.waiting = Next::DECIDE;
            decideReleases(event.layer);
            break;
        }
        case Event::Kind::READ_WARNINGS:
            for (auto& each : mLayers)
                mSimulation.readWarnings(*each);
            push(mNow + DRAIN_PERIOD, Event(Event::Kind::READ_WARNINGS));
            break;
    }
}

void Simulation::SimulatedTimeLoop::settle() {
    for (int round = 0; round < MAX_SETTLING_ROUNDS; round++) {
        bool acted = false;
        for (size_t i = 0; i < mLayers.size(); i++) {
            acted |= decideIfWoken(i);
            Game& game = *mLayers[i]->game;
            if (game.waitingForBuffer() && game.tryProduce()) {
                scheduleNextFrame(i);
                acted = true;
            }
        }
        if (!acted) return;
    }
}

bool Simulation::SimulatedTimeLoop::decideIfWoken(size_t layer) {
    const ReleaseSide& side = mRelease[layer];
    const bool waitsForEvents =
            side.waiting == Next::WAIT_FOR_EVENT || side.waiting == Next::WAIT_UNTIL;
    if (!waitsForEvents || mLayers[layer]->layerHost->releaseEvents() == side.eventsSeen) {
        return false;
    }
    decideReleases(layer);
    return true;
}

void Simulation::SimulatedTimeLoop::decideReleases(size_t layer) {
    host::LayerHost& host = *mLayers[layer]->layerHost;
    host::LayerHost::ReleaseStep step{Next::WAIT_FOR_EVENT,
                                      mNow + ReleasePicker::EVENT_WAIT_TIMEOUT};
    for (int decisions = 0; decisions < MAX_DECISIONS_AT_ONCE; decisions++) {
        const host::LayerHost::ReleaseStep next = host.stepRelease();
        if (next.next == Next::DECIDE) continue;
        // A sleep of nothing returns at once on a thread too.
        if (next.next == Next::SLEEP_UNTIL && next.until <= mNow) {
            host.finishSleepingRelease();
            continue;
        }
        step = next;
        break;
    }
    ReleaseSide& side = mRelease[layer];
    side.waiting = step.next;
    side.generation++;
    side.eventsSeen = host.releaseEvents();
    if (step.until != LATEST) push(step.until, Event(Event::Kind::RELEASE, layer, side.generation));
}

void Simulation::SimulatedTimeLoop::scheduleNextFrame(size_t layer) {
    const nsecs_t next = mLayers[layer]->game->nextFrameStart();
    if (next >= 0) push(next, Event(Event::Kind::FRAME_START, layer));
}

nsecs_t Simulation::SimulatedTimeLoop::end(RunResult& result) const {
    const nsecs_t planned = mSimulation.plannedEnd();
    if (mSimulation.mCapture == nullptr || mSimulation.mOptions.loop) return planned;
    nsecs_t last = -1;
    for (const auto& layer : mLayers) {
        const nsecs_t ended = layer->game->captureEndTime();
        if (ended < 0) return planned;
        last = std::max(last, ended);
    }
    const nsecs_t captureOver = last + CAPTURE_TAIL;
    if (captureOver >= planned) return planned;
    result.captureEnded = true;
    return captureOver;
}

void Simulation::SimulatedTimeLoop::reportProgress(
        std::ostream& out, std::chrono::steady_clock::time_point wallStart) const {
    const double simulated = static_cast<double>(mNow - mSimulation.mStartTime) / SECOND;
    const double wall =
            std::chrono::duration<double>(std::chrono::steady_clock::now() - wallStart).count();
    const LayerRecorder& recorder = *mLayers.front()->recorder;
    char line[200];
    snprintf(line, sizeof(line),
             "  %7.1f / %.1f s simulated   frames %zu   refreshes %zu   %.0fx real time", simulated,
             mSimulation.plannedSeconds(), recorder.frameCount(), recorder.refreshCount(),
             wall > 0 ? simulated / wall : 0.0);
    out << line << std::endl;
}

Simulation::Simulation(const Options& options, std::vector<host::SettingValue> settings,
                       const Capture* capture, const Scenario* scenario)
    : mOptions(options),
      mCapture(capture),
      mScenario(scenario),
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
    PROCESS_START_TUNABLES.restore();
    for (LayerPlan& layer : mLayers) {
        forgetEarlierRuns(layer.uid);
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
    if (options.time == TimeMode::SIMULATED) {
        mStartTime = SIMULATED_CLOCK_START + START_MARGIN;
        mStartWallMs = SIMULATED_WALL_CLOCK_AT_START_MS;
        return;
    }
    mStartTime = systemTime(SYSTEM_TIME_MONOTONIC) + START_MARGIN;
    timespec wall{};
    clock_gettime(CLOCK_REALTIME, &wall);
    mStartWallMs = int64_t{wall.tv_sec} * 1000 + wall.tv_nsec / MS +
                   (mStartTime - systemTime(SYSTEM_TIME_MONOTONIC)) / MS;
}

nsecs_t Simulation::plannedEnd() const {
    const bool untilCaptureEnds = mCapture != nullptr && !mOptions.durationGiven && !mOptions.loop;
    if (untilCaptureEnds) return LATEST;
    return mStartTime + static_cast<nsecs_t>(std::llround(mOptions.durationSec * SECOND));
}

double Simulation::plannedSeconds() const {
    return plannedEnd() == LATEST ? mCapture->span() / 1e9 : mOptions.durationSec;
}

void Simulation::readWarnings(Layer& layer) {
    // As the settings client does; each warning is placed on the run's clock by its wall time.
    android::Parcel parcel;
    android::Interpolation::WatchdogWarningController::writeWarningsToParcel(layer.plan.uid,
                                                                             &parcel);
    parcel.setDataPosition(0);
    DecodedWarnings decoded = decodeWarnings(parcel);
    for (WarningRecord& warning : decoded.warnings) {
        warning.time = warningRunTime(warning.wallMs, mStartTime, mStartWallMs);
        layer.recorder->warning(warning);
    }
    if (!decoded.error.empty()) {
        fprintf(stderr, "verolux-sim: the warnings of uid %u: %s\n", layer.plan.uid,
                decoded.error.c_str());
    }
}

RunResult Simulation::run(const std::vector<RecordSink*>& sinks,
                          const std::atomic<bool>& interrupted, std::ostream* progress) {
    const auto wallStart = std::chrono::steady_clock::now();
    const bool simulated = mOptions.time == TimeMode::SIMULATED;
    if (simulated) {
        ClockOverride::setNow(SIMULATED_CLOCK_START);
        ClockOverride::setWallClockOffset(SIMULATED_WALL_CLOCK_AT_START_MS * MS - mStartTime);
    }
    std::vector<std::unique_ptr<Layer>> layers;
    for (size_t i = 0; i < mLayers.size(); i++) {
        layers.push_back(
                std::make_unique<Layer>(mOptions, mLayers[i], simulated ? sinks[i] : nullptr));
    }
    // The layers' observers subscribed as they were created; this hands them their settings, and
    // the recorders hear the display delay the settings set.
    for (auto& layer : layers)
        layer->recorder->startListening();
    android::Interpolation::SettingsController::getInstance()->notifyChanges();

    std::optional<SimulatedTimeLoop> loop;
    std::optional<FenceSignaller> gpu;
    FenceScheduler* fences = nullptr;
    if (simulated) {
        fences = &loop.emplace(*this, layers);
    } else {
        fences = &gpu.emplace();
    }
    // Only the space-time picture looks at pixels, and only in its window (or in the run's last
    // stretch of that length, when it ends before the window starts).
    const nsecs_t picturesUntil =
            mStartTime + std::llround(mOptions.pictureAtSec * SECOND) + Outputs::PICTURE_WINDOW;
    GameConfig gameConfig{mOptions.fps,      mOptions.jitterMs,
                          mOptions.renderMs, mOptions.seed,
                          mCapture,          mScenario != nullptr ? &mScenario->game : nullptr,
                          mOptions.loop,     picturesUntil};
    std::vector<DisplayedLayer> displayed;
    for (auto& layer : layers) {
        layer->game = std::make_unique<Game>(gameConfig, layer->queue, *layer->layerHost, *fences,
                                             *layer->recorder, mStartTime);
        displayed.push_back({&layer->queue, layer->layerHost.get(), layer->recorder.get()});
    }
    Compositor::Config display;
    display.refreshPeriod = mRefreshPeriod;
    display.firstVsync = mStartTime;
    display.width = mOptions.width;
    display.clientCompositionShare = mOptions.clientCompositionShare;
    display.seed = mOptions.seed;
    // The CPU time a refresh takes is the machine's, not the simulation's, and no two runs agree
    // on it: simulated time leaves it out.
    display.measureCpu = !simulated;
    display.picturesUntil = picturesUntil;
    Compositor compositor(display, displayed);

    for (size_t i = 0; i < layers.size(); i++)
        layers[i]->recorder->start(mStartTime, i == 0 ? mInitialDelay : -1);
    RunResult result;
    if (simulated) {
        loop->run(compositor, interrupted, progress, result);
    } else {
        runInRealTime(layers, compositor, sinks, interrupted, progress, result);
    }

    // Producers and the display stop first, so that nothing composes or queues while the hosts
    // tear down; the hosts then hand back every frame still queued.
    for (auto& layer : layers)
        layer->game->stop();
    compositor.stop();
    for (auto& layer : layers) {
        android::String8 dump;
        layer->layerHost->dump(dump);
        result.dump += (simulated ? withoutAddresses(dump.c_str()) : dump.c_str()) + "\n";
        android::Parcel ringLog;
        layer->layerHost->writeRingLog(ringLog);
        result.ringLogs.insert(result.ringLogs.end(), ringLog.data(),
                               ringLog.data() + ringLog.dataSize());
    }
    for (auto& layer : layers)
        layer->layerHost->stop();
    if (gpu) gpu->stop();
    if (!simulated) {
        result.endTime = std::min(systemTime(SYSTEM_TIME_MONOTONIC), plannedEnd());
        result.displayHz = mOptions.hz;
    }
    for (size_t i = 0; i < layers.size(); i++) {
        Layer& layer = *layers[i];
        layer.recorder->stopListening();
        layer.recorder->finish();
        readWarnings(layer);
        layer.records.drainInto(*sinks[i]);
    }
    if (simulated) {
        ClockOverride::setWallClockOffset(std::nullopt);
        ClockOverride::setNow(-1);
    }
    result.wallSeconds =
            std::chrono::duration<double>(std::chrono::steady_clock::now() - wallStart).count();
    return result;
}

void Simulation::runInRealTime(std::vector<std::unique_ptr<Layer>>& layers, Compositor& compositor,
                               const std::vector<RecordSink*>& sinks,
                               const std::atomic<bool>& interrupted, std::ostream* progress,
                               RunResult& result) {
    for (auto& layer : layers) {
        layer->layerHost->start();
        layer->game->start();
    }
    compositor.start();

    const nsecs_t end = plannedEnd();
    nsecs_t nextReport = mStartTime + SECOND;
    while (true) {
        std::this_thread::sleep_for(std::chrono::nanoseconds(DRAIN_PERIOD));
        for (size_t i = 0; i < layers.size(); i++) {
            readWarnings(*layers[i]);
            layers[i]->records.drainInto(*sinks[i]);
        }
        const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
        if (interrupted.load()) {
            result.interrupted = true;
            return;
        }
        if (now >= end) return;
        // Every layer plays the same capture; the run is over once all have played it out.
        bool captureOver = mCapture != nullptr && !mOptions.loop;
        for (auto& layer : layers) {
            const nsecs_t last = layer->game->captureEndTime();
            captureOver = captureOver && last >= 0 && now >= last + CAPTURE_TAIL;
        }
        if (captureOver) {
            result.captureEnded = true;
            return;
        }
        if (progress != nullptr && now >= nextReport) {
            const LayerRecorder& recorder = *layers.front()->recorder;
            char line[160];
            snprintf(line, sizeof(line), "  %5.1f / %.1f s   frames %zu   refreshes %zu",
                     static_cast<double>(now - mStartTime) / SECOND, plannedSeconds(),
                     recorder.frameCount(), recorder.refreshCount());
            *progress << line;
            if (recorder.currentDelay() >= 0) {
                *progress << "   delay " << recorder.currentDelay() / MS << " ms";
            }
            *progress << std::endl;
            nextReport += SECOND;
        }
    }
}

}  // namespace verolux::sim
