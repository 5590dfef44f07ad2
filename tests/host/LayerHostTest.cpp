#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <future>
#include <limits>
#include <mutex>
#include <numeric>
#include <random>
#include <set>
#include <thread>

#include "SettingsController.h"
#include "host/BufferCount.h"
#include "host/LayerHost.h"
#include "support/Frames.h"
#include "support/HangWatchdog.h"

namespace verolux::host {
namespace {

using namespace android;
using namespace android::Interpolation;
using namespace std::chrono_literals;
using std::chrono::steady_clock;

class LayerHostTest : public testing::TestWithParam<uint32_t> {
protected:
    std::unique_ptr<LayerHost> makeHost() {
        LayerHost::Config config;
        config.name = String8("game#5");
        config.uid = mUid;
        config.mode = static_cast<InterpolationMode>(GetParam());
        return std::make_unique<LayerHost>(config, [this](const FrameItem& frame) {
            std::lock_guard lock(mMutex);
            mReturned.push_back(frame.mIndex);
            if (mStopped) mReturnedAfterStop++;
        });
    }

    // Queues and acquires frames 1..count, 10 ms apart from now on.
    void queueFrames(LayerHost& host, int count) {
        const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
        for (int i = 1; i <= count; i++) {
            const sp<GraphicBuffer> buffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
            const sp<Fence> fence = Fence::createSignalled(now);
            host.onBufferDequeued(i, now, now);
            host.onBufferQueued(i, i, buffer, now + i * 10'000'000, fence);
            host.onBufferAcquired(i, i, buffer, now + i * 10'000'000, fence);
        }
    }

    std::vector<uint64_t> returned() {
        std::lock_guard lock(mMutex);
        return mReturned;
    }

    const uint32_t mUid = test::nextTestUid();
    std::mutex mMutex;
    std::vector<uint64_t> mReturned;  // guarded by mMutex
    bool mStopped = false;            // guarded by mMutex
    int mReturnedAfterStop = 0;       // guarded by mMutex
};

TEST_P(LayerHostTest, tearDownWithAStateStillLockedReturnsEveryFrameOnce) {
    std::unique_ptr<LayerHost> host = makeHost();
    host->start();
    queueFrames(*host, 3);
    // A composition whose frames were never given back, as when the display dies mid-frame.
    const RenderState held = host->compose(systemTime(SYSTEM_TIME_MONOTONIC) + 15'000'000);

    const auto start = steady_clock::now();
    host->stop();
    EXPECT_LT(steady_clock::now() - start, 200ms);
    const std::vector<uint64_t> frames = returned();
    EXPECT_EQ(3u, frames.size());
    EXPECT_EQ(3u, std::set<uint64_t>(frames.begin(), frames.end()).size());
    EXPECT_EQ(0u, host->frameList()->size());
}

TEST_P(LayerHostTest, aFrameAcquiredAfterItLeftTheQueueDoesNotComeBack) {
    // A picker may release a queued frame while the buffer queue is acquiring it.
    std::unique_ptr<LayerHost> host = makeHost();
    const sp<GraphicBuffer> buffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
    const sp<Fence> fence = Fence::createSignalled(0);
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    host->onBufferQueued(1, 0, buffer, now, fence);
    host->frameList()->clearEveryFrame();
    host->onBufferAcquired(1, 0, buffer, now, fence);
    EXPECT_EQ(0u, host->frameList()->size());
    host->stop();
    EXPECT_THAT(returned(), testing::ElementsAre(1u));
}

TEST_P(LayerHostTest, aCompositionLeavesNoFrameLockedOnceDone) {
    // Some builders lock a frame they look at without composing it (the unlimited builder's
    // unready newest frame): the frames must still leave the queue once the composition is done.
    deliverSettings(mUid, {{0, 60}});  // gameFpsLimit: the engine composes, not the host
    std::unique_ptr<LayerHost> host = makeHost();
    SettingsController::getInstance()->notifyChanges();
    queueFrames(*host, 2);
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    const sp<GraphicBuffer> buffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
    host->onBufferQueued(3, 3, buffer, now + 30'000'000, Fence::createPending());
    const RenderState state = host->compose(now + 30'000'000);
    host->onCompositionDone(state, now + 30'000'000, nullptr);

    auto removals = std::async(std::launch::async, [&] {
        while (host->frameList()->size() > 0)
            host->frameList()->clearOldestFrameLocking();
    });
    const bool done = removals.wait_for(1s) == std::future_status::ready;
    host->frameList()->killLocks();  // ends a removal that a leaked lock holds
    EXPECT_TRUE(done);
    removals.wait();
    host->stop();
}

TEST_P(LayerHostTest, tearDownEndsTheReleaseThreadWhateverItWaitsForAndWhateverTheMargin) {
    constexpr int32_t MARGINS_MS[] = {std::numeric_limits<int32_t>::min(), -5000, 0, 4};
    std::mt19937 random(GetParam());
    const sp<GraphicBuffer> buffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
    std::vector<nsecs_t> tearDowns;
    std::vector<wp<FrameList>> releaseThreadsLists;
    for (int run = 0; run < 200; run++) {
        {
            std::lock_guard lock(mMutex);
            mStopped = false;
        }
        std::unique_ptr<LayerHost> host = makeHost();
        deliverSettings(mUid, {{/*justInTimeMarginMs*/ 22, MARGINS_MS[run % 4]}});
        host->start();
        // A few milliseconds of frames, some never signalled or acquired, and compositions, the
        // last not given back; then a new frame and a composition far ahead, which a just-in-time
        // picker with a negative margin waits for as long as it may.
        uint64_t n = 0;
        const auto queueFrame = [&](bool signalled, bool acquired) {
            const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
            const sp<Fence> fence = signalled ? Fence::createSignalled(now) : Fence::createPending();
            host->onBufferDequeued(++n % 8, now, now);
            host->onBufferQueued(n, n % 8, buffer, now, fence);
            if (acquired) host->onBufferAcquired(n, n % 8, buffer, now, fence);
        };
        for (const nsecs_t end = systemTime(SYSTEM_TIME_MONOTONIC) + 3'000'000;
             systemTime(SYSTEM_TIME_MONOTONIC) < end;) {
            queueFrame(random() % 4 != 0, random() % 3 != 0);
            const nsecs_t displayTime = systemTime(SYSTEM_TIME_MONOTONIC) - random() % 2'000'000;
            host->onCompositionDone(host->compose(displayTime), displayTime, FenceTime::NO_FENCE);
            std::this_thread::sleep_for(std::chrono::microseconds(random() % 300));
        }
        host->compose(systemTime(SYSTEM_TIME_MONOTONIC));
        queueFrame(true, true);
        const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
        EventDispatcher::broadcastEvent(mUid, eCompositionEstimateEvent, now, now + 10'000'000'000);
        // The release thread may still be on its way out after the tear-down, holding the list:
        // it must not hand any frame back once stop() has returned, and must end on its own.
        releaseThreadsLists.push_back(host->frameList());
        tearDowns.push_back(test::runWithin(1s, [&] {
                                host->stop();
                                {
                                    std::lock_guard lock(mMutex);
                                    mStopped = true;
                                }
                                EXPECT_EQ(0u, host->frameList()->size());
                                host.reset();
                            }).count());
        // Every buffer came back once, whether the release thread or the tear-down let it go.
        std::vector<uint64_t> frames = returned();
        std::sort(frames.begin(), frames.end());
        std::vector<uint64_t> queued(n);
        std::iota(queued.begin(), queued.end(), 1);
        EXPECT_EQ(queued, frames);
        std::lock_guard lock(mMutex);
        mReturned.clear();
    }
    const auto ended = [&] {
        return std::none_of(releaseThreadsLists.begin(), releaseThreadsLists.end(),
                            [](const wp<FrameList>& list) { return list.promote() != nullptr; });
    };
    for (const auto limit = steady_clock::now() + 2s; !ended() && steady_clock::now() < limit;)
        std::this_thread::sleep_for(1ms);
    EXPECT_TRUE(ended());
    std::lock_guard lock(mMutex);
    EXPECT_EQ(0, mReturnedAfterStop);
    std::sort(tearDowns.begin(), tearDowns.end());
    printf("tear-down (stop and destruction) of mode %u over 200 runs: p50 %.3f ms, p99 %.3f ms, "
           "max %.3f ms\n",
           GetParam(), tearDowns[100] / 1e6, tearDowns[198] / 1e6, tearDowns[199] / 1e6);
}

INSTANTIATE_TEST_SUITE_P(AllModes, LayerHostTest, testing::Range(0u, 6u),
                         [](const testing::TestParamInfo<uint32_t>& info) {
                             return "mode" + std::to_string(info.param);
                         });

struct Sizing {
    int32_t queueSize;
    InterpolationMode mode;
    nsecs_t delayMs;
    double hz;
    uint32_t count;
};

TEST(BufferCountTest, holdsTheDelayAtTheRefreshRateWithinBounds) {
    const Sizing cases[] = {
            {-1, eRetimeMode, 100, 120, 14},  // 12 frames within the delay, the shown, the drawn
            {-1, eRetimeMode, 100, 60, 8},    {-1, eRetimeMode, 64, 60, 6},
            {-1, eNoInterpMode, 0, 120, 3},   {-1, eFillInMode, 0, 60, 5},
            {-1, eRetimeMode, 100, 1000, 64},  // the queue's slots end there
            {4, eRetimeMode, 100, 120, 4},
    };
    for (const Sizing& c : cases) {
        const BufferCount count = bufferCountFor(c.queueSize, c.mode, c.delayMs * 1'000'000,
                                                 std::llround(1e9 / c.hz));
        EXPECT_EQ(c.count, count.count) << c.delayMs << " ms at " << c.hz << " Hz";
        EXPECT_EQ(c.queueSize >= 1, count.fixed);
    }
    // The automatic delay may climb to the delayer's ceiling; a fixed one stays.
    Settings settings;
    EXPECT_EQ(100'000'000, longestDisplayDelay(eRetimeMode, true, 64, settings));
    settings.smartDelay = false;
    settings.delayMs = 40;
    EXPECT_EQ(40'000'000, longestDisplayDelay(eRetimeMode, true, 64, settings));
    EXPECT_EQ(0, longestDisplayDelay(eRetimeMode, false, 64, settings));
    EXPECT_EQ(0, longestDisplayDelay(eJustInTimeMode, true, 64, settings));
}

}  // namespace
}  // namespace verolux::host
