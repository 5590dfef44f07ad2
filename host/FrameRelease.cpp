#include "FrameRelease.h"

#include <pthread.h>
#include <sys/prctl.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <thread>

namespace verolux::host {

using android::FrameItem;
using android::sp;
using namespace android::Interpolation;

namespace {

// `wait` after `now` (a time of the monotonic clock), at most the largest time: a policy's wait is
// bounded, though not tightly.
nsecs_t timeAfter(nsecs_t now, nsecs_t wait) {
    constexpr nsecs_t LATEST = std::numeric_limits<nsecs_t>::max();
    return wait >= LATEST - now ? LATEST : now + wait;
}

// Release threads end on their own after tear-down, and on their way out drop the last references
// to the picker and the list, which unsubscribe from the process-wide event bus and settings
// controller. A process that exits right after a tear-down must not destroy those singletons under
// them: exit waits, a bounded time, for the threads still running.
class RunningReleaseThreads {
public:
    static RunningReleaseThreads& get() {
        // Never destroyed: it is what exit waits on.
        static auto* threads = new RunningReleaseThreads();
        return *threads;
    }

    void add() {
        std::lock_guard lock(mMutex);
        if (!mWaitsAtExit) mWaitsAtExit = std::atexit([] { get().waitForAll(); }) == 0;
        mCount++;
    }

    void remove() {
        {
            std::lock_guard lock(mMutex);
            mCount--;
        }
        mAllEnded.notify_all();
    }

private:
    static constexpr std::chrono::seconds EXIT_WAIT_LIMIT{1};

    void waitForAll() {
        std::unique_lock lock(mMutex);
        mAllEnded.wait_for(lock, EXIT_WAIT_LIMIT, [this] { return mCount == 0; });
    }

    std::mutex mMutex;
    std::condition_variable mAllEnded;
    int mCount = 0;             // guarded by mMutex
    bool mWaitsAtExit = false;  // guarded by mMutex
};

}  // namespace

FrameRelease::FrameRelease(uint32_t uid, sp<android::FrameList> frameList,
                           sp<FrameTimingsAggregator> timings, sp<ReleasePicker> picker,
                           FrameReleasedCallback onFrameReleased)
    : mUid(uid),
      mFrameList(std::move(frameList)),
      mTimings(std::move(timings)),
      mPicker(std::move(picker)),
      mListenedEvents(eFrameReleasedEvent | mPicker->decisionEvents()),
      mOnFrameReleased(std::move(onFrameReleased)) {
    mReleasedSlots.reserve(64);
    mReleasedScratch.reserve(64);
    mQueuedFrames.reserve(64);
}

void FrameRelease::onFirstRef() {
    EventDispatcher::subscribe(mUid, mListenedEvents, this);
}

void FrameRelease::onLastStrongRef(const void* /*id*/) {
    stopHandingBack();
}

void FrameRelease::onEvent(const EventType& type, const nsecs_t&, const EventData& data) {
    if (type != eFrameReleasedEvent) {
        noteEvent();
        return;
    }
    const auto* frame = std::get_if<FrameItem>(&data);
    if (frame == nullptr) return;
    mOnFrameReleased(*frame);
    noteFrameLeft(frame->mIndex, frame->mTextureSlot);
}

void FrameRelease::start() {
    if (mRunning.exchange(true)) return;
    RunningReleaseThreads::get().add();
    std::thread(&FrameRelease::run, sp<FrameRelease>(this)).detach();
}

void FrameRelease::stop() {
    mRunning = false;
    noteEvent();
    // The release thread holds its own reference to the picker, so only stopping it ends a
    // selection's wait.
    mPicker->stop();
}

void FrameRelease::stopHandingBack() {
    if (!mHandingBack.exchange(false)) return;
    EventDispatcher::unsubscribe(mUid, mListenedEvents, this);
    // No delivery reaches the listener any more; the owner's callback, and whatever it captured,
    // goes here rather than with the last reference, which the release thread may hold.
    mOnFrameReleased = nullptr;
}

void FrameRelease::run(sp<FrameRelease> self) {
    configureReleaseThread();
    self->releaseLoop();
    // The last references to the picker and the list may go here.
    self.clear();
    RunningReleaseThreads::get().remove();
}

void FrameRelease::releaseLoop() {
    while (mRunning) {
        const uint64_t eventsBefore = events();
        const FrameItem frame = mPicker->selectFrameForRelease();
        if (frame.mIndex != NO_FRAME) {
            // The game waits for this buffer: let it go first, and record after.
            releaseFrame(frame);
            continue;
        }
        recordReleases();
        // Nothing to release. Some policies say so at once (an empty queue), so ask again only
        // after an event the picker decides on, or after the picker's own event wait.
        std::unique_lock lock(mEventMutex);
        mEventCame.wait_for(lock, std::chrono::nanoseconds(ReleasePicker::EVENT_WAIT_TIMEOUT),
                            [&] { return mEvents != eventsBefore || !mRunning; });
    }
}

void FrameRelease::releaseFrame(const FrameItem& frame) {
    setLeavingFrame(frame.mIndex);
    mFrameList->clearFrameAtLocking(frame.mID);
    setLeavingFrame(NO_FRAME);
    // At once, while this thread still holds the frame: the timings let go of its fence here, not
    // on the composition thread.
    recordReleases();
}

FrameRelease::Step FrameRelease::step() {
    using Next = Step::Next;
    const uint64_t eventsBefore = events();
    const ReleaseChoice choice = mPicker->decideRelease();
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    // The selection does not wait when an event came while it decided, and asks again.
    const bool eventCame = events() != eventsBefore;
    switch (choice.action) {
        case ReleaseChoice::RELEASE:
            if (choice.frame.mIndex != NO_FRAME) {
                releaseFrame(choice.frame);
                return {Next::DECIDE, now};
            }
            recordReleases();
            // Nothing to release: the release thread waits for an event, as below.
            break;
        case ReleaseChoice::WAIT_FOR_TIME:
            if (eventCame) return {Next::DECIDE, now};
            // A wait of nothing is asked again at once, which on a thread takes some time; one
            // nanosecond lets a clock that moves only with the host's events move on.
            return {Next::WAIT_UNTIL, timeAfter(now, std::max<nsecs_t>(choice.waitTime, 1))};
        case ReleaseChoice::RELEASE_AFTER_SLEEP:
            // The blocking policy sleeps with usleep(), in whole microseconds.
            return {Next::SLEEP_UNTIL,
                    timeAfter(now, std::max<nsecs_t>(choice.waitTime, 0) / 1000 * 1000)};
        default:
            break;
    }
    if (eventCame) return {Next::DECIDE, now};
    return {Next::WAIT_FOR_EVENT, timeAfter(now, ReleasePicker::EVENT_WAIT_TIMEOUT)};
}

void FrameRelease::finishSleep() {
    const FrameItem frame = mPicker->chooseOldestFrame().frame;
    if (frame.mIndex != NO_FRAME) {
        releaseFrame(frame);
    } else {
        recordReleases();
    }
}

uint64_t FrameRelease::events() const {
    std::lock_guard lock(mEventMutex);
    return mEvents;
}

void FrameRelease::noteQueued(uint64_t frameNumber) {
    std::lock_guard lock(mReleasedMutex);
    mQueuedFrames.push_back(frameNumber);
}

bool FrameRelease::isQueued(uint64_t frameNumber) {
    std::lock_guard lock(mReleasedMutex);
    return std::find(mQueuedFrames.begin(), mQueuedFrames.end(), frameNumber) != mQueuedFrames.end();
}

void FrameRelease::setLeavingFrame(uint64_t frameNumber) {
    std::lock_guard acquiring(mAcquireMutex);
    mLeavingFrame = frameNumber;
}

void FrameRelease::noteEvent() {
    {
        std::lock_guard lock(mEventMutex);
        mEvents++;
    }
    mEventCame.notify_all();
}

void FrameRelease::noteFrameLeft(uint64_t frameNumber, int slot) {
    std::lock_guard lock(mReleasedMutex);
    mReleasedSlots.push_back(slot);
    const auto queued = std::find(mQueuedFrames.begin(), mQueuedFrames.end(), frameNumber);
    if (queued != mQueuedFrames.end()) mQueuedFrames.erase(queued);
}

void FrameRelease::recordReleases() {
    // The release thread and the host's threads all record; each batch is recorded by one of them.
    std::lock_guard recording(mRecordingMutex);
    {
        std::lock_guard lock(mReleasedMutex);
        mReleasedScratch.swap(mReleasedSlots);
    }
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    for (int slot : mReleasedScratch) {
        mTimings->releaseFrameTimings(now, slot);
        mTimings->releaseBufferTimings(now, slot);
    }
    mReleasedScratch.clear();
}

void configureReleaseThread() {
    pthread_setname_np(pthread_self(), "verolux-release");
    // A release just in time must not be deferred to merge with other timers: the kernel's
    // default slack (50 us) is most of the lateness of a timed wait.
    prctl(PR_SET_TIMERSLACK, 1UL, 0UL, 0UL, 0UL);
}

}  // namespace verolux::host
