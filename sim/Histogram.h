#pragma once

#include <utils/Timers.h>

#include <cstdint>
#include <optional>
#include <vector>

namespace verolux::sim {

// Counts durations in fixed bins, so that percentiles over a run of any length take constant
// memory: `step` wide up to `fineLimit`, then 100 x step wide up to 100 x fineLimit; longer
// values are counted beyond the last bin. A percentile is the middle of its bin, kept within the
// smallest and largest value seen, so a run whose values are all equal reports them exactly.
class Histogram {
public:
    Histogram(nsecs_t step, nsecs_t fineLimit);

    void add(nsecs_t value);  // negative values count as 0

    uint64_t count() const { return mCount; }
    std::optional<double> mean() const;
    std::optional<nsecs_t> max() const;
    // Nearest rank: the value with at least p percent of the values at or below it.
    std::optional<nsecs_t> percentile(double p) const;
    // The mean of the largest `share` (0 to 1) of the values, at least one of them.
    std::optional<double> meanOfLargest(double share) const;
    // How many values are above `threshold`, to the resolution of the bins.
    uint64_t countAbove(nsecs_t threshold) const;

private:
    size_t binOf(nsecs_t value) const;
    nsecs_t lowerEdge(size_t bin) const;
    nsecs_t upperEdge(size_t bin) const;
    nsecs_t middle(size_t bin) const;

    const nsecs_t mStep;
    const nsecs_t mFineLimit;
    std::vector<uint32_t> mBins;
    uint64_t mCount = 0;
    double mSum = 0;
    nsecs_t mMin = 0;
    nsecs_t mMax = 0;
};

}  // namespace verolux::sim
