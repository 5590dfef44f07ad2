#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <type_traits>
#include <vector>

#include "RollingStatistics.h"

namespace android::Interpolation::MachineLearning {
namespace {

using testing::ElementsAreArray;

template <typename T>
void feed(RollingMetrics<T>& metrics, std::initializer_list<std::common_type_t<T>> samples) {
    for (T sample : samples)
        metrics.update(sample);
}

template <typename T>
std::vector<T> estimates(RollingPercentile<T>& percentile,
                         std::initializer_list<std::common_type_t<T>> samples) {
    std::vector<T> result;
    for (T sample : samples)
        result.push_back(percentile.update(sample));
    return result;
}

TEST(RollingMetricsTest, dividesByNWhileFillingAndByNMinusOneOnceFull) {
    RollingMetrics<short> metrics(4);
    feed(metrics, {7});
    EXPECT_EQ(7.0, metrics.mean());
    EXPECT_EQ(0.0, metrics.stddev());

    feed(metrics, {-7, -7, 7});
    EXPECT_EQ(0.0, metrics.mean());
    EXPECT_EQ(49.0, metrics.variance());  // 196 / 4
    EXPECT_EQ(7.0, metrics.stddev());
    // Replacing the oldest 7 by 11: delta 4, mean 0 -> 1, variance 49 + (7 - 0 + (11 - 1)) * 4 / 3.
    feed(metrics, {11});
    EXPECT_EQ(1.0, metrics.mean());
    EXPECT_DOUBLE_EQ(49.0 + 68.0 / 3.0, metrics.variance());
}

TEST(RollingMetricsTest, recomputesWhenTheRunningVarianceCollapses) {
    RollingMetrics<int> metrics(4);
    feed(metrics, {1, 1, 1, 5, 1, 1, 1});
    EXPECT_EQ(3.0, metrics.variance());
    // Dropping the 5: 3 + (5 - 2 + (1 - 1)) * -4 / 3 = -1, so the four 1s are summed again.
    metrics.update(1);
    EXPECT_EQ(1.0, metrics.mean());
    EXPECT_EQ(0.0, metrics.variance());
    EXPECT_EQ(0.0, metrics.stddev());
}

TEST(RollingPercentileTest, followsTheMeanWhileWarmingUpThenStepsAsymmetrically) {
    RollingPercentile<long> percentile(4, 0.75f, 0.5f);
    // 10: the mean before it, 0. 20: 10 + (long)(2 / 0.25) with step (long)(5 * 0.5).
    // 30: 15 + 4 / 0.25. 40: 20 + 5 / 0.25. 0, ring full: 40 - (long)(7 / 0.75), stddev sqrt(250).
    EXPECT_THAT(estimates(percentile, {10, 20, 30, 40, 0}),
                ElementsAreArray<long>({0, 18, 31, 40, 31}));

    RollingPercentile<int> primed(100, 0.5f, 0.005f, 60, 60.0);
    EXPECT_EQ(60, primed.update(90));  // the primed mean seeds the estimate; the step is still 0
}

TEST(RollingPercentileTest, stepsInSinglePrecisionAndClampsOnlyFromAbove) {
    RollingPercentile<int> percentile(4, 0.99f, 0.01f);
    // The first estimate stays far below the samples: there is no lower clamp.
    // 1400: step (int)(sqrt(30000) * 0.01) = 1 rises by 1 / (1 - 0.99f) = 100.00001 -> 100 (a
    // double 0.99 would give 99). Each 1000 then lowers it by (int)(1 / 0.99f) = 1 until the 1400
    // leaves the ring, the deviation becomes 0 and mean + 3 stddev = 1000 caps it.
    EXPECT_THAT(estimates(percentile, {1000, 1000, 1000, 1400, 1000, 1000, 1000, 1000}),
                ElementsAreArray({0, 1000, 1000, 1100, 1099, 1098, 1097, 1000}));

    // The cap is truncated: mean 2 + 3 * sqrt(12) = 12.39.
    RollingPercentile<short> capped(4, 0.99f, 0.5f);
    EXPECT_THAT(estimates(capped, {0, 0, 0, 8}), ElementsAreArray<short>({0, 0, 0, 12}));

    // Two samples 2 * (2^24 + 1) apart: the step 2^24 + 1 becomes the float 2^24.
    RollingPercentile<long> wide(2, 0.5f, 1.0f);
    EXPECT_THAT(estimates(wide, {0, 33'554'434}), ElementsAreArray<long>({0, 33'554'432}));
}

}  // namespace
}  // namespace android::Interpolation::MachineLearning
