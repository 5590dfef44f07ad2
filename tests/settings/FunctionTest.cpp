#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>

#include "Function.h"
#include "support/LogCapture.h"

namespace android::Interpolation {
namespace {

using test::LogCapture;
using testing::ElementsAre;

TEST(FunctionTest, dropsPointsOutOfOrderRaisesFallingOnesAndIgnoresAnOddValueButNotNaNs) {
    LogCapture log(1);
    EXPECT_THAT(Function({0.5f, 0.5f, 0.4f, 0.9f}, true).getPoints(),
                ElementsAre(Point{0, 0}, Point{0.5f, 0.5f}, Point{1, 1}));
    // The corrected point does not become the reference for the order check.
    EXPECT_THAT(Function({0, 0, 0.5f, 0.8f, 0.6f, 0.5f, 0.55f, 0.9f}, false).getPoints(),
                ElementsAre(Point{0, 0}, Point{0.5f, 0.8f}, Point{0.6f, 0.8f}, Point{0.55f, 0.9f}));
    EXPECT_THAT(Function({0.1f, 0.2f, 0.3f}, false).getPoints(), ElementsAre(Point{0.1f, 0.2f}));
    // A NaN x is never out of order, a NaN y never raised, and a NaN end is left open.
    const std::vector<Point> nan = Function({0.5f, 0.5f, NAN, 0.6f, 0.7f, NAN}, true).getPoints();
    ASSERT_EQ(4u, nan.size());
    EXPECT_TRUE(std::isnan(nan[2].x) && std::isnan(nan[3].y));
    EXPECT_THAT(log.texts(),
                ElementsAre("Warning: alpha function point is out of order! Ignoring (0.400000, "
                            "0.900000)",
                            "Warning: correction applied to non-increasing sequence of Y values "
                            "used in alpha function settings! (0.600000, 0.500000) -> (0.600000, "
                            "0.800000)",
                            "Warning: odd number (3) of X-Y values used in alpha function "
                            "settings! Ignoring last value (0.300000)"));
}

TEST(FunctionTest, evaluatesSegmentsAndClampsOutsideThemWithAWarning) {
    LogCapture log(1);
    const Function curve({0, 0, 0.2f, 0, 0.8f, 1, 1, 1}, true);
    EXPECT_EQ(0.5f, curve.getY(0.5f));
    EXPECT_EQ(0.0f, curve.getY(0.1f));
    EXPECT_EQ(0.0f, curve.getY(-0.1f));
    // The end of the last segment is outside it: exactly 1 is clamped too, with the warning.
    EXPECT_EQ(1.0f, curve.getY(1.0f));
    EXPECT_EQ(1.0f, curve.getY(NAN));
    EXPECT_THAT(log.texts(),
                ElementsAre("Warning: alpha input -0.100000 out of range in alpha function "
                            "settings! Returning clamped value 0.000000",
                            "Warning: alpha input 1.000000 out of range in alpha function "
                            "settings! Returning clamped value 1.000000",
                            "Warning: alpha input nan out of range in alpha function "
                            "settings! Returning clamped value 1.000000"));

    EXPECT_EQ(0.3f, Function({}, false).getY(0.3f));  // no points: the identity
    EXPECT_EQ(0.25f, Function({0.5f, 0.25f}, false).getY(0.0f));
}

}  // namespace
}  // namespace android::Interpolation
