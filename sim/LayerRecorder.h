#pragma once

#include <atomic>
#include <map>
#include <mutex>
#include <vector>

#include "EventDispatcher.h"
#include "sim/Recording.h"

namespace verolux::sim {

// Turns what happens to one layer into records for a RecordSink: it follows each frame from the
// game's request for a buffer to the buffer's release, decides at every refresh what the screen
// shows (and which frame leads the picture), and passes on the engine's display-delay changes.
// Callers pass every time in; it may be called from several threads, and calls its sink with its
// own mutex held, so the sink must not call back. It hears the engine announce each frame that
// enters its queue, with the timestamp the engine gave it.
class LayerRecorder : public android::Interpolation::EventDispatcher::EventReceiver {
public:
    // Completed frames wait for the earlier ones at most this long before they are passed on out
    // of order.
    static constexpr size_t MAX_WAITING_FRAMES = 256;

    LayerRecorder(uint32_t uid, RecordSink& sink);

    void startListening();
    void stopListening();
    void onEvent(const android::Interpolation::EventType& type, const nsecs_t& time,
                 const android::Interpolation::EventData& data) override;

    // The delay frames get from the start: the last the engine announced before it, or else
    // `initialDelay` when the engine applies one (-1: none).
    void start(nsecs_t startTime, nsecs_t initialDelay);
    // Passes on the frames still in flight.
    void finish();

    // The game's side.
    void frameDequeued(uint64_t number, int slot, nsecs_t contentTime, nsecs_t startTime,
                       nsecs_t dequeueTime);
    void frameQueued(uint64_t number, nsecs_t queueTime, nsecs_t timestamp);
    // The display's side.
    void frameAcquired(uint64_t number, nsecs_t acquireTime, nsecs_t renderDoneTime);
    // A refresh with its index, times and composed items (weights included): the recorder adds
    // what the screen showed. Called while the composition still holds its frames, so that none
    // of them has left yet.
    void composed(RefreshRecord& refresh);
    // The same refresh once complete (CPU time, queue length, scanline): passes it on.
    void refreshed(RefreshRecord refresh);
    // Whichever thread took the frame out of the engine's queue.
    void frameReleased(uint64_t number, nsecs_t releaseTime);
    // The library's per-second statistics, and a warning the settings client read back.
    void statistics(const StatisticsRecord& statistics);
    void warning(const WarningRecord& warning);

    size_t frameCount() const { return mFrameCount.load(); }
    size_t refreshCount() const { return mRefreshCount.load(); }
    nsecs_t currentDelay() const { return mDelay.load(); }

private:
    // The frames composed into the picture on screen and their weights.
    struct ShownPicture {
        std::array<ComposedItem, RefreshRecord::MAX_ITEMS> items{};
        uint8_t count = 0;
        double contentTime = -1;
        uint64_t leader = 0;  // the frame with the larger weight, 0 for none

        bool sameAs(const ShownPicture& other) const;
    };

    FrameRecord* inFlightLocked(uint64_t number);
    ShownPicture pictureOfLocked(const RefreshRecord& refresh);
    void completeLocked(const FrameRecord& frame);
    void passOnLocked(const FrameRecord& frame);

    const uint32_t mUid;
    std::atomic<size_t> mFrameCount{0};
    std::atomic<size_t> mRefreshCount{0};
    std::atomic<nsecs_t> mDelay{-1};
    std::atomic<bool> mStarted{false};  // delay changes before the start set the first delay
    std::mutex mMutex;
    RecordSink& mSink;                         // called under mMutex
    std::vector<FrameRecord> mInFlight;        // guarded by mMutex; dequeued and not yet released
    std::map<uint64_t, FrameRecord> mWaiting;  // guarded by mMutex; complete, behind an earlier one
    uint64_t mNextFrame = 1;                   // guarded by mMutex; the next frame to pass on
    ShownPicture mScreen;                      // guarded by mMutex
};

}  // namespace verolux::sim
