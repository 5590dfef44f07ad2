#include "sim/RecordQueue.h"

namespace verolux::sim {

void RecordQueue::push(Record record) {
    std::lock_guard lock(mMutex);
    mRecords.push_back(std::move(record));
}

void RecordQueue::drainInto(RecordSink& sink) {
    {
        std::lock_guard lock(mMutex);
        mDraining.swap(mRecords);
    }
    for (const Record& record : mDraining) {
        if (const auto* frame = std::get_if<FrameRecord>(&record)) {
            sink.onFrame(*frame);
        } else if (const auto* refresh = std::get_if<RefreshRecord>(&record)) {
            sink.onRefresh(*refresh);
        } else if (const auto* change = std::get_if<DelayChange>(&record)) {
            sink.onDelayChange(change->time, change->delay);
        } else if (const auto* statistics = std::get_if<StatisticsRecord>(&record)) {
            sink.onStatistics(*statistics);
        } else if (const auto* warning = std::get_if<WarningRecord>(&record)) {
            sink.onWarning(*warning);
        }
    }
    mDraining.clear();
}

}  // namespace verolux::sim
