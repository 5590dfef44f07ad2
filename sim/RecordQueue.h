#pragma once

#include <deque>
#include <mutex>
#include <variant>

#include "sim/Recording.h"

namespace verolux::sim {

// Carries records from the threads of a real-time run to the thread that measures and writes
// them, so that no file is written on the display's or the game's thread. What it holds between
// two drains is what those threads produced in the meantime.
class RecordQueue final : public RecordSink {
public:
    void onFrame(const FrameRecord& frame) override { push(frame); }
    void onRefresh(const RefreshRecord& refresh) override { push(refresh); }
    void onDelayChange(nsecs_t time, nsecs_t delay) override { push(DelayChange{time, delay}); }
    void onStatistics(const StatisticsRecord& statistics) override { push(statistics); }
    void onWarning(const WarningRecord& warning) override { push(warning); }

    // Hands everything queued so far to `sink`, in the order it came.
    void drainInto(RecordSink& sink);

private:
    struct DelayChange {
        nsecs_t time;
        nsecs_t delay;
    };
    using Record =
            std::variant<FrameRecord, RefreshRecord, DelayChange, StatisticsRecord, WarningRecord>;

    void push(Record record);

    std::mutex mMutex;
    std::deque<Record> mRecords;   // guarded by mMutex
    std::deque<Record> mDraining;  // drain thread only
};

}  // namespace verolux::sim
