#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "sim/SettingsKeys.h"

namespace verolux::sim {
namespace {

using host::SettingValue;
using Points = std::vector<SettingValue::Point>;

std::vector<std::pair<float, float>> pairs(const SettingValue& value) {
    std::vector<std::pair<float, float>> out;
    for (const SettingValue::Point& p : std::get<Points>(value.value))
        out.emplace_back(p.x, p.y);
    return out;
}

TEST(SettingsKeysTest, assignmentsBecomeTheIdAndTheTypeOfTheirField) {
    auto fps = parseSettingAssignment("gameFpsLimit=30");
    ASSERT_TRUE(fps.ok()) << fps.error;
    EXPECT_EQ(0, fps.value.id);
    EXPECT_EQ(30, std::get<int32_t>(fps.value.value));

    auto target = parseSettingAssignment("hitTarget = 0.95");
    EXPECT_EQ(4, target.value.id);
    EXPECT_EQ(0.95f, std::get<float>(target.value.value));

    auto keep = parseSettingAssignment("keepTwoHwcLayers=1");
    EXPECT_EQ(115, keep.value.id);
    EXPECT_TRUE(std::get<bool>(keep.value.value));
    EXPECT_FALSE(std::get<bool>(parseSettingAssignment("smartDelay=false").value.value));

    auto curve = parseSettingAssignment("alphaFunction=0,0, 0.5,1,1,1");
    ASSERT_TRUE(curve.ok()) << curve.error;
    EXPECT_EQ(21, curve.value.id);
    EXPECT_THAT(pairs(curve.value),
                testing::ElementsAre(std::pair(0.0f, 0.0f), std::pair(0.5f, 1.0f),
                                     std::pair(1.0f, 1.0f)));
}

TEST(SettingsKeysTest, badAssignmentsSayWhatIsWrongOnOneLine) {
    const std::vector<std::pair<std::string, std::string>> cases = {
            {"gameFpsLimt=30", ": unknown settings key \"gameFpsLimt\""},
            {"delayMs", " expects key=value (got \"delayMs\")"},
            {"delayMs=1.5", ": delayMs expects a whole number (got \"1.5\")"},
            {"delayMs=4294967296", ": delayMs is out of range (got \"4294967296\")"},
            {"hitTarget=nan", ": hitTarget expects a number (got \"nan\")"},
            {"smartDelay=yes", ": smartDelay expects true, false, 1 or 0 (got \"yes\")"},
            {"mode=6", ": mode must be between 0 and 5 (got 6)"},
            {"alphaFunction=0,0,1",
             ": alphaFunction needs an even number of values, x,y per "
             "point (got 3)"},
            {"alphaFunction=0,0,", ": alphaFunction expects a list of x,y numbers (got \"0,0,\")"},
            {"alphaFunction=", ": alphaFunction needs at least one x,y point"},
            {"a\nb=1", ": unknown settings key \"a?b\""},  // control characters stay off the line
    };
    for (const auto& [text, message] : cases) {
        EXPECT_EQ("verolux-sim: --set" + message, parseSettingAssignment(text).error);
    }
}

TEST(SettingsKeysTest, jsonTakesTheSameKeysAndBothCurveShapes) {
    auto flat = parseSettingsJson(R"({
        // comments are allowed
        "smartDelay": 0, "delayMs": 40, "hitThreshold": 1, "alphaFunction": [0, 0, 1, 1]
    })",
                                  "s.json");
    ASSERT_TRUE(flat.ok()) << flat.error;
    // In key order: alphaFunction, delayMs, hitThreshold, smartDelay.
    ASSERT_EQ(4u, flat.value.size());
    EXPECT_EQ(21, flat.value[0].id);
    EXPECT_THAT(pairs(flat.value[0]),
                testing::ElementsAre(std::pair(0.0f, 0.0f), std::pair(1.0f, 1.0f)));
    EXPECT_EQ(40, std::get<int32_t>(flat.value[1].value));
    EXPECT_EQ(1.0f, std::get<float>(flat.value[2].value));
    EXPECT_FALSE(std::get<bool>(flat.value[3].value));

    auto pairsForm = parseSettingsJson(R"({"alphaFunction": [[0, 0], [0.25, 0.5]]})", "");
    ASSERT_TRUE(pairsForm.ok()) << pairsForm.error;
    EXPECT_THAT(pairs(pairsForm.value[0]),
                testing::ElementsAre(std::pair(0.0f, 0.0f), std::pair(0.25f, 0.5f)));
}

TEST(SettingsKeysTest, badJsonNamesTheFileAndTheProblem) {
    const std::vector<std::pair<std::string, std::string>> cases = {
            {R"({"fps": 30})", "unknown settings key \"fps\""},
            {R"({"delayMs": "40"})", "delayMs expects a whole number (got \"40\")"},
            {R"({"smartDelay": 2})", "smartDelay expects true, false, 1 or 0 (got \"2\")"},
            {R"({"alphaFunction": [[0, 0, 1]]})",
             "alphaFunction expects numbers or [x, y] pairs (got \"[0,0,1]\")"},
            {R"({"alphaFunction": [0, 0, 1]})",
             "alphaFunction needs an even number of values, x,y per point (got 3)"},
            {"[1, 2]", "expected an object of settings keys"},
            {R"({"delayMs": 40 "mode": 1})",
             "invalid JSON: Line 1, Column 16: Missing ',' or '}' in object declaration"},
            {R"({"mode": 1, "mode": 2})", "invalid JSON: Line 1, Column 13: Duplicate key: 'mode'"},
    };
    for (const auto& [text, message] : cases) {
        EXPECT_EQ("verolux-sim: s.json: " + message, parseSettingsJson(text, "s.json").error);
    }
    EXPECT_EQ(
            "verolux-sim: cannot read settings file /nonexistent/s.json: No such file or "
            "directory",
            readSettingsFile("/nonexistent/s.json").error);
}

}  // namespace
}  // namespace verolux::sim
