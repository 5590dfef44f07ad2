#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

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

std::string assignmentError(std::string_view text) {
    return parseSettingAssignment(text).error;
}

std::string jsonError(std::string_view text) {
    return parseSettingsJson(text, "s.json").error;
}

TEST(SettingsKeysTest, assignmentsBecomeTheIdAndTheTypeOfTheirField) {
    auto fps = parseSettingAssignment("gameFpsLimit=30");
    ASSERT_TRUE(fps.ok()) << fps.error;
    EXPECT_EQ(0, fps.value.id);
    EXPECT_EQ(30, std::get<int32_t>(fps.value.value));

    auto target = parseSettingAssignment("hitTarget = 0.95");
    EXPECT_EQ(4, target.value.id);
    EXPECT_EQ(0.95f, std::get<float>(target.value.value));

    auto margin = parseSettingAssignment("justInTimeMarginMs=-2");
    EXPECT_EQ(22, margin.value.id);
    EXPECT_EQ(-2, std::get<int32_t>(margin.value.value));

    EXPECT_FALSE(std::get<bool>(parseSettingAssignment("smartDelay=false").value.value));
    auto keep = parseSettingAssignment("keepTwoHwcLayers=1");
    EXPECT_EQ(115, keep.value.id);
    EXPECT_TRUE(std::get<bool>(keep.value.value));
    EXPECT_EQ(100, parseSettingAssignment("logLevel=2").value.id);
    EXPECT_EQ(116, parseSettingAssignment("applyDelayToFrames=true").value.id);

    auto curve = parseSettingAssignment("alphaFunction=0,0, 0.5,1,1,1");
    ASSERT_TRUE(curve.ok()) << curve.error;
    EXPECT_EQ(21, curve.value.id);
    EXPECT_THAT(pairs(curve.value),
                testing::ElementsAre(std::pair(0.0f, 0.0f), std::pair(0.5f, 1.0f),
                                     std::pair(1.0f, 1.0f)));
}

TEST(SettingsKeysTest, badAssignmentsSayWhatIsWrongOnOneLine) {
    EXPECT_EQ("verolux-sim: --set: unknown settings key \"gameFpsLimt\"",
              assignmentError("gameFpsLimt=30"));
    EXPECT_EQ("verolux-sim: --set expects key=value (got \"delayMs\")", assignmentError("delayMs"));
    EXPECT_EQ("verolux-sim: --set: delayMs expects a whole number (got \"1.5\")",
              assignmentError("delayMs=1.5"));
    EXPECT_EQ("verolux-sim: --set: delayMs is out of range (got \"4294967296\")",
              assignmentError("delayMs=4294967296"));
    EXPECT_EQ("verolux-sim: --set: hitTarget expects a number (got \"nan\")",
              assignmentError("hitTarget=nan"));
    EXPECT_EQ("verolux-sim: --set: smartDelay expects true, false, 1 or 0 (got \"yes\")",
              assignmentError("smartDelay=yes"));
    EXPECT_EQ("verolux-sim: --set: mode must be between 0 and 5 (got 6)",
              assignmentError("mode=6"));
    EXPECT_EQ(
            "verolux-sim: --set: alphaFunction needs an even number of values, x,y per point "
            "(got 5)",
            assignmentError("alphaFunction=0,0,0.5,1,1"));
    EXPECT_EQ("verolux-sim: --set: alphaFunction expects a list of x,y numbers (got \"0,0,\")",
              assignmentError("alphaFunction=0,0,"));
    EXPECT_EQ("verolux-sim: --set: alphaFunction needs at least one x,y point",
              assignmentError("alphaFunction="));
    // Control characters never break the line.
    EXPECT_EQ("verolux-sim: --set: unknown settings key \"a?b\"", assignmentError("a\nb=1"));
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

    auto pairsForm = parseSettingsJson(R"({"alphaFunction": [[0, 0], [0.25, 0.5], [1, 1]]})", "");
    ASSERT_TRUE(pairsForm.ok()) << pairsForm.error;
    EXPECT_THAT(pairs(pairsForm.value[0]),
                testing::ElementsAre(std::pair(0.0f, 0.0f), std::pair(0.25f, 0.5f),
                                     std::pair(1.0f, 1.0f)));
}

TEST(SettingsKeysTest, badJsonNamesTheFileAndTheProblem) {
    EXPECT_EQ("verolux-sim: s.json: unknown settings key \"fps\"", jsonError(R"({"fps": 30})"));
    EXPECT_EQ("verolux-sim: s.json: delayMs expects a whole number (got \"40\")",
              jsonError(R"({"delayMs": "40"})"));
    EXPECT_EQ("verolux-sim: s.json: smartDelay expects true, false, 1 or 0 (got \"2\")",
              jsonError(R"({"smartDelay": 2})"));
    EXPECT_EQ(
            "verolux-sim: s.json: alphaFunction expects numbers or [x, y] pairs (got "
            "\"[0,0,1]\")",
            jsonError(R"({"alphaFunction": [[0, 0, 1]]})"));
    EXPECT_EQ(
            "verolux-sim: s.json: alphaFunction needs an even number of values, x,y per point "
            "(got 3)",
            jsonError(R"({"alphaFunction": [0, 0, 1]})"));
    EXPECT_EQ("verolux-sim: s.json: expected an object of settings keys", jsonError("[1, 2]"));
    EXPECT_EQ(
            "verolux-sim: s.json: invalid JSON: Line 1, Column 16: Missing ',' or '}' in object "
            "declaration",
            jsonError(R"({"delayMs": 40 "mode": 1})"));
    EXPECT_EQ("verolux-sim: s.json: invalid JSON: Line 1, Column 13: Duplicate key: 'mode'",
              jsonError(R"({"mode": 1, "mode": 2})"));
}

TEST(SettingsKeysTest, readsAFileAndReportsOneItCannotOpen) {
    const auto dir = std::filesystem::temp_directory_path() / "verolux-settings-keys-test";
    std::filesystem::create_directories(dir);
    const std::string path = (dir / "settings.json").string();
    std::ofstream(path) << R"({"gameFpsLimit": 60})";

    auto read = readSettingsFile(path);
    ASSERT_TRUE(read.ok()) << read.error;
    ASSERT_EQ(1u, read.value.size());
    EXPECT_EQ(60, std::get<int32_t>(read.value[0].value));
    std::filesystem::remove_all(dir);

    EXPECT_EQ("verolux-sim: cannot read settings file " + path + ": No such file or directory",
              readSettingsFile(path).error);
}

}  // namespace
}  // namespace verolux::sim
