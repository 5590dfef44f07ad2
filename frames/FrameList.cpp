#include "FrameList.h"

#include <algorithm>

#include "Log.h"
#include "Trace.h"
#include "UniqueLock.h"

namespace android {

using Interpolation::EventDispatcher;
using Interpolation::EventType;
using Interpolation::UniqueLock;

namespace {

// Enough for the frames a layer queues at the longest display delay and the highest frame rate;
// a deeper queue grows the storage once.
constexpr size_t RESERVED_FRAMES = 32;

// A removed frame as the removals return it: alone if it was valid, else nothing.
std::vector<FrameItem> validOnly(FrameItem removed) {
    std::vector<FrameItem> frames;
    if (removed.isValid()) frames.push_back(std::move(removed));
    return frames;
}

}  // namespace

FrameList::FrameDeque::FrameDeque(uint32_t uid) : mUid(uid) {
    mFrames.reserve(RESERVED_FRAMES);
}

void FrameList::FrameDeque::insert(const_iterator position, FrameItem frame) {
    broadcastEvent<Interpolation::eFrameReceivedEvent>(*mFrames.insert(position, std::move(frame)));
}

FrameItem FrameList::FrameDeque::erase(const_iterator position) {
    auto it = mFrames.begin() + (position - mFrames.cbegin());
    FrameItem removed = std::move(*it);
    mFrames.erase(it);
    broadcastEvent<Interpolation::eFrameReleasedEvent>(removed);
    return removed;
}

template <EventType type>
void FrameList::FrameDeque::broadcastEvent(FrameItem& frame) {
    static_assert(type == Interpolation::eFrameReceivedEvent ||
                  type == Interpolation::eFrameReleasedEvent);
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    const int size = static_cast<int>(mFrames.size());
    const int sizeBefore = type == Interpolation::eFrameReceivedEvent ? size - 1 : size + 1;
    // Receivers get the frame by reference and copy what they keep, and none can reach the list
    // meanwhile (its mutex is held), so the frame itself is lent to the event: no references are
    // taken and dropped for it.
    Interpolation::EventData data(std::move(frame));
    EventDispatcher::broadcastEvent(mUid, type, now, data);
    frame = std::move(std::get<FrameItem>(data));
    EventDispatcher::broadcastEvent(mUid, Interpolation::eFrameListSizeChangedEvent, now - 1,
                                    sizeBefore);
    EventDispatcher::broadcastEvent(mUid, Interpolation::eFrameListSizeChangedEvent, now, size);
}

FrameList::FrameList(uint32_t uid) : mFrames(uid) {
    // Enough for every frame a composition can hold at once; more only grows the vector.
    mLocks.reserve(8);
}

void FrameList::insertFrame(FrameItem frame) {
    std::lock_guard lock(mMutex);
    ILOG(2, "Interpolation::FrameList insertFrame frame %lu", frame.mID);
    // One walk finds both a queued copy of the frame and, behind frames of equal mID so that they
    // keep their order of arrival, the place of a new one.
    size_t position = mFrames.size();
    for (size_t i = 0; i < mFrames.size(); i++) {
        const FrameItem& queued = mFrames[i];
        if (queued.mTimestamp == frame.mTimestamp) {
            ILOG(2, "Interpolation::FrameList attempted to insert duplicate frame %lu", frame.mID);
            mFrames[i].update(frame);
            return;
        }
        if (position == mFrames.size() && queued.mID > frame.mID) position = i;
    }
    mFrames.insert(mFrames.begin() + static_cast<ptrdiff_t>(position), std::move(frame));
}

void FrameList::insertFrameLocked(FrameItem frame) {
    // Behind frames of equal mID, so that they keep their order of arrival.
    auto position = std::find_if(mFrames.begin(), mFrames.end(),
                                 [&](const FrameItem& queued) { return queued.mID > frame.mID; });
    mFrames.insert(position, std::move(frame));
}

void FrameList::replaceFrame(FrameItem out, FrameItem in) {
    std::lock_guard lock(mMutex);
    ILOG(2, "Interpolation::FrameList replaceFrame out : %lu, in : %lu", out.mID, in.mID);
    auto found = std::find_if(mFrames.begin(), mFrames.end(), [&](const FrameItem& queued) {
        return queued.mTimestamp == out.mTimestamp;
    });
    if (found == mFrames.end()) {
        ILOG(1, "Interpolation::FrameList unable to find frame to replace!");
        return;
    }
    mFrames.erase(found);
    insertFrameLocked(std::move(in));
}

bool FrameList::hasFrameLocked(const FrameItem& frame) const {
    return std::any_of(mFrames.begin(), mFrames.end(), [&](const FrameItem& queued) {
        return queued.mTimestamp == frame.mTimestamp;
    });
}

size_t FrameList::size() const {
    std::lock_guard lock(mMutex);
    return mFrames.size();
}

FrameItem FrameList::getOldestFrame() const {
    std::lock_guard lock(mMutex);
    return mFrames.empty() ? FrameItem() : mFrames.front();
}

FrameItem FrameList::getNewestFrame() const {
    std::lock_guard lock(mMutex);
    return mFrames.empty() ? FrameItem() : mFrames.back();
}

bool FrameList::hasFrameAt(const nsecs_t& t) const {
    std::lock_guard lock(mMutex);
    return hasFrameAtLocked(t);
}

bool FrameList::hasFrameAtLocked(nsecs_t t) const {
    return std::any_of(mFrames.begin(), mFrames.end(),
                       [&](const FrameItem& queued) { return queued.mID == t; });
}

FrameItem FrameList::getFrameAtLocked(nsecs_t t) const {
    auto found = std::find_if(mFrames.begin(), mFrames.end(),
                              [&](const FrameItem& queued) { return queued.mID == t; });
    return found == mFrames.end() ? FrameItem() : *found;
}

FrameItem FrameList::getFrameAt(const nsecs_t& t) {
    std::lock_guard lock(mMutex);
    return getFrameAtLocked(t);
}

FrameItem* FrameList::frameAtLocked(nsecs_t t, int index, bool& valid) {
    valid = false;
    if (index == 0) {
        ILOG(1, "FrameList received an invalid index");
        return nullptr;
    }
    if (mFrames.empty()) {
        ILOG(1, "FrameList is empty");
        return nullptr;
    }
    // An oldest frame that is not valid yet counts as index 0, so that negative indices find
    // nothing until it is ready.
    // The oldest frame's relative index as getIndexForFrame gives it, knowing that it is queued
    // at position 0.
    FrameItem& oldest = mFrames.front();
    const bool oldestValid = oldest.pollValid();
    int64_t oldestIndex = 0;
    if (!oldestValid) {
        ILOG(1, "FrameList passed an invalid FrameItem");
    } else if (t < oldest.mID) {
        oldestIndex = 1;
    } else {
        oldestIndex = -getPresentQueueIndex(t);
    }
    int64_t position = int64_t{index} - oldestIndex;
    if (index > 0 && oldestIndex < 0) position -= 1;  // the gap at index 0
    if (position < 0 || position >= static_cast<int64_t>(mFrames.size())) return nullptr;
    FrameItem& found = mFrames[static_cast<size_t>(position)];
    valid = position == 0 ? oldestValid : found.pollValid();
    return &found;
}

FrameItem FrameList::getFrameAt(const nsecs_t& t, int index) {
    bool valid;
    const FrameItem* found = frameAtLocked(t, index, valid);
    return found != nullptr ? *found : FrameItem();
}

FrameItem FrameList::getFrameBefore(const nsecs_t& t) {
    std::lock_guard lock(mMutex);
    return getFrameAt(t, -1);
}

FrameItem FrameList::getFrameAfter(const nsecs_t& t) {
    std::lock_guard lock(mMutex);
    return getFrameAt(t, 1);
}

FrameList::Neighbours FrameList::getNeighbours(const nsecs_t& t) {
    return NeighbourPick(*this, t).neighbours();
}

bool FrameList::isLockedLocked(nsecs_t id) const {
    return std::binary_search(mLocks.begin(), mLocks.end(), id);
}

void FrameList::lockLocked(const FrameItem& frame) {
    auto position = std::lower_bound(mLocks.begin(), mLocks.end(), frame.mID);
    if (position == mLocks.end() || *position != frame.mID) mLocks.insert(position, frame.mID);
}

FrameList::NeighbourPick::NeighbourPick(FrameList& list, nsecs_t t)
    : mList(list), mLock(list.mMutex) {
    mBefore = list.frameAtLocked(t, -1, mNeighbours.beforeValid);
    mAfter = list.frameAtLocked(t, 1, mNeighbours.afterValid);
    if (mBefore != nullptr) mNeighbours.beforeID = mBefore->mID;
    if (mAfter != nullptr) mNeighbours.afterID = mAfter->mID;
}

FrameItem FrameList::NeighbourPick::lock(const FrameItem* frame, bool valid) {
    // The queue cannot have changed since the look-up: only its lines are logged again.
    if (mList.mFrames.empty()) {
        ILOG(1, "FrameList is empty");
        return FrameItem();
    }
    if (!mList.mFrames.front().isValid()) ILOG(1, "FrameList passed an invalid FrameItem");
    if (frame == nullptr) return FrameItem();
    if (mList.mLockingEnabled && valid) mList.lockLocked(*frame);
    return *frame;
}

FrameItem FrameList::getFrameBeforeAndLock(const nsecs_t& t) {
    std::lock_guard lock(mMutex);
    return copyLockingIfValidLocked(t, -1);
}

FrameItem FrameList::getFrameAfterAndLock(const nsecs_t& t) {
    std::lock_guard lock(mMutex);
    return copyLockingIfValidLocked(t, 1);
}

FrameItem FrameList::copyLockingIfValidLocked(nsecs_t t, int index) {
    bool valid;
    const FrameItem* frame = frameAtLocked(t, index, valid);
    if (frame == nullptr) return FrameItem();
    if (mLockingEnabled && valid) lockLocked(*frame);
    return *frame;
}

FrameItem FrameList::getFrameAtAndLock(const nsecs_t& t) {
    std::lock_guard lock(mMutex);
    auto found = std::find_if(mFrames.begin(), mFrames.end(),
                              [&](const FrameItem& queued) { return queued.mID == t; });
    if (found == mFrames.end()) return FrameItem();
    lockLocked(*found);
    return *found;
}

FrameItem FrameList::getLatestValidFrameAndLock() {
    std::lock_guard lock(mMutex);
    for (size_t i = mFrames.size(); i-- > 0;) {
        if (mFrames[i].pollValid()) {
            lockLocked(mFrames[i]);
            return mFrames[i];
        }
    }
    return FrameItem();
}

FrameItem FrameList::getLatestAcquiredFrameAndLock() {
    std::lock_guard lock(mMutex);
    for (size_t i = mFrames.size(); i-- > 0;) {
        if (mFrames[i].mAcquired) {
            lockLocked(mFrames[i]);
            return mFrames[i];
        }
    }
    return FrameItem();
}

FrameItem FrameList::getNewestFrameAndLock() {
    std::lock_guard lock(mMutex);
    if (mFrames.empty()) return FrameItem();
    lockLocked(mFrames.back());
    return mFrames.back();
}

void FrameList::unlock(const nsecs_t& t) {
    {
        std::lock_guard lock(mMutex);
        auto position = std::lower_bound(mLocks.begin(), mLocks.end(), t);
        if (position != mLocks.end() && *position == t) {
            mLocks.erase(position);
            ILOG(2, "FrameList::unlock unlocking %lu", t);
        } else {
            ILOG(1, "FrameList attempted to unlock non-locked frame %lu", t);
        }
    }
    mUnlockCondition.notify_all();
}

void FrameList::unlockAll() {
    {
        std::lock_guard lock(mMutex);
        mLocks.clear();
    }
    mUnlockCondition.notify_all();
}

void FrameList::killLocks() {
    {
        std::lock_guard lock(mMutex);
        mLockingEnabled = false;
    }
    {
        std::lock_guard lock(mMutex);
        mLocks.clear();
    }
    mUnlockCondition.notify_all();
}

bool FrameList::isOldestFrameUnused(const nsecs_t& t) {
    std::lock_guard lock(mMutex);
    return isOldestFrameUnusedLocked(t);
}

bool FrameList::isOldestFrameUnusedLocked(const nsecs_t& t) {
    bool valid;
    return frameAtLocked(t, -2, valid) != nullptr && valid;
}

void FrameList::waitWhileLockedLocked(nsecs_t id, std::unique_lock<std::mutex>& lock) {
    while (isLockedLocked(id) && hasFrameAtLocked(id)) {
        mUnlockCondition.wait(lock);
    }
}

FrameItem FrameList::clearOldestFrameLockedLocking(std::unique_lock<std::mutex>& lock) {
    if (mFrames.empty()) return FrameItem();
    // Without a wait the front cannot change, and the frame taken out is the result itself.
    if (!isLockedLocked(mFrames.front().mID)) return mFrames.pop_front();
    FrameItem oldest = mFrames.front();
    waitWhileLockedLocked(oldest.mID, lock);
    // Whatever is at the front now goes; another removal may have emptied the list meanwhile.
    if (!mFrames.empty()) mFrames.pop_front();
    return oldest;
}

std::vector<FrameItem> FrameList::clearOldestFrameLocking() {
    Interpolation::ScopedTrace trace("clearOldestFrameLocking");
    UniqueLock<std::mutex> lock(mMutex);
    return validOnly(clearOldestFrameLockedLocking(lock));
}

std::vector<FrameItem> FrameList::clearOldestFrameIfUnusedLocking(const nsecs_t& t) {
    Interpolation::ScopedTrace trace("clearOldestFrameIfUnusedLocking");
    UniqueLock<std::mutex> lock(mMutex);
    if (!isOldestFrameUnusedLocked(t)) return {};
    return validOnly(clearOldestFrameLockedLocking(lock));
}

FrameItem FrameList::clearFrameAtLocking(const nsecs_t& t) {
    Interpolation::ScopedTrace trace("clearFrameAtLocking");
    FrameItem frame = getFrameAt(t);
    std::unique_lock lock(mMutex);
    waitWhileLockedLocked(frame.mID, lock);
    if (hasFrameAtLocked(frame.mID)) {
        auto found = std::find_if(mFrames.begin(), mFrames.end(), [&](const FrameItem& queued) {
            return queued.mTimestamp == frame.mTimestamp;
        });
        if (found != mFrames.end()) mFrames.erase(found);
    }
    return frame;
}

std::vector<FrameItem> FrameList::clearEveryFrame() {
    std::lock_guard lock(mMutex);
    std::vector<FrameItem> removed;
    removed.reserve(mFrames.size());
    while (!mFrames.empty())
        removed.push_back(mFrames.pop_front());
    return removed;
}

std::vector<FrameItem> FrameList::clearEveryFrameButTheNewestOne() {
    std::lock_guard lock(mMutex);
    // Keep the newest acquired frame and everything newer; with no acquired frame this counts one
    // more than the queue holds, so nothing goes.
    size_t keep = 1;
    for (size_t i = mFrames.size(); i-- > 0;) {
        if (mFrames[i].mAcquired) break;
        keep++;
    }
    ILOG(2, "FrameList::clearEveryFrameButTheNewestOne will leave %d frames in the queue.",
         static_cast<int>(keep));
    std::vector<FrameItem> removed;
    while (mFrames.size() > keep)
        removed.push_back(mFrames.pop_front());
    return removed;
}

int FrameList::getPresentQueueIndex(const nsecs_t& t) const {
    int present = 0;
    for (const FrameItem& frame : mFrames) {
        if (frame.mID > t) break;
        present++;
    }
    return present;
}

int FrameList::getFrameIndexBeforeLocked(const nsecs_t& t) const {
    if (mFrames.empty()) return -1;
    return getPresentQueueIndex(t) - 1;
}

int FrameList::getIndexForFrame(const nsecs_t& t, const FrameItem& frame) const {
    if (!frame.isValid()) {
        ILOG(1, "FrameList passed an invalid FrameItem");
        return 0;
    }
    for (size_t p = 0; p < mFrames.size(); p++) {
        if (mFrames[p].mTimestamp == frame.mTimestamp) {
            const int index = static_cast<int>(p) - getPresentQueueIndex(t);
            return t < frame.mID ? index + 1 : index;
        }
    }
    ILOG(1, "FrameList passed a Frame not in the list");
    return 0;
}

void FrameList::dump(String8& out, const char* prefix) const {
    std::lock_guard lock(mMutex);
    dumpLocked(out, prefix);
}

void FrameList::dumpLocked(String8& out, const char* prefix) const {
    for (size_t i = 0; i < mFrames.size(); i++) {
        const FrameItem& frame = mFrames[i];
        out.appendFormat("%sFrame %d -- ", prefix, static_cast<int>(i));
        out.appendFormat(
                "%smIndex %lu mTextureSlot=%d mTimestamp=%lu mID %lu mGraphicBuffer=%p "
                "mAcquireFence=%p mAcquired=%s%s",
                "", frame.mIndex, frame.mTextureSlot, frame.mTimestamp, frame.mID,
                frame.mGraphicBuffer.get(), frame.mAcquireFence.get(),
                frame.mAcquired ? "true" : "false", "");
        out.appendFormat(" locked=%s\n", isLockedLocked(frame.mID) ? "true" : "false");
    }
}

}  // namespace android
