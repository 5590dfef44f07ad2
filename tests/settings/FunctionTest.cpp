#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "Function.h"
#include "support/LogCapture.h"

namespace android::Interpolation {
namespace {

using test::LogCapture;
using testing::ElementsAreArray;
using testing::IsEmpty;

const std::vector<float> DEFAULT_CURVE = {0, 0, 0.2f, 0, 0.8f, 1, 1, 1};
const float NaN = std::numeric_limits<float>::quiet_NaN();

struct RepairCase {
    std::vector<float> values;
    bool bound;
    std::vector<Point> points;
    std::vector<std::string> warnings;
};

class FunctionRepairTest : public testing::TestWithParam<RepairCase> {};

TEST_P(FunctionRepairTest, keepsRepairsOrDropsEachPoint) {
    const RepairCase& c = GetParam();
    LogCapture log(1);
    EXPECT_THAT(Function(c.values, c.bound).getPoints(), ElementsAreArray(c.points));
    EXPECT_THAT(log.texts(), ElementsAreArray(c.warnings));
}

INSTANTIATE_TEST_SUITE_P(
        FunctionTest, FunctionRepairTest,
        testing::Values(
                // Pinned to both corners, duplicates kept.
                RepairCase{DEFAULT_CURVE,
                           true,
                           {{0, 0}, {0, 0}, {0.2f, 0}, {0.8f, 1}, {1, 1}, {1, 1}},
                           {}},
                RepairCase{{}, true, {{0, 0}, {1, 1}}, {}}, RepairCase{{}, false, {}, {}},
                // Ending outside the unit square leaves the curve open.
                RepairCase{{0.5f, 2}, true, {{0, 0}, {0.5f, 2}}, {}},
                RepairCase{{0.5f, 0.5f, 0.4f, 0.9f},
                           true,
                           {{0, 0}, {0.5f, 0.5f}, {1, 1}},
                           {"Warning: alpha function point is out of order! Ignoring (0.400000, "
                            "0.900000)"}},
                // The corrected point does not become the reference for the order check.
                RepairCase{{0, 0, 0.5f, 0.8f, 0.6f, 0.5f, 0.55f, 0.9f},
                           false,
                           {{0, 0}, {0.5f, 0.8f}, {0.6f, 0.8f}, {0.55f, 0.9f}},
                           {"Warning: correction applied to non-increasing sequence of Y values "
                            "used in alpha function settings! (0.600000, 0.500000) -> (0.600000, "
                            "0.800000)"}},
                RepairCase{{0.1f, 0.2f, 0.3f},
                           false,
                           {{0.1f, 0.2f}},
                           {"Warning: odd number (3) of X-Y values used in alpha function "
                            "settings! Ignoring last value (0.300000)"}}));

TEST(FunctionTest, nanCoordinatesAreNeitherOutOfOrderNorCorrectedNorClosed) {
    LogCapture log(1);
    const std::vector<Point> curve = Function({0.5f, 0.5f, NaN, 0.6f, 0.7f, NaN}, true).getPoints();
    ASSERT_EQ(4u, curve.size());  // no (1, 1) after a NaN y
    EXPECT_TRUE(std::isnan(curve[2].x));
    EXPECT_TRUE(std::isnan(curve[3].y));
    EXPECT_THAT(log.texts(), IsEmpty());
}

TEST(FunctionTest, evaluatesSegmentsAndClampsOutsideThemWithAWarning) {
    const Function curve(DEFAULT_CURVE, true);
    LogCapture log(1);
    EXPECT_EQ(0.5f, curve.getY(0.5f));
    EXPECT_EQ(0.0f, curve.getY(0.1f));
    EXPECT_THAT(log.texts(), IsEmpty());

    EXPECT_EQ(0.0f, curve.getY(-0.1f));
    // The end of the last segment is outside it: exactly 1 is clamped too, with the warning.
    EXPECT_EQ(1.0f, curve.getY(1.0f));
    EXPECT_EQ(1.0f, curve.getY(NaN));
    EXPECT_THAT(log.texts(),
                ElementsAreArray({"Warning: alpha input -0.100000 out of range in alpha function "
                                  "settings! Returning clamped value 0.000000",
                                  "Warning: alpha input 1.000000 out of range in alpha function "
                                  "settings! Returning clamped value 1.000000",
                                  "Warning: alpha input nan out of range in alpha function "
                                  "settings! Returning clamped value 1.000000"}));

    EXPECT_EQ(0.3f, Function({}, false).getY(0.3f));  // no points: the identity
    EXPECT_EQ(0.25f, Function({0.5f, 0.25f}, false).getY(0.0f));
}

}  // namespace
}  // namespace android::Interpolation
