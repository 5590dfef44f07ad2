#include <condition_variable>
#include <mutex>
#include <thread>

namespace {

// A second thread, parked for the life of the process and started before any benchmark runs: a
// compositor is multi-threaded, and with a single thread the C++ runtime takes cheaper paths (the
// reference counts of shared pointers, for one) than the library meets in a compositor.
class ParkedThread {
public:
    ParkedThread()
        : mThread([this] {
              std::unique_lock lock(mMutex);
              mWake.wait(lock, [this] { return mDone; });
          }) {}
    ~ParkedThread() {
        {
            std::lock_guard lock(mMutex);
            mDone = true;
        }
        mWake.notify_all();
        mThread.join();
    }

private:
    std::mutex mMutex;
    std::condition_variable mWake;
    bool mDone = false;  // guarded by mMutex
    std::thread mThread;
};

ParkedThread sSecondThread;

}  // namespace
