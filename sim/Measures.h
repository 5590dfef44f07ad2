#pragma once

#include <array>
#include <optional>
#include <queue>
#include <vector>

#include "sim/Histogram.h"
#include "sim/Recording.h"

namespace verolux::sim {

// Frame rates from frame times: the average is 1 / the mean frame time, the 1 % and 0.1 % lows
// 1 / the mean of the longest 1 % and 0.1 % of the frame times.
struct Rates {
    std::optional<double> average;
    std::optional<double> low1;
    std::optional<double> low01;
};

// A display-side gap longer than 1.5 x the median: the present time that ended it, and its length.
struct Stutter {
    nsecs_t time = 0;
    nsecs_t gap = 0;
};

// What a layer's records add up to; the README defines each measure. Durations in milliseconds.
struct MeasuredLayer {
    // Game side: frames the game queued.
    uint64_t framesQueued = 0;
    Rates gameFps;
    double bufferWaitMs = 0;  // the producer's waits for a free buffer, summed
    // The queue time of the first frame the engine stamped with its own clock rather than the
    // game's timestamp (as it does for good once the game reused a timestamp).
    std::optional<nsecs_t> clockTimeFrom;

    // Display side.
    Rates displayFps;
    uint64_t refreshes = 0;
    std::array<uint64_t, 4> pictures{};  // by Picture
    uint64_t framesShown = 0;            // frames that led a picture at some present
    uint64_t framesDropped = 0;          // queued frames that never did
    uint64_t skippedVsyncs = 0;

    // Motion: |animation error| per refresh.
    std::optional<double> errorP50Ms, errorP95Ms, errorP99Ms, errorMaxMs;
    std::optional<double> errorOverHalfPeriodShare;  // 0 to 1

    std::optional<double> medianGapMs;
    uint64_t stutterCount = 0;
    std::vector<Stutter> stutters;  // in time order; the longest MAX_LISTED_STUTTERS when more

    std::optional<double> latencyP50Ms, latencyP99Ms;
    std::optional<double> contentAgeP50Ms, contentAgeP99Ms;

    std::optional<double> startDelayMs, endDelayMs;
    uint64_t delayChanges = 0;  // after the first delay

    std::optional<double> cpuMeanUs, cpuP99Us;

    // What the host reported at the refreshes.
    std::optional<int32_t> detectedRefreshRate;  // at the last refresh
    std::optional<nsecs_t> refreshRateSettled;   // present time from which it held that value
    uint64_t refusedPresentations = 0;
    uint64_t clientCompositions = 0;
    std::optional<int32_t> firstGameRateLimit, lastGameRateLimit, lowestGameRateLimit;
    std::optional<nsecs_t> gameRateLimitAppliedFrom;  // the first refresh it was applied at
    bool gameRateLimitApplied = false;                // at the last refresh
    bool interpolatedAtAll = false;
    std::optional<nsecs_t> interpolationOffAt;  // the first refresh without it, after one with it

    // The library's per-second statistics: mean, lowest and highest over the seconds sampled.
    struct Spread {
        double mean = 0;
        int64_t min = 0;
        int64_t max = 0;
    };
    uint64_t statisticSeconds = 0;
    std::array<Spread, 7> statistics{};  // in the order of statisticNames()
    std::optional<host::FrameRateStatistics> lastStatistics;

    std::vector<WarningRecord> warnings;  // the first MAX_LEDGER
    uint64_t warningCount = 0;
};

// "game", "real", "actual", "interpolated", "missed", "repeated", "skipped".
const std::array<const char*, 7>& statisticNames();

// Computes a layer's measures from its records as they come, in memory that does not grow with
// the run's length.
class Measures final : public RecordSink {
public:
    static constexpr size_t MAX_LISTED_STUTTERS = 256;
    static constexpr double STUTTER_FACTOR = 1.5;
    static constexpr size_t MAX_LEDGER = 1000;

    explicit Measures(nsecs_t refreshPeriod);

    void onFrame(const FrameRecord& frame) override;
    void onRefresh(const RefreshRecord& refresh) override;
    void onDelayChange(nsecs_t time, nsecs_t delay) override;
    void onStatistics(const StatisticsRecord& statistics) override;
    void onWarning(const WarningRecord& warning) override;

    MeasuredLayer result() const;

private:
    struct LongerGap {
        bool operator()(const Stutter& a, const Stutter& b) const { return a.gap > b.gap; }
    };

    const nsecs_t mRefreshPeriod;

    // Game side.
    uint64_t mFramesQueued = 0;
    uint64_t mFramesShown = 0;
    nsecs_t mLastQueueTime = -1;
    nsecs_t mBufferWait = 0;
    std::optional<nsecs_t> mClockTimeFrom;
    Histogram mGameFrameTimes;
    Histogram mLatency;

    // Display side.
    uint64_t mRefreshes = 0;
    std::array<uint64_t, 4> mPictures{};
    uint64_t mSkippedVsyncs = 0;
    std::optional<uint64_t> mLastIndex;
    nsecs_t mLastPresent = -1;
    double mLastContent = -1;
    nsecs_t mLastNewPicture = -1;
    uint64_t mErrorsOverHalfPeriod = 0;
    Histogram mAnimationError;
    Histogram mDisplayFrameTimes;
    Histogram mContentAge;
    Histogram mCpu;
    // The longest gaps, shortest on top.
    std::priority_queue<Stutter, std::vector<Stutter>, LongerGap> mLongestGaps;

    std::optional<nsecs_t> mFirstDelay;
    nsecs_t mLastDelay = -1;
    uint64_t mDelayChanges = 0;

    // Host side; the statistics as sums, lowest and highest.
    MeasuredLayer mHost;
    std::array<int64_t, 7> mStatisticSums{};
};

}  // namespace verolux::sim
