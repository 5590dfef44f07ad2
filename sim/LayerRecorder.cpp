#include "sim/LayerRecorder.h"

#include <algorithm>

namespace verolux::sim {

using namespace android::Interpolation;

const char* pictureName(Picture picture) {
    switch (picture) {
        case Picture::BLEND:
            return "blend";
        case Picture::NEW:
            return "new";
        case Picture::REPEAT:
            return "repeat";
        case Picture::HELD:
            return "held";
    }
    return "held";
}

namespace {

constexpr uint32_t LISTENED_EVENTS = eDelayChangedEvent | eFrameReceivedEvent;

}  // namespace

LayerRecorder::LayerRecorder(uint32_t uid, RecordSink& sink) : mUid(uid), mSink(sink) {
    mInFlight.reserve(64);
}

void LayerRecorder::startListening() {
    EventDispatcher::subscribe(mUid, LISTENED_EVENTS, this);
}

void LayerRecorder::stopListening() {
    EventDispatcher::unsubscribe(mUid, LISTENED_EVENTS, this);
}

void LayerRecorder::onEvent(const EventType& type, const nsecs_t& time, const EventData& data) {
    if (const auto* frame = std::get_if<android::FrameItem>(&data);
        frame != nullptr && type == eFrameReceivedEvent) {
        std::lock_guard lock(mMutex);
        if (FrameRecord* record = inFlightLocked(frame->mIndex)) {
            record->engineTimestamp = frame->mTimestamp;
        }
        return;
    }
    const auto* delay = std::get_if<nsecs_t>(&data);
    if (type != eDelayChangedEvent || delay == nullptr) return;
    mDelay = *delay;
    if (!mStarted) return;
    std::lock_guard lock(mMutex);
    mSink.onDelayChange(time, *delay);
}

void LayerRecorder::start(nsecs_t startTime, nsecs_t initialDelay) {
    mStarted = true;
    if (mDelay < 0) mDelay = initialDelay;
    if (mDelay < 0) return;
    std::lock_guard lock(mMutex);
    mSink.onDelayChange(startTime, mDelay);
}

void LayerRecorder::finish() {
    std::lock_guard lock(mMutex);
    std::sort(mInFlight.begin(), mInFlight.end(),
              [](const FrameRecord& a, const FrameRecord& b) { return a.number < b.number; });
    for (const FrameRecord& frame : mInFlight)
        completeLocked(frame);
    mInFlight.clear();
    for (const auto& [number, frame] : mWaiting)
        passOnLocked(frame);
    mWaiting.clear();
}

FrameRecord* LayerRecorder::inFlightLocked(uint64_t number) {
    for (FrameRecord& frame : mInFlight) {
        if (frame.number == number) return &frame;
    }
    return nullptr;
}

void LayerRecorder::frameDequeued(uint64_t number, int slot, nsecs_t contentTime, nsecs_t startTime,
                                  nsecs_t dequeueTime) {
    mFrameCount++;
    std::lock_guard lock(mMutex);
    FrameRecord& frame = mInFlight.emplace_back();
    frame.number = number;
    frame.slot = slot;
    frame.contentTime = contentTime;
    frame.startTime = startTime;
    frame.dequeueTime = dequeueTime;
}

void LayerRecorder::frameQueued(uint64_t number, nsecs_t queueTime, nsecs_t timestamp) {
    std::lock_guard lock(mMutex);
    if (FrameRecord* frame = inFlightLocked(number)) {
        frame->queueTime = queueTime;
        frame->timestamp = timestamp;
    }
}

void LayerRecorder::frameAcquired(uint64_t number, nsecs_t acquireTime, nsecs_t renderDoneTime) {
    std::lock_guard lock(mMutex);
    if (FrameRecord* frame = inFlightLocked(number)) {
        frame->acquireTime = acquireTime;
        frame->renderDoneTime = renderDoneTime;
    }
}

bool LayerRecorder::ShownPicture::sameAs(const ShownPicture& other) const {
    if (count != other.count) return false;
    for (uint8_t i = 0; i < count; i++) {
        if (items[i].frameNumber != other.items[i].frameNumber ||
            items[i].weight != other.items[i].weight) {
            return false;
        }
    }
    return true;
}

LayerRecorder::ShownPicture LayerRecorder::pictureOfLocked(const RefreshRecord& refresh) {
    // Only what is visible counts: frames of weight 0 leave no trace on screen.
    ShownPicture picture;
    double content = 0;
    double weights = 0;
    float leaderWeight = 0;
    for (uint8_t i = 0; i < refresh.itemCount; i++) {
        const ComposedItem& item = refresh.items[i];
        if (item.frameNumber == 0 || item.weight <= 0.0f) continue;
        picture.items[picture.count++] = item;
        // Ties go to the newer frame.
        if (item.weight > leaderWeight ||
            (item.weight == leaderWeight && item.frameNumber > picture.leader)) {
            leaderWeight = item.weight;
            picture.leader = item.frameNumber;
        }
        if (const FrameRecord* frame = inFlightLocked(item.frameNumber)) {
            content += item.weight * static_cast<double>(frame->contentTime);
            weights += item.weight;
        }
    }
    if (weights > 0) picture.contentTime = content / weights;
    return picture;
}

void LayerRecorder::composed(RefreshRecord& refresh) {
    refresh.delay = mDelay.load();
    std::lock_guard lock(mMutex);
    const ShownPicture picture = pictureOfLocked(refresh);
    if (picture.count == 0) {
        refresh.picture = Picture::HELD;
    } else if (picture.sameAs(mScreen)) {
        refresh.picture = Picture::REPEAT;
    } else {
        refresh.picture = picture.count > 1 ? Picture::BLEND : Picture::NEW;
    }
    if (picture.count > 0) mScreen = picture;
    refresh.contentTime = mScreen.contentTime;
    if (FrameRecord* leader = inFlightLocked(mScreen.leader)) {
        if (leader->firstPresentTime < 0) leader->firstPresentTime = refresh.presentTime;
        leader->lastPresentTime = refresh.presentTime;
    }
}

void LayerRecorder::refreshed(RefreshRecord refresh) {
    mRefreshCount++;
    std::lock_guard lock(mMutex);
    mSink.onRefresh(refresh);
}

void LayerRecorder::frameReleased(uint64_t number, nsecs_t releaseTime) {
    std::lock_guard lock(mMutex);
    FrameRecord* frame = inFlightLocked(number);
    if (frame == nullptr) return;
    frame->releaseTime = releaseTime;
    const FrameRecord done = *frame;
    mInFlight.erase(mInFlight.begin() + (frame - mInFlight.data()));
    completeLocked(done);
}

void LayerRecorder::statistics(const StatisticsRecord& statistics) {
    std::lock_guard lock(mMutex);
    mSink.onStatistics(statistics);
}

void LayerRecorder::warning(const WarningRecord& warning) {
    std::lock_guard lock(mMutex);
    mSink.onWarning(warning);
}

void LayerRecorder::completeLocked(const FrameRecord& frame) {
    if (frame.number < mNextFrame) {
        // Overtaken by later frames already (see below).
        mSink.onFrame(frame);
        return;
    }
    if (frame.number != mNextFrame) {
        mWaiting.emplace(frame.number, frame);
        if (mWaiting.size() <= MAX_WAITING_FRAMES) return;
        // An earlier frame is held for very long: let the oldest waiting one go ahead.
        passOnLocked(mWaiting.begin()->second);
        mWaiting.erase(mWaiting.begin());
    } else {
        passOnLocked(frame);
    }
    for (auto next = mWaiting.find(mNextFrame); next != mWaiting.end();
         next = mWaiting.find(mNextFrame)) {
        passOnLocked(next->second);
        mWaiting.erase(next);
    }
}

void LayerRecorder::passOnLocked(const FrameRecord& frame) {
    mNextFrame = std::max(mNextFrame, frame.number + 1);
    mSink.onFrame(frame);
}

}  // namespace verolux::sim
