#include "sim/Histogram.h"

#include <algorithm>
#include <cmath>

namespace verolux::sim {

namespace {

constexpr nsecs_t COARSE_FACTOR = 100;

}  // namespace

Histogram::Histogram(nsecs_t step, nsecs_t fineLimit)
    : mStep(step),
      mFineLimit(fineLimit),
      // Fine bins, coarse bins up to COARSE_FACTOR x fineLimit, and one for anything longer.
      mBins(static_cast<size_t>(fineLimit / step +
                                (COARSE_FACTOR - 1) * fineLimit / (COARSE_FACTOR * step)) +
                    1,
            0) {}

size_t Histogram::binOf(nsecs_t value) const {
    const size_t fineBins = static_cast<size_t>(mFineLimit / mStep);
    size_t bin;
    if (value < mFineLimit) {
        bin = static_cast<size_t>(value / mStep);
    } else {
        bin = fineBins + static_cast<size_t>((value - mFineLimit) / (COARSE_FACTOR * mStep));
    }
    return std::min(bin, mBins.size() - 1);
}

nsecs_t Histogram::lowerEdge(size_t bin) const {
    const size_t fineBins = static_cast<size_t>(mFineLimit / mStep);
    if (bin < fineBins) return static_cast<nsecs_t>(bin) * mStep;
    return mFineLimit + static_cast<nsecs_t>(bin - fineBins) * COARSE_FACTOR * mStep;
}

nsecs_t Histogram::upperEdge(size_t bin) const {
    if (bin + 1 == mBins.size()) return mMax;
    return lowerEdge(bin + 1);
}

void Histogram::add(nsecs_t value) {
    value = std::max<nsecs_t>(0, value);
    uint32_t& bin = mBins[binOf(value)];
    if (bin < UINT32_MAX) bin++;
    mMin = mCount == 0 ? value : std::min(mMin, value);
    mMax = mCount == 0 ? value : std::max(mMax, value);
    mCount++;
    mSum += static_cast<double>(value);
}

std::optional<double> Histogram::mean() const {
    if (mCount == 0) return std::nullopt;
    return mSum / static_cast<double>(mCount);
}

std::optional<nsecs_t> Histogram::max() const {
    if (mCount == 0) return std::nullopt;
    return mMax;
}

nsecs_t Histogram::middle(size_t bin) const {
    return std::clamp(lowerEdge(bin) + (upperEdge(bin) - lowerEdge(bin)) / 2, mMin, mMax);
}

std::optional<double> Histogram::meanOfLargest(double share) const {
    if (mCount == 0) return std::nullopt;
    const auto wanted = std::max<uint64_t>(
            1, static_cast<uint64_t>(std::ceil(share * static_cast<double>(mCount))));
    uint64_t taken = 0;
    double sum = 0;
    for (size_t bin = mBins.size(); bin-- > 0 && taken < wanted;) {
        const uint64_t take = std::min<uint64_t>(mBins[bin], wanted - taken);
        sum += static_cast<double>(take) * static_cast<double>(middle(bin));
        taken += take;
    }
    return sum / static_cast<double>(taken);
}

std::optional<nsecs_t> Histogram::percentile(double p) const {
    if (mCount == 0) return std::nullopt;
    const auto rank = std::max<uint64_t>(
            1, static_cast<uint64_t>(std::ceil(p / 100.0 * static_cast<double>(mCount))));
    uint64_t seen = 0;
    for (size_t bin = 0; bin < mBins.size(); bin++) {
        seen += mBins[bin];
        if (seen >= rank) return middle(bin);
    }
    return mMax;
}

uint64_t Histogram::countAbove(nsecs_t threshold) const {
    if (mCount == 0 || threshold >= mMax) return 0;
    uint64_t above = 0;
    for (size_t bin = binOf(std::max<nsecs_t>(0, threshold)) + 1; bin < mBins.size(); bin++)
        above += mBins[bin];
    return above;
}

}  // namespace verolux::sim
