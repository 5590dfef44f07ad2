#include <gtest/gtest.h>

#include "sim/Scenario.h"

namespace verolux::sim {
namespace {

// Reads the scenario and takes its options as verolux-sim would; the first error, if any.
std::string problem(const std::string& text, std::vector<const char*> args = {}) {
    Result<Scenario> scenario = parseScenario(text, "s.json");
    if (!scenario.ok()) return scenario.error;
    args.insert(args.begin(), "verolux-sim");
    Result<Options> options = parseOptions(static_cast<int>(args.size()), args.data());
    return applyScenario(scenario.value, options.value).error;
}

TEST(ScenarioTest, refusesABadFileWithOneLineNamingTheFileTheEntryAndTheProblem) {
    const std::vector<std::pair<std::string, std::string>> cases = {
            {R"({"game": [)",
             "invalid JSON: Line 1, Column 11: Syntax error: value, object or "
             "array expected."},
            {R"({"gmae": []})",
             "unknown key \"gmae\" (known: description, options, settings, game, display, "
             "clientComposition, deliveries, expect)"},
            {R"({"description": 5})", "description: expects a text (got \"5\")"},
            {R"({"game": {"fps": 30}})", "game: expected a list (got \"{\"fps\":30}\")"},
            {R"({"game": [{"fps": 0}]})", "game[0].fps: must be between 0.1 and 1000 (got 0)"},
            {R"({"game": [{}, {"fsp": 30}]})",
             "game[1]: unknown key \"fsp\" (known: from, until, fps, rampTo, rampSec, jitterMs, "
             "renderMs, spikeEverySec, spikeRenderMs, reuseTimestampEvery)"},
            {R"({"game": [{"from": 5, "until": 5}]})", "game[0]: until must be after from"},
            {R"({"game": [{"from": 4000}]})",
             "game[0].from: must be between 0 and 3600 (got 4000)"},
            {R"({"game": [{"fps": 30, "rampTo": 60}]})",
             "game[0]: a sawtooth needs fps, rampTo and rampSec together"},
            {R"({"game": [{"spikeEverySec": 1}]})",
             "game[0]: spikes need spikeEverySec and spikeRenderMs together"},
            {R"({"game": [{"reuseTimestampEvery": 2.5}]})",
             "game[0].reuseTimestampEvery: expects a whole number (got 2.5)"},
            {R"({"display": [{"hz": 120}]})", "display[0]: needs at"},
            {R"({"display": [{"at": 1, "hz": "120"}]})",
             "display[0].hz: expects a number (got \"120\")"},
            {R"({"clientComposition": [{"from": 1, "until": 2, "share": 2}]})",
             "clientComposition[0].share: must be between 0 and 1 (got 2)"},
            {R"({"deliveries": [{"at": 1}]})", "deliveries[0]: needs settings"},
            {R"({"deliveries": [{"at": 1, "settings": {"delyMs": 3}}]})",
             "deliveries[0].settings: unknown settings key \"delyMs\" (did you mean "
             "\"delayMs\"?)"},
            {R"({"settings": {"smartDelay": 2}})",
             "settings: smartDelay expects true, false, 1 or 0 (got \"2\")"},
            {R"({"expect": [{"measure": "jank", "equals": 0}]})",
             "expect[0].measure: no measure named \"jank\" (see sim/scenarios/README.md)"},
            {R"({"expect": [{"measure": "stutters"}]})",
             "expect[0]: needs equals, atLeast or atMost"},
            {R"({"expect": [{"measure": "clockTime", "atLeast": 1}]})",
             "expect[0].atLeast: clockTime is a yes or a no: expect it with equals true or false "
             "(got \"1\")"},
            {R"({"options": {"out": "x"}})",
             "options: no default for \"out\" (options a scenario sets: duration, fps, jitter-ms, "
             "render-ms, seed, hz, mode, slots, layers, game-width, game-height, width, "
             "picture-at, client-composition)"},
            {R"({"options": {"fps": "fast"}})", "options.fps: expects a number (got \"fast\")"},
            // Values are checked as the command line checks them.
            {R"({"options": {"mode": 7}})", "options: --mode must be between 0 and 5 (got 7)"},
    };
    for (const auto& [text, message] : cases) {
        EXPECT_EQ("verolux-sim: s.json: " + message, problem(text)) << text;
    }
    EXPECT_EQ(
            "verolux-sim: --scenario plays in simulated time only: its events are events of the "
            "simulated clock (drop --time real)",
            problem("{}", {"--time=real"}));
    EXPECT_EQ("verolux-sim: --scenario and --capture both describe the game: give one",
              problem("{}", {"--capture=c.csv"}));
    EXPECT_EQ(0u, readScenario("nosuch").error.find("verolux-sim: no scenario named \"nosuch\" "
                                                    "(shipped: client-composition, "));
}

TEST(ScenarioTest, itsOptionsAreDefaultsThatTheCommandLineOverrides) {
    const Result<Scenario> scenario = parseScenario(R"({  // comments are allowed
        "options": {"fps": 45, "duration": 600, "seed": 18446744073709551615},
        "settings": {"delayMs": 40},
        "display": [{"at": 20, "hz": 120}, {"at": 10, "hz": 90}]})",
                                                    "dir/loading.json");
    ASSERT_TRUE(scenario.ok()) << scenario.error;
    EXPECT_EQ("loading", scenario.value.name);
    EXPECT_EQ(10, scenario.value.display.front().at);  // in time order
    const char* args[] = {"verolux-sim", "--fps", "60", "--set", "delayMs=20"};
    Result<Options> options = parseOptions(5, args);
    ASSERT_TRUE(applyScenario(scenario.value, options.value).ok());
    EXPECT_EQ(60, options.value.fps);
    EXPECT_EQ(600, options.value.durationSec);
    EXPECT_TRUE(options.value.durationGiven);
    EXPECT_EQ(UINT64_MAX, options.value.seed);
    // The scenario's settings first, so that --set wins.
    const auto settings = gatherSettings(options.value, scenario.value.settings);
    ASSERT_EQ(2u, settings.value.size());
    EXPECT_EQ(40, std::get<int32_t>(settings.value[0].value));
    EXPECT_EQ(20, std::get<int32_t>(settings.value[1].value));
}

}  // namespace
}  // namespace verolux::sim
