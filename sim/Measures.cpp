#include "sim/Measures.h"

#include <algorithm>
#include <cmath>

namespace verolux::sim {

namespace {

constexpr nsecs_t US = 1'000;
constexpr nsecs_t MS = 1'000'000;
constexpr double NS_PER_MS = 1e6;
constexpr nsecs_t FRAME_TIME_RESOLUTION = 10 * US;

std::optional<double> ms(std::optional<nsecs_t> ns) {
    if (!ns) return std::nullopt;
    return static_cast<double>(*ns) / NS_PER_MS;
}

std::optional<double> fps(std::optional<double> frameTimeNs) {
    if (!frameTimeNs || *frameTimeNs <= 0) return std::nullopt;
    return 1e9 / *frameTimeNs;
}

Rates ratesOf(const Histogram& frameTimes) {
    Rates rates;
    rates.average = fps(frameTimes.mean());
    rates.low1 = fps(frameTimes.meanOfLargest(0.01));
    rates.low01 = fps(frameTimes.meanOfLargest(0.001));
    return rates;
}

std::array<int64_t, 7> statisticValues(const host::FrameRateStatistics& s) {
    return {s.gameFps,   static_cast<int64_t>(s.realFps),
            s.actualFps, s.interpolatedFps,
            s.missedFps, s.repeatedFps,
            s.skippedFps};
}

}  // namespace

const std::array<const char*, 7>& statisticNames() {
    static const std::array<const char*, 7> NAMES = {"game",   "real",     "actual", "interpolated",
                                                     "missed", "repeated", "skipped"};
    return NAMES;
}

// Frame times, latencies and ages: 10 us bins to 100 ms, 1 ms bins to 10 s. CPU time: 100 ns bins
// to 1 ms, 10 us bins to 100 ms.
Measures::Measures(nsecs_t refreshPeriod)
    : mRefreshPeriod(refreshPeriod),
      mGameFrameTimes(FRAME_TIME_RESOLUTION, 100 * MS),
      mLatency(FRAME_TIME_RESOLUTION, 100 * MS),
      mAnimationError(FRAME_TIME_RESOLUTION, 100 * MS),
      mDisplayFrameTimes(FRAME_TIME_RESOLUTION, 100 * MS),
      mContentAge(FRAME_TIME_RESOLUTION, 100 * MS),
      mCpu(100, 1 * MS) {}

void Measures::onFrame(const FrameRecord& frame) {
    if (frame.queueTime < 0) return;  // never queued: the run ended while the game drew it
    mFramesQueued++;
    if (mLastQueueTime >= 0) mGameFrameTimes.add(frame.queueTime - mLastQueueTime);
    mLastQueueTime = frame.queueTime;
    if (frame.startTime >= 0 && frame.dequeueTime >= frame.startTime) {
        mBufferWait += frame.dequeueTime - frame.startTime;
    }
    if (frame.engineTimestamp >= 0 && frame.engineTimestamp != frame.timestamp) {
        mClockTimeFrom = std::min(mClockTimeFrom.value_or(frame.queueTime), frame.queueTime);
    }
    if (!frame.dropped()) {
        mFramesShown++;
        mLatency.add(frame.firstPresentTime - frame.queueTime);
    }
}

void Measures::onRefresh(const RefreshRecord& refresh) {
    mRefreshes++;
    MeasuredLayer& h = mHost;
    if (h.detectedRefreshRate != refresh.refreshRate) h.refreshRateSettled = refresh.presentTime;
    h.detectedRefreshRate = refresh.refreshRate;
    h.refusedPresentations += refresh.refused;
    h.clientCompositions += refresh.clientComposed;
    if (refresh.gameRateLimit > 0) {
        if (!h.firstGameRateLimit) h.firstGameRateLimit = refresh.gameRateLimit;
        h.lastGameRateLimit = refresh.gameRateLimit;
        h.lowestGameRateLimit = std::min(h.lowestGameRateLimit.value_or(refresh.gameRateLimit),
                                         refresh.gameRateLimit);
    }
    h.gameRateLimitApplied = refresh.gameRateLimitApplied;
    if (refresh.gameRateLimitApplied && !h.gameRateLimitAppliedFrom) {
        h.gameRateLimitAppliedFrom = refresh.presentTime;
    }
    if (refresh.interpolating) {
        h.interpolatedAtAll = true;
    } else if (h.interpolatedAtAll && !h.interpolationOffAt) {
        h.interpolationOffAt = refresh.presentTime;
    }

    mPictures[static_cast<size_t>(refresh.picture)]++;
    if (refresh.cpuTime >= 0) mCpu.add(refresh.cpuTime);
    if (mLastIndex && refresh.index > *mLastIndex + 1) {
        mSkippedVsyncs += refresh.index - *mLastIndex - 1;
    }
    mLastIndex = refresh.index;

    if (refresh.contentTime >= 0) {
        mContentAge.add(refresh.presentTime -
                        static_cast<nsecs_t>(std::llround(refresh.contentTime)));
        if (mLastContent >= 0) {
            const double error = (refresh.contentTime - mLastContent) -
                                 static_cast<double>(refresh.presentTime - mLastPresent);
            const auto magnitude = static_cast<nsecs_t>(std::llround(std::fabs(error)));
            mAnimationError.add(magnitude);
            // The period of this refresh: the display may change its rate during a run.
            const nsecs_t period = refresh.presentTime > refresh.vsyncTime
                                           ? refresh.presentTime - refresh.vsyncTime
                                           : mRefreshPeriod;
            if (2 * magnitude > period) mErrorsOverHalfPeriod++;
        }
        mLastContent = refresh.contentTime;
        mLastPresent = refresh.presentTime;
    }

    if (refresh.picture == Picture::BLEND || refresh.picture == Picture::NEW) {
        if (mLastNewPicture >= 0) {
            const Stutter gap{refresh.presentTime, refresh.presentTime - mLastNewPicture};
            mDisplayFrameTimes.add(gap.gap);
            if (mLongestGaps.size() < MAX_LISTED_STUTTERS) {
                mLongestGaps.push(gap);
            } else if (gap.gap > mLongestGaps.top().gap) {
                mLongestGaps.pop();
                mLongestGaps.push(gap);
            }
        }
        mLastNewPicture = refresh.presentTime;
    }
}

void Measures::onDelayChange(nsecs_t time, nsecs_t delay) {
    if (!mFirstDelay) mFirstDelay = delay;
    mLastDelay = delay;
    mDelayChanges++;
}

void Measures::onStatistics(const StatisticsRecord& statistics) {
    const std::array<int64_t, 7> values = statisticValues(statistics.rates);
    for (size_t i = 0; i < values.size(); i++) {
        MeasuredLayer::Spread& spread = mHost.statistics[i];
        spread.min = mHost.statisticSeconds == 0 ? values[i] : std::min(spread.min, values[i]);
        spread.max = mHost.statisticSeconds == 0 ? values[i] : std::max(spread.max, values[i]);
        mStatisticSums[i] += values[i];
    }
    mHost.statisticSeconds++;
    mHost.lastStatistics = statistics.rates;
}

void Measures::onWarning(const WarningRecord& warning) {
    if (mHost.warnings.size() < MAX_LEDGER) mHost.warnings.push_back(warning);
    mHost.warningCount++;
}

MeasuredLayer Measures::result() const {
    MeasuredLayer m = mHost;
    for (size_t i = 0; i < m.statistics.size() && m.statisticSeconds > 0; i++) {
        m.statistics[i].mean =
                static_cast<double>(mStatisticSums[i]) / static_cast<double>(m.statisticSeconds);
    }
    m.framesQueued = mFramesQueued;
    m.gameFps = ratesOf(mGameFrameTimes);
    m.bufferWaitMs = static_cast<double>(mBufferWait) / NS_PER_MS;
    m.clockTimeFrom = mClockTimeFrom;

    m.displayFps = ratesOf(mDisplayFrameTimes);
    m.refreshes = mRefreshes;
    m.pictures = mPictures;
    m.framesShown = mFramesShown;
    m.framesDropped = mFramesQueued - mFramesShown;
    m.skippedVsyncs = mSkippedVsyncs;

    m.errorP50Ms = ms(mAnimationError.percentile(50));
    m.errorP95Ms = ms(mAnimationError.percentile(95));
    m.errorP99Ms = ms(mAnimationError.percentile(99));
    m.errorMaxMs = ms(mAnimationError.max());
    if (mAnimationError.count() > 0) {
        m.errorOverHalfPeriodShare = static_cast<double>(mErrorsOverHalfPeriod) /
                                     static_cast<double>(mAnimationError.count());
    }

    if (const auto median = mDisplayFrameTimes.percentile(50)) {
        m.medianGapMs = ms(median);
        // The median is known to the histogram's resolution; gaps within it of 1.5 x (three
        // refreshes against two) are not stutters.
        const nsecs_t threshold =
                static_cast<nsecs_t>(std::llround(STUTTER_FACTOR * static_cast<double>(*median))) +
                FRAME_TIME_RESOLUTION;
        auto gaps = mLongestGaps;
        // All gaps above the threshold were kept unless the shortest kept one is above it too.
        const bool allKept = gaps.size() < MAX_LISTED_STUTTERS || gaps.top().gap <= threshold;
        while (!gaps.empty()) {
            if (gaps.top().gap > threshold) m.stutters.push_back(gaps.top());
            gaps.pop();
        }
        m.stutterCount = allKept ? m.stutters.size() : mDisplayFrameTimes.countAbove(threshold);
        std::sort(m.stutters.begin(), m.stutters.end(),
                  [](const Stutter& a, const Stutter& b) { return a.time < b.time; });
    }

    m.latencyP50Ms = ms(mLatency.percentile(50));
    m.latencyP99Ms = ms(mLatency.percentile(99));
    m.contentAgeP50Ms = ms(mContentAge.percentile(50));
    m.contentAgeP99Ms = ms(mContentAge.percentile(99));

    if (mFirstDelay) {
        m.startDelayMs = static_cast<double>(*mFirstDelay) / NS_PER_MS;
        m.endDelayMs = static_cast<double>(mLastDelay) / NS_PER_MS;
    }
    m.delayChanges = mDelayChanges > 0 ? mDelayChanges - 1 : 0;  // the first is the start

    if (const auto mean = mCpu.mean()) m.cpuMeanUs = *mean / 1e3;
    if (const auto p99 = mCpu.percentile(99)) m.cpuP99Us = static_cast<double>(*p99) / 1e3;
    return m;
}

}  // namespace verolux::sim
