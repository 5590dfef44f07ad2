#pragma once

#include <atomic>
#include <mutex>
#include <string>
#include <vector>

#include "EventDispatcher.h"
#include "sim/Recording.h"

namespace verolux::sim {

// Records what one simulated layer does, from the game's, the display's and the engine's threads;
// the engine's side arrives as events of the layer's uid (the kind of each composition and every
// display-delay change).
class LayerRecorder : public android::Interpolation::EventDispatcher::EventReceiver {
public:
    LayerRecorder(std::string layerName, uint32_t uid, uint32_t mode, nsecs_t refreshPeriod,
                  uint32_t scanlineWidth, size_t expectedFrames, size_t expectedRefreshes);

    void startListening();
    void stopListening();
    void onEvent(const android::Interpolation::EventType& type, const nsecs_t& time,
                 const android::Interpolation::EventData& data) override;

    void start(nsecs_t startTime, nsecs_t initialDelay);
    Recording finish(nsecs_t endTime);

    // The game's thread.
    void frameDequeued(uint64_t number, int slot, nsecs_t contentTime, nsecs_t dequeueTime);
    void frameQueued(uint64_t number, nsecs_t queueTime);
    // The display's thread.
    void frameAcquired(uint64_t number, nsecs_t acquireTime, nsecs_t renderDoneTime);
    // The kind of composition announced since the last call; 0 for none.
    uint32_t takeCompositionKind();
    nsecs_t contentTimeOf(uint64_t number);
    void refreshed(RefreshRecord refresh, std::vector<uint8_t> scanline);
    // Whichever thread took the frame out of the engine's queue.
    void frameReleased(uint64_t number, nsecs_t releaseTime);

    size_t frameCount();
    size_t refreshCount();
    nsecs_t currentDelay() const { return mDelay.load(); }

private:
    FrameRecord* frameLocked(uint64_t number);

    const uint32_t mUid;
    std::atomic<uint32_t> mKind{0};
    std::atomic<nsecs_t> mDelay{-1};
    std::mutex mMutex;
    Recording mRecording;  // guarded by mMutex
};

}  // namespace verolux::sim
