#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <vector>

#include "EventDispatcher.h"
#include "FrameItem.h"
#include "Tunables.h"

namespace android {

// The per-layer queue of intercepted frames, sorted by desired display time (mID). Compositions
// lock the frames they use, keyed by mID; the removals ending in "Locking" wait while their frame
// is locked. Every arrival and departure is announced on the event bus.
//
// Relative indexing: for a display time t, P(t) is the number of leading frames with mID <= t.
// -1 is then the newest frame at or before t, -2 the one before it, +1 the first frame after t;
// 0 is never an index.
class FrameList : public virtual RefBase {
public:
    // The frames, oldest first, announcing each insertion and removal for the layer's uid. The
    // queue is short and mostly walked, so it lies in one contiguous array; its storage is reserved
    // and only ever grows, so that frames pass through it without allocations.
    class FrameDeque {
    public:
        using iterator = std::vector<FrameItem>::iterator;
        using const_iterator = std::vector<FrameItem>::const_iterator;

        explicit FrameDeque(uint32_t uid);

        size_t size() const { return mFrames.size(); }
        bool empty() const { return mFrames.empty(); }
        const FrameItem& operator[](size_t i) const { return mFrames[i]; }
        FrameItem& operator[](size_t i) { return mFrames[i]; }
        const FrameItem& front() const { return mFrames.front(); }
        FrameItem& front() { return mFrames.front(); }
        const FrameItem& back() const { return mFrames.back(); }
        iterator begin() { return mFrames.begin(); }
        iterator end() { return mFrames.end(); }
        const_iterator begin() const { return mFrames.begin(); }
        const_iterator end() const { return mFrames.end(); }

        void insert(const_iterator position, FrameItem frame);
        FrameItem erase(const_iterator position);
        FrameItem pop_front() { return erase(mFrames.begin()); }

        // Type 1: the frame arrived; type 2: it left. Each is followed by the size before (at
        // now - 1) and after (at now). The frame is lent to the event and handed back.
        template <Interpolation::EventType type>
        void broadcastEvent(FrameItem& frame);

    private:
        uint32_t mUid;
        std::vector<FrameItem> mFrames;
    };

    explicit FrameList(uint32_t uid);

    void insertFrame(FrameItem frame);
    void replaceFrame(FrameItem out, FrameItem in);
    bool hasFrameLocked(const FrameItem& frame) const;

    size_t size() const;
    FrameItem getOldestFrame() const;
    FrameItem getNewestFrame() const;
    // Whether a queued frame has exactly this mID.
    bool hasFrameAt(const nsecs_t& t) const;

    FrameItem getFrameAt(const nsecs_t& t);
    FrameItem getFrameAt(const nsecs_t& t, int index);
    FrameItem getFrameBefore(const nsecs_t& t);
    FrameItem getFrameAfter(const nsecs_t& t);

    // The display times and validity of the frames getFrameBefore(t) and getFrameAfter(t) would
    // return (0 and false where they would return the empty frame), found under one lock without
    // copying the frames: all a composition decides from before it locks any.
    struct Neighbours {
        nsecs_t beforeID = 0;
        bool beforeValid = false;
        nsecs_t afterID = 0;
        bool afterValid = false;
    };
    Neighbours getNeighbours(const nsecs_t& t);

    // A composition's choice at display time t under one hold of the list's mutex, so that the
    // frames it locks are the neighbours it chose from: neighbours() is what getNeighbours(t)
    // returns, lockBefore() and lockAfter() what getFrameBeforeAndLock(t) and
    // getFrameAfterAndLock(t) would have returned then, log lines included. The list may not be
    // called otherwise while a pick lives.
    class NeighbourPick {
    public:
        NeighbourPick(FrameList& list, nsecs_t t);
        NeighbourPick(const NeighbourPick&) = delete;
        NeighbourPick& operator=(const NeighbourPick&) = delete;

        const Neighbours& neighbours() const { return mNeighbours; }
        FrameItem lockBefore() { return lock(mBefore, mNeighbours.beforeValid); }
        FrameItem lockAfter() { return lock(mAfter, mNeighbours.afterValid); }

    private:
        FrameItem lock(const FrameItem* frame, bool valid);

        FrameList& mList;
        std::lock_guard<std::mutex> mLock;
        Neighbours mNeighbours;
        const FrameItem* mBefore = nullptr;
        const FrameItem* mAfter = nullptr;
    };

    // Lock only a valid frame, and only until killLocks().
    FrameItem getFrameBeforeAndLock(const nsecs_t& t);
    FrameItem getFrameAfterAndLock(const nsecs_t& t);
    // Lock whatever frame they return, even after killLocks().
    FrameItem getFrameAtAndLock(const nsecs_t& t);
    FrameItem getLatestValidFrameAndLock();
    FrameItem getLatestAcquiredFrameAndLock();
    FrameItem getNewestFrameAndLock();

    void unlock(const nsecs_t& t);
    void unlockAll();
    void killLocks();

    bool isOldestFrameUnused(const nsecs_t& t);
    bool isOldestFrameUnusedLocked(const nsecs_t& t);

    FrameItem clearOldestFrameLockedLocking(std::unique_lock<std::mutex>& lock);
    std::vector<FrameItem> clearOldestFrameLocking();
    std::vector<FrameItem> clearOldestFrameIfUnusedLocking(const nsecs_t& t);
    FrameItem clearFrameAtLocking(const nsecs_t& t);
    std::vector<FrameItem> clearEveryFrame();
    std::vector<FrameItem> clearEveryFrameButTheNewestOne();

    int getPresentQueueIndex(const nsecs_t& t) const;
    int getFrameIndexBeforeLocked(const nsecs_t& t) const;
    int getIndexForFrame(const nsecs_t& t, const FrameItem& frame) const;

    void dump(String8& out, const char* prefix) const;
    void dumpLocked(String8& out, const char* prefix) const;

private:
    bool isLockedLocked(nsecs_t id) const;
    void lockLocked(const FrameItem& frame);
    bool hasFrameAtLocked(nsecs_t t) const;
    FrameItem getFrameAtLocked(nsecs_t t) const;
    void insertFrameLocked(FrameItem frame);
    // The frame at relative index `index` for t, or null, and whether it is valid. Each fence is
    // polled at most once, and a signal seen is remembered in the queue.
    FrameItem* frameAtLocked(nsecs_t t, int index, bool& valid);
    // A copy of that frame (the empty frame if none), locked if valid while locking is enabled.
    FrameItem copyLockingIfValidLocked(nsecs_t t, int index);
    void waitWhileLockedLocked(nsecs_t id, std::unique_lock<std::mutex>& lock);

    mutable std::mutex mMutex;
    std::condition_variable mUnlockCondition;  // notified whenever locks are released
    FrameDeque mFrames;                        // guarded by mMutex
    // mIDs held by compositions, sorted and unique: a flat set, so that a lock taken every refresh
    // costs no allocation.
    std::vector<nsecs_t> mLocks;  // guarded by mMutex
    bool mLockingEnabled = true;  // guarded by mMutex
};

}  // namespace android
