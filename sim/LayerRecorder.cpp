#include "sim/LayerRecorder.h"

namespace verolux::sim {

using namespace android::Interpolation;

namespace {

constexpr uint32_t KINDS =
        eBlendedCompositionEvent | eRepeatedCompositionEvent | eNewFrameCompositionEvent;

}  // namespace

LayerRecorder::LayerRecorder(std::string layerName, uint32_t uid, uint32_t mode,
                             nsecs_t refreshPeriod, uint32_t scanlineWidth, size_t expectedFrames,
                             size_t expectedRefreshes)
    : mUid(uid) {
    mRecording.layerName = std::move(layerName);
    mRecording.uid = uid;
    mRecording.mode = mode;
    mRecording.refreshPeriod = refreshPeriod;
    mRecording.scanlineWidth = scanlineWidth;
    mRecording.frames.reserve(expectedFrames);
    mRecording.refreshes.reserve(expectedRefreshes);
    mRecording.scanlines.reserve(expectedRefreshes);
}

void LayerRecorder::startListening() {
    EventDispatcher::subscribe(mUid, KINDS | eDelayChangedEvent, this);
}

void LayerRecorder::stopListening() {
    EventDispatcher::unsubscribe(mUid, KINDS | eDelayChangedEvent, this);
}

void LayerRecorder::onEvent(const EventType& type, const nsecs_t& time, const EventData& data) {
    if (type & KINDS) {
        mKind = type;
        return;
    }
    if (const auto* delay = std::get_if<nsecs_t>(&data); type == eDelayChangedEvent && delay) {
        mDelay = *delay;
        std::lock_guard lock(mMutex);
        mRecording.delayChanges.push_back({time, *delay});
    }
}

void LayerRecorder::start(nsecs_t startTime, nsecs_t initialDelay) {
    std::lock_guard lock(mMutex);
    mRecording.startTime = startTime;
    if (initialDelay >= 0) {
        mDelay = initialDelay;
        mRecording.delayChanges.push_back({startTime, initialDelay});
    }
}

Recording LayerRecorder::finish(nsecs_t endTime) {
    std::lock_guard lock(mMutex);
    mRecording.endTime = endTime;
    return std::move(mRecording);
}

FrameRecord* LayerRecorder::frameLocked(uint64_t number) {
    if (number == 0 || number > mRecording.frames.size()) return nullptr;
    return &mRecording.frames[number - 1];
}

void LayerRecorder::frameDequeued(uint64_t number, int slot, nsecs_t contentTime,
                                  nsecs_t dequeueTime) {
    std::lock_guard lock(mMutex);
    FrameRecord frame;
    frame.number = number;
    frame.slot = slot;
    frame.contentTime = contentTime;
    frame.dequeueTime = dequeueTime;
    mRecording.frames.push_back(frame);
}

void LayerRecorder::frameQueued(uint64_t number, nsecs_t queueTime) {
    std::lock_guard lock(mMutex);
    if (FrameRecord* frame = frameLocked(number)) frame->queueTime = queueTime;
}

void LayerRecorder::frameAcquired(uint64_t number, nsecs_t acquireTime, nsecs_t renderDoneTime) {
    std::lock_guard lock(mMutex);
    if (FrameRecord* frame = frameLocked(number)) {
        frame->acquireTime = acquireTime;
        frame->renderDoneTime = renderDoneTime;
    }
}

uint32_t LayerRecorder::takeCompositionKind() {
    return mKind.exchange(0);
}

nsecs_t LayerRecorder::contentTimeOf(uint64_t number) {
    std::lock_guard lock(mMutex);
    const FrameRecord* frame = frameLocked(number);
    return frame != nullptr ? frame->contentTime : -1;
}

void LayerRecorder::refreshed(RefreshRecord refresh, std::vector<uint8_t> scanline) {
    std::lock_guard lock(mMutex);
    for (const ComposedItem& item : refresh.items) {
        FrameRecord* frame = frameLocked(item.frameNumber);
        if (frame != nullptr && item.weight > 0.0f && frame->firstDisplayTime < 0) {
            frame->firstDisplayTime = refresh.vsyncTime;
        }
    }
    mRecording.refreshes.push_back(std::move(refresh));
    mRecording.scanlines.push_back(std::move(scanline));
}

void LayerRecorder::frameReleased(uint64_t number, nsecs_t releaseTime) {
    std::lock_guard lock(mMutex);
    if (FrameRecord* frame = frameLocked(number)) frame->releaseTime = releaseTime;
}

size_t LayerRecorder::frameCount() {
    std::lock_guard lock(mMutex);
    return mRecording.frames.size();
}

size_t LayerRecorder::refreshCount() {
    std::lock_guard lock(mMutex);
    return mRecording.refreshes.size();
}

}  // namespace verolux::sim
