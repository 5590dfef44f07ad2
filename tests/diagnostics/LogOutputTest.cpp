#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <regex>

#include "LogOutput.h"
#include "Tunables.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"
#include "support/TestClock.h"
#include "support/TraceCapture.h"

namespace android::Interpolation {
namespace {

using testing::ElementsAre;

constexpr nsecs_t MS = 1'000'000, SECOND = 1000 * MS, NOW = 100 * SECOND;

class LogOutputTest : public testing::Test {
protected:
    LogOutputTest() { EventDispatcher::subscribe(mUid, eRealFPSChangedEvent, mEvents); }

    // n events of the counter in the last second.
    void recordRecent(EventAggregator::Counter counter, int n) {
        for (int i = 0; i < n; i++)
            mAggregator->record(counter, mClock.now() - i * MS);
    }

    test::TestClock mClock{NOW};
    const uint32_t mUid = test::nextTestUid();
    sp<test::RecordingReceiver> mEvents = new test::RecordingReceiver();
    sp<EventAggregator> mAggregator = new EventAggregator(4);
    sp<MachineLearning::RealFPSTracker> mRealFps = new MachineLearning::RealFPSTracker(mUid);
    sp<LogOutput> mOutput = new LogOutput(mAggregator, mRealFps);
};

// Each rate counts the times of the last second newest first, down to the first older one; a full
// ring of recent times counts its capacity.
TEST_F(LogOutputTest, tockLogsEightLinesInOrderAndNothingAtLevelZero) {
    for (uint32_t counter = 0; counter < EventAggregator::COUNTER_COUNT; counter++) {
        if (counter != EventAggregator::eMissedFrames)
            recordRecent(static_cast<EventAggregator::Counter>(counter),
                         counter == 0 ? 6 : counter % 4);
    }
    for (nsecs_t t : {NOW - 100 * MS, NOW - 2 * SECOND, NOW - SECOND, NOW})
        mAggregator->record(EventAggregator::eMissedFrames, t);
    // One buffer provided before now, 0.1 s after the one before it: 10 fps.
    for (nsecs_t t : {NOW - 200 * MS, NOW - 100 * MS, NOW}) {
        mRealFps->setReferenceTime(t);
        mRealFps->logBufferProvided(t);
    }
    test::LogCapture log(0);
    mOutput->tock();
    EXPECT_TRUE(log.texts().empty());
    EXPECT_TRUE(mEvents->events().empty());  // the real rate was not even read
    logLevel.store(1);
    mOutput->tock();
    // Actual: counters 3 + 1 + 4 = 3 + 1 + 0.
    EXPECT_THAT(log.texts(),
                ElementsAre("LogOutput: Game FPS 4\n", "LogOutput: Real Game FPS 10\n",
                            "LogOutput: Actual FPS 4\n", "LogOutput: Interpolated FPS 1\n",
                            "LogOutput: Missed FPS 2\n", "LogOutput: Repeated FPS 1\n",
                            "LogOutput: Skipped FPS 2\n",
                            "FrameInterpolation: Original FPS: 4, FPS with interpolation: 4"));

    String8 dump;
    mOutput->dumpState(dump, "  ");
    mOutput->dumpVersionInfo(dump, "  ");
    EXPECT_TRUE(std::regex_match(dump.c_str(),
                                 std::regex("  Log: game fps=4, actual fps=4, interpolated fps=1, "
                                            "missed fps=2, repeated fps=1\n  Version: 1\\.5\n"
                                            "  Checksum: [0-9a-f]{64}\n")))
            << dump.c_str();
}

// Called 3.5 s after the first reference: one tick, three tocks; called again at once: one more
// tick, since the tick timer is still behind, and no tock.
TEST_F(LogOutputTest, outputLogsTicksOncePerCallAndTocksOncePerElapsedSecond) {
    mClock.advance(3500 * MS);
    recordRecent(EventAggregator::eGameFrames, 3);
    recordRecent(EventAggregator::eInterpolatedFrames, 2);
    test::LogCapture log(0);
    test::TraceCapture trace;
    mOutput->outputLogs();
    mOutput->outputLogs();
    EXPECT_THAT(trace.events(),
                testing::ElementsAreArray({"B|outputLogs", "B|tick", "B|getGameFPS", "E",
                                           "C|Game FPS|3", "B|getActualFPS", "E", "C|Actual FPS|2",
                                           "E", "B|tock", "E", "B|tock", "E", "B|tock", "E", "E",
                                           // the second call
                                           "B|outputLogs", "B|tick", "B|getGameFPS", "E",
                                           "C|Game FPS|3", "B|getActualFPS", "E", "C|Actual FPS|2",
                                           "E", "E"}));
}

}  // namespace
}  // namespace android::Interpolation
