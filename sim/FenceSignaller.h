#pragma once

#include <ui/Fence.h>

#include <condition_variable>
#include <mutex>
#include <queue>
#include <thread>
#include <utility>
#include <vector>

namespace verolux::sim {

// The simulated GPU: signals each acquire fence when the frame's rendering is done.
class FenceSignaller {
public:
    FenceSignaller();
    ~FenceSignaller();
    FenceSignaller(const FenceSignaller&) = delete;
    FenceSignaller& operator=(const FenceSignaller&) = delete;

    void signalAt(android::sp<android::Fence> fence, nsecs_t time);
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
