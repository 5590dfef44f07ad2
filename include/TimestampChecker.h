#pragma once

#include <utils/Timers.h>

#include <cstdint>
#include <unordered_map>
#include <vector>

#include "FrameList.h"

namespace android::Interpolation {

// Keeps the queue's identity rule (one frame per timestamp) against producers that hand out equal
// timestamps for different frames: from the first collision on, the layer's frames are stamped
// with the time of interception instead. The acquire call of a buffer gets exactly the timestamp
// its queue call got, so that the list merges the two.
//
// Not thread-safe: its owner serialises the calls.
class TimestampChecker {
public:
    explicit TimestampChecker(const sp<FrameList>& frameList);

    nsecs_t sanitize(const uint64_t& frameNumber, const nsecs_t& timestamp, const bool& acquired);

private:
    using TimestampMap = std::unordered_map<uint64_t, nsecs_t>;

    nsecs_t sanitizeQueued(uint64_t frameNumber, nsecs_t timestamp);
    nsecs_t sanitizeAcquired(uint64_t frameNumber, nsecs_t timestamp);
    nsecs_t clockTimeOr(nsecs_t timestamp) const;

    sp<FrameList> mFrameList;
    bool mUseSystemTime = false;  // once set, never cleared
    // By frame number, from a frame's queue call to its acquire call.
    TimestampMap mTimestamps;
    // Nodes of acquired entries, reused by later queue calls so that a buffer's round trip through
    // the map allocates nothing.
    std::vector<TimestampMap::node_type> mSpareNodes;
};

}  // namespace android::Interpolation
