#include "sim/GameScript.h"

#include <algorithm>
#include <cmath>

namespace verolux::sim {

GameScript::GameScript(double fps, double jitterMs, double renderMs,
                       const std::vector<GameSegment>* segments)
    : mBase{fps, jitterMs, renderMs, std::nullopt, false},
      mSegments(segments != nullptr && !segments->empty() ? segments : nullptr),
      mSpikesTaken(mSegments != nullptr ? mSegments->size() : 0, -1),
      mFramesIn(mSegments != nullptr ? mSegments->size() : 0, 0) {}

namespace {

bool covers(const GameSegment& segment, double sec) {
    return sec >= segment.from && (!segment.until || sec < *segment.until);
}

// Steps of the integral of the game's rate over time.
constexpr double MEAN_STEP_SEC = 0.01;

}  // namespace

GameScript::Pace GameScript::paceAt(double sec) const {
    Pace pace = mBase;
    if (mSegments == nullptr) return pace;
    for (const GameSegment& segment : *mSegments) {
        if (!covers(segment, sec)) continue;
        if (segment.fps) pace.fps = *segment.fps;
        if (segment.rampTo) {
            const double phase = std::fmod(sec - segment.from, *segment.rampSec) / *segment.rampSec;
            pace.fps = *segment.fps + (*segment.rampTo - *segment.fps) * phase;
        }
        if (segment.jitterMs) pace.jitterMs = *segment.jitterMs;
        if (segment.renderMs) pace.renderMs = *segment.renderMs;
    }
    return pace;
}

double GameScript::meanFps(double sec) const {
    if (mSegments == nullptr || sec <= 0) return mBase.fps;
    double frames = 0;
    for (double t = 0; t < sec; t += MEAN_STEP_SEC)
        frames += paceAt(t).fps * std::min(MEAN_STEP_SEC, sec - t);
    return frames / sec;
}

GameScript::Pace GameScript::next(double sec) {
    Pace pace = paceAt(sec);
    if (mSegments == nullptr) return pace;
    for (size_t i = 0; i < mSegments->size(); i++) {
        const GameSegment& segment = (*mSegments)[i];
        if (!covers(segment, sec)) continue;
        const double into = sec - segment.from;
        if (segment.spikeEverySec) {
            const auto spike = static_cast<int64_t>(std::floor(into / *segment.spikeEverySec));
            if (spike > mSpikesTaken[i]) {
                mSpikesTaken[i] = spike;
                pace.spikeRenderMs = segment.spikeRenderMs;
            }
        }
        mFramesIn[i]++;
        if (segment.reuseTimestampEvery) {
            pace.reuseTimestamp = mFramesIn[i] % *segment.reuseTimestampEvery == 0;
        }
    }
    return pace;
}

}  // namespace verolux::sim
