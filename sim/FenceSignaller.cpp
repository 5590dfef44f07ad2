#include "sim/FenceSignaller.h"

#include <chrono>

namespace verolux::sim {

namespace {

// systemTime(SYSTEM_TIME_MONOTONIC) and the steady clock are both CLOCK_MONOTONIC here.
std::chrono::steady_clock::time_point toTimePoint(nsecs_t time) {
    return std::chrono::steady_clock::time_point(std::chrono::nanoseconds(time));
}

}  // namespace

FenceSignaller::FenceSignaller() : mThread(&FenceSignaller::run, this) {}

FenceSignaller::~FenceSignaller() {
    stop();
}

void FenceSignaller::signalAt(android::sp<android::Fence> fence, nsecs_t time) {
    {
        std::lock_guard lock(mMutex);
        mPending.emplace(time, std::move(fence));
    }
    mCondition.notify_one();
}

void FenceSignaller::stop() {
    {
        std::lock_guard lock(mMutex);
        mStopping = true;
    }
    mCondition.notify_one();
    if (mThread.joinable()) mThread.join();
}

void FenceSignaller::run() {
    std::unique_lock lock(mMutex);
    while (true) {
        if (mPending.empty()) {
            if (mStopping) return;
            mCondition.wait(lock);
            continue;
        }
        const nsecs_t due = mPending.top().first;
        if (!mStopping && systemTime(SYSTEM_TIME_MONOTONIC) < due) {
            mCondition.wait_until(lock, toTimePoint(due));
            continue;
        }
        android::sp<android::Fence> fence = mPending.top().second;
        mPending.pop();
        lock.unlock();
        fence->signal(systemTime(SYSTEM_TIME_MONOTONIC));
        lock.lock();
    }
}

}  // namespace verolux::sim
