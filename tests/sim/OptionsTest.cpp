#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <fstream>

#include "sim/Options.h"
#include "sim/SettingsKeys.h"

namespace verolux::sim {
namespace {

Result<Options> parse(std::vector<const char*> args) {
    args.insert(args.begin(), "verolux-sim");
    return parseOptions(static_cast<int>(args.size()), args.data());
}

using Points = std::vector<host::SettingValue::Point>;

// The settings message that carries `settings`, word by word.
std::vector<uint32_t> message(const std::vector<host::SettingValue>& settings) {
    android::Parcel parcel;
    host::writeSettingsMessage(settings, parcel);
    std::vector<uint32_t> words(parcel.dataSize() / 4);
    memcpy(words.data(), parcel.data(), words.size() * 4);
    return words;
}

TEST(OptionsTest, takesValuesNextOrAfterAnEqualsSignAndPutsTheSettingsFileBeforeTheOverrides) {
    const std::string path = testing::TempDir() + "verolux-" + std::to_string(getpid()) + ".json";
    std::ofstream(path) << R"({  // comments are allowed
        "smartDelay": 0, "delayMs": 40, "rfps": 90, "hitThreshold": 1,
        "alphaFunction": [0, 0, [0.25, 0.5]]})";
    auto parsed =
            parse({"--fps", "59.94", "--hz=120", "--slots=64", "--capture=c.csv", "--seed",
                   "18446744073709551615", "--no-reference", "--set", "delayMs=20", "--settings",
                   path.c_str(), "--set=hitTarget = 0.95", "--set=keepTwoHwcLayers=1",
                   "--set=smartDelay=false", "--set=alphaFunction=0,0, 0.5,1,1,1",
                   "--set=gameFpsLimit=30", "--set=mode=2"});
    ASSERT_TRUE(parsed.ok()) << parsed.error;
    EXPECT_EQ(59.94, parsed.value.fps);
    EXPECT_EQ(120, parsed.value.hz);
    EXPECT_EQ(64u, parsed.value.slots);
    EXPECT_EQ("c.csv", parsed.value.capturePath);
    EXPECT_EQ(UINT64_MAX, parsed.value.seed);
    EXPECT_FALSE(parsed.value.reference);
    auto settings = gatherSettings(parsed.value);
    std::remove(path.c_str());
    ASSERT_TRUE(settings.ok()) << settings.error;
    const Points fileCurve = {{0, 0}, {0.25f, 0.5f}};
    const Points setCurve = {{0, 0}, {0.5f, 1}, {1, 1}};
    const std::vector<host::SettingValue> expected = {
            {21, fileCurve}, {1, 40},     {6, 1.0f},  {18, 90},       {2, false}, {1, 20},
            {4, 0.95f},      {115, true}, {2, false}, {21, setCurve}, {0, 30},    {7, 2}};
    EXPECT_EQ(message(expected), message(settings.value));

    EXPECT_TRUE(parse({"--fps", "5", "--help", "--hz", "0"}).value.help);
}

TEST(OptionsTest, refusesImpossibleOptionsAndSettingsWithOneLineEach) {
    const std::vector<std::pair<std::vector<const char*>, std::string>> cases = {
            {{"--hz", "0"}, "--hz must be between 1 and 1000 (got 0)"},
            {{"--fps", "-5"}, "--fps must be between 0.1 and 1000 (got -5)"},
            {{"--fps=1000.5"}, "--fps must be between 0.1 and 1000 (got 1000.5)"},
            // A frame period beyond any run, which once overflowed into a game running flat out.
            {{"--fps=1e-300"}, "--fps must be between 0.1 and 1000 (got 1e-300)"},
            {{"--duration", "0"},
             "--duration must be greater than 0 and at most 3600 seconds (got 0)"},
            {{"--jitter-ms", "-0.1"}, "--jitter-ms must be between 0 and 1000 (got -0.1)"},
            {{"--render-ms", "inf"}, "--render-ms expects a number (got \"inf\")"},
            {{"--slots", "1"}, "--slots must be between 2 and 64 (got 1)"},
            {{"--mode", "6"}, "--mode must be between 0 and 5 (got 6)"},
            {{"--width", "4097"}, "--width must be between 16 and 4096 (got 4097)"},
            {{"--width", "2.5"}, "--width expects a whole number (got \"2.5\")"},
            {{"--seed", "-1"}, "--seed expects a whole number from 0 to 2^64-1 (got \"-1\")"},
            {{"--fps", "30fps"}, "--fps expects a number (got \"30fps\")"},
            {{"--fps"}, "--fps needs a value"},
            {{"--out="}, "--out needs a non-empty value"},
            {{"--quiet=1"}, "--quiet takes no value"},
            {{"--fsp", "30"}, "unknown option \"--fsp\" (try --help)"},
            {{"30"}, "unexpected argument \"30\" (try --help)"},
            {{"--set=gameFpsLimt=30"},
             "--set: unknown settings key \"gameFpsLimt\" (did you mean \"gameFpsLimit\"?)"},
            {{"--set=frobnicate=1"}, "--set: unknown settings key \"frobnicate\""},
            {{"--set=delayMs"}, "--set expects key=value (got \"delayMs\")"},
            {{"--set=delayMs=1.5"}, "--set: delayMs expects a whole number (got \"1.5\")"},
            {{"--set=delayMs=4294967296"}, "--set: delayMs is out of range (got \"4294967296\")"},
            {{"--set=hitTarget=nan"}, "--set: hitTarget expects a number (got \"nan\")"},
            {{"--set=smartDelay=yes"},
             "--set: smartDelay expects true, false, 1 or 0 (got \"yes\")"},
            {{"--set=mode=6"}, "--set: mode must be between 0 and 5 (got 6)"},
            {{"--set=alphaFunction=0,0,1"},
             "--set: alphaFunction needs an even number of values, x,y per point (got 3)"},
            {{"--set=alphaFunction=0,0,"},
             "--set: alphaFunction expects a list of x,y numbers (got \"0,0,\")"},
            {{"--set=alphaFunction="}, "--set: alphaFunction needs at least one x,y point"},
            // Control characters stay off the line.
            {{"--set=a\nb=1"}, "--set: unknown settings key \"a?b\""},
            {{"--compare=0,7"},
             "--compare expects modes from 0 to 5, separated by commas (got \"0,7\")"},
            {{"--compare=3,3"}, "--compare names mode 3 twice"},
            {{"--compare=2"}, "--compare expects two or more modes (got \"2\")"},
            {{"--compare=0,2", "--mode=1"}, "--compare gives the modes: drop --mode"},
            {{"--compare=0,2", "--sweep=delayMs=1"},
             "--compare and --sweep run grids of their own: give one"},
            {{"--sweep=delayMs=30,x"}, "--sweep: delayMs expects a whole number (got \"x\")"},
            {{"--sweep=alphaFunction=0"},
             "--sweep cannot sweep alphaFunction: its values hold commas"},
            {{"--sweep=a=1", "--sweep=b=1"},
             "--sweep expects a settings key and its values, key=v1,v2,... (got \"a=1\")"},
            {{"--sweep=rfps=1", "--sweep=rfps=2"}, "--sweep gives rfps twice"},
            {{"--sweep=rfps=1", "--sweep=rfpsOffset=2", "--sweep=hitTarget=1"},
             "--sweep takes two keys at most"},
            {{"--latency-budget-ms=40"},
             "--latency-budget-ms marks the cells of a --sweep: add one"},
    };
    for (const auto& [args, message] : cases) {
        EXPECT_EQ("verolux-sim: " + message, parse(args).error) << args[0];
    }
}

TEST(OptionsTest, badSettingsJsonNamesTheFileAndTheProblem) {
    const std::vector<std::pair<std::string, std::string>> cases = {
            {R"({"rfp": 30})", "unknown settings key \"rfp\" (did you mean \"rfps\"?)"},
            // The JSON reader throws past its stack limit instead of reporting an error.
            {std::string(1000, '[') + std::string(1000, ']'),
             "invalid JSON: nested deeper than 16 levels"},
            {R"({"delayMs": "40"})", "delayMs expects a whole number (got \"40\")"},
            {R"({"smartDelay": 2})", "smartDelay expects true, false, 1 or 0 (got \"2\")"},
            {R"({"alphaFunction": [[0, 0, 1]]})",
             "alphaFunction expects numbers or [x, y] pairs (got \"[0,0,1]\")"},
            {"[1, 2]", "expected an object of settings keys"},
            {R"({"delayMs": 40 "mode": 1})",
             "invalid JSON: Line 1, Column 16: Missing ',' or '}' in object declaration"},
            {R"({"mode": 1, "mode": 2})", "invalid JSON: Line 1, Column 13: Duplicate key: 'mode'"},
            // jsoncpp quotes a bad number whole; it once made a line as long as the number.
            {"{\"mode\": 1" + std::string(300, '0') + "e}",
             "invalid JSON: Line 1, Column 10: '1" + std::string(79, '0') + "..."},
    };
    for (const auto& [text, message] : cases) {
        EXPECT_EQ("verolux-sim: s.json: " + message, parseSettingsJson(text, "s.json").error);
    }
    EXPECT_EQ(
            "verolux-sim: cannot read settings file /nonexistent/s.json: No such file or directory",
            readSettingsFile("/nonexistent/s.json").error);
}

}  // namespace
}  // namespace verolux::sim
