#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "sim/Options.h"

namespace verolux::sim {
namespace {

Result<Options> parse(std::vector<const char*> args) {
    args.insert(args.begin(), "verolux-sim");
    return parseOptions(static_cast<int>(args.size()), args.data());
}

TEST(OptionsTest, takesValuesAsTheNextArgumentOrAfterAnEqualsSign) {
    auto none = parse({});
    ASSERT_TRUE(none.ok());
    EXPECT_EQ(30, none.value.fps);
    EXPECT_EQ("sim-out", none.value.outDir);
    EXPECT_TRUE(none.value.reference);

    auto some = parse({"--fps", "59.94", "--hz=120", "--slots", "64", "--capture=c.csv", "--set",
                       "delayMs=40", "--set=mode=2", "--seed", "18446744073709551615",
                       "--no-reference"});
    ASSERT_TRUE(some.ok()) << some.error;
    const Options& o = some.value;
    EXPECT_EQ(59.94, o.fps);
    EXPECT_EQ(120, o.hz);
    EXPECT_EQ(64u, o.slots);
    EXPECT_EQ("c.csv", o.capturePath);
    ASSERT_EQ(2u, o.overrides.size());
    EXPECT_EQ(7, o.overrides[1].id);
    EXPECT_EQ(UINT64_MAX, o.seed);
    EXPECT_FALSE(o.reference);

    auto help = parse({"--fps", "5", "--help", "--hz", "0"});
    EXPECT_TRUE(help.ok() && help.value.help);
}

TEST(OptionsTest, refusesImpossibleValuesWithOneLineEach) {
    const std::vector<std::pair<std::vector<const char*>, std::string>> cases = {
            {{"--hz", "0"}, "--hz must be between 1 and 1000 (got 0)"},
            {{"--fps", "-5"}, "--fps must be greater than 0 and at most 1000 (got -5)"},
            {{"--fps=1000.5"}, "--fps must be greater than 0 and at most 1000 (got 1000.5)"},
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
            {{"--set", "hz=60"}, "--set: unknown settings key \"hz\""},
    };
    for (const auto& [args, message] : cases) {
        auto result = parse(args);
        EXPECT_EQ("verolux-sim: " + message, result.error) << args[0];
    }
}

TEST(OptionsTest, settingsFromTheFileComeBeforeTheOverrides) {
    const auto dir = std::filesystem::temp_directory_path() / "verolux-options-test";
    std::filesystem::create_directories(dir);
    const std::string path = (dir / "s.json").string();
    std::ofstream(path) << R"({"delayMs": 40, "rfps": 90})";

    auto options = parse({"--set", "delayMs=20", "--settings", path.c_str()});
    ASSERT_TRUE(options.ok()) << options.error;
    auto settings = gatherSettings(options.value);
    std::filesystem::remove_all(dir);
    ASSERT_TRUE(settings.ok()) << settings.error;

    std::vector<std::pair<int32_t, int32_t>> entries;
    for (const host::SettingValue& v : settings.value)
        entries.emplace_back(v.id, std::get<int32_t>(v.value));
    EXPECT_THAT(entries,
                testing::ElementsAre(std::pair(1, 40), std::pair(18, 90), std::pair(1, 20)));
}

}  // namespace
}  // namespace verolux::sim
