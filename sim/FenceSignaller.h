#pragma once

#include <ui/Fence.h>

#include <condition_variable>
#include <mutex>
#include <queue>
#include <thread>
#include <utility>
#include <vector>

#include "sim/FenceScheduler.h"

namespace verolux::sim {

// The simulated GPU in real time: a thread that signals each acquire fence when it is due.
class FenceSignaller final : public FenceScheduler {
public:
    FenceSignaller();
    ~FenceSignaller() override;
    FenceSignaller(const FenceSignaller&) = delete;
    FenceSignaller& operator=(const FenceSignaller&) = delete;

    void signalAt(android::sp<android::Fence> fence, nsecs_t time) override;
    // Signals what is still pending at once, and ends the thread.
    void stop();

private:
    using Pending = std::pair<nsecs_t, android::sp<android::Fence>>;
    struct Later {
        bool operator()(const Pending& a, const Pending& b) const { return a.first > b.first; }
    };

    void run();

    std::mutex mMutex;
    std::condition_variable mCondition;
    std::priority_queue<Pending, std::vector<Pending>, Later> mPending;  // guarded by mMutex
    bool mStopping = false;                                              // guarded by mMutex
    std::thread mThread;
};

}  // namespace verolux::sim
