#include "TimestampChecker.h"

#include "Log.h"

namespace android::Interpolation {

namespace {

// Enough for every buffer slot to be between its queue and its acquire call at once.
constexpr size_t EXPECTED_IN_FLIGHT = 64;

}  // namespace

TimestampChecker::TimestampChecker(const sp<FrameList>& frameList) : mFrameList(frameList) {
    mTimestamps.max_load_factor(1.0f);
    mTimestamps.reserve(EXPECTED_IN_FLIGHT);
    mSpareNodes.reserve(EXPECTED_IN_FLIGHT);
}

nsecs_t TimestampChecker::sanitize(const uint64_t& frameNumber, const nsecs_t& timestamp,
                                   const bool& acquired) {
    return acquired ? sanitizeAcquired(frameNumber, timestamp)
                    : sanitizeQueued(frameNumber, timestamp);
}

nsecs_t TimestampChecker::clockTimeOr(nsecs_t timestamp) const {
    return mUseSystemTime ? systemTime(SYSTEM_TIME_MONOTONIC) : timestamp;
}

nsecs_t TimestampChecker::sanitizeQueued(uint64_t frameNumber, nsecs_t timestamp) {
    // Once on clock time the answer no longer matters, so the queue is not searched.
    if (!mUseSystemTime && mFrameList->hasFrameAt(timestamp)) mUseSystemTime = true;
    const nsecs_t result = clockTimeOr(timestamp);

    auto found = mTimestamps.find(frameNumber);
    if (found != mTimestamps.end()) {
        found->second = result;
    } else if (!mSpareNodes.empty()) {
        TimestampMap::node_type node = std::move(mSpareNodes.back());
        mSpareNodes.pop_back();
        node.key() = frameNumber;
        node.mapped() = result;
        mTimestamps.insert(std::move(node));
    } else {
        mTimestamps.emplace(frameNumber, result);
    }
    return result;
}

nsecs_t TimestampChecker::sanitizeAcquired(uint64_t frameNumber, nsecs_t timestamp) {
    auto found = mTimestamps.find(frameNumber);
    if (found != mTimestamps.end()) {
        const nsecs_t result = found->second;
        TimestampMap::node_type node = mTimestamps.extract(found);
        if (mSpareNodes.size() < mSpareNodes.capacity()) mSpareNodes.push_back(std::move(node));
        return result;
    }

    if (!mFrameList->hasFrameAt(timestamp)) return timestamp;
    const FrameItem queued = mFrameList->getFrameAt(timestamp);
    // Another frame already holds this timestamp: the producer reused it.
    if (queued.isValid() && queued.mIndex != frameNumber) {
        mUseSystemTime = true;
        return systemTime(SYSTEM_TIME_MONOTONIC);
    }
    ILOG(1,
         "Warning: FrameItem with timestamp %lu is present in FrameList with no record of being "
         "checked by TimestampChecker",
         timestamp);
    return clockTimeOr(timestamp);
}

}  // namespace android::Interpolation
