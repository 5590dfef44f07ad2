#include "host/BufferCount.h"

#include <algorithm>
#include <cmath>
#include <mutex>

#include "Delayer.h"
#include "FillInReleasePicker.h"
#include "SettingsController.h"
#include "Tunables.h"

namespace verolux::host {

using namespace android::Interpolation;

namespace {

constexpr nsecs_t NS_PER_MS = 1'000'000;
// The frame on screen and the one the game is drawing.
constexpr uint32_t FRAMES_BESIDE_THE_DELAY = 2;
constexpr double ROUNDING = 1e-3;

}  // namespace

nsecs_t longestDisplayDelay(InterpolationMode mode, bool applyDelayToFrames, int32_t defaultDelayMs,
                            const Settings& settings) {
    if (mode != eRetimeMode || !applyDelayToFrames) return 0;
    const nsecs_t startMs = settings.smartDelay ? defaultDelayMs : settings.delayMs;
    const nsecs_t longestMs = settings.smartDelay
                                      ? std::max<nsecs_t>(startMs, android::Delayer::MAX_DELAY_MS)
                                      : startMs;
    return std::max<nsecs_t>(0, longestMs) * NS_PER_MS;
}

BufferCount bufferCountFor(int32_t queueSize, InterpolationMode mode, nsecs_t longestDelay,
                           nsecs_t refreshPeriod) {
    BufferCount result;
    if (queueSize >= 1) {
        result.count =
                std::clamp<uint32_t>(static_cast<uint32_t>(queueSize), 2, BufferCount::MAX_BUFFERS);
        result.fixed = true;
        return result;
    }
    uint64_t held = 0;
    if (refreshPeriod > 0 && longestDelay > 0) {
        // Periods are rounded to the nanosecond: 100 ms at 120 Hz is 12 of them, not 12.0000005.
        held = static_cast<uint64_t>(std::ceil(
                static_cast<double>(longestDelay) / static_cast<double>(refreshPeriod) - ROUNDING));
    }
    if (mode == eFillInMode) held = std::max<uint64_t>(held, FillInReleasePicker::QUEUE_DEPTH - 1);
    result.count = static_cast<uint32_t>(std::clamp<uint64_t>(
            held + FRAMES_BESIDE_THE_DELAY, BufferCount::MIN_BUFFERS, BufferCount::MAX_BUFFERS));
    return result;
}

BufferCount bufferCountFor(uint32_t uid, InterpolationMode mode, nsecs_t refreshPeriod) {
    SettingsController* controller = SettingsController::getInstance();
    Settings settings;
    {
        std::lock_guard lock(controller->getMutex());
        settings = controller->getSettingsLocked(uid);
    }
    const nsecs_t delay =
            longestDisplayDelay(mode, applyDelayToFrames.load(), defaultDelay.load(), settings);
    return bufferCountFor(queueSize.load(), mode, delay, refreshPeriod);
}

}  // namespace verolux::host
