// Pacing quality pinned: deterministic simulated replays of the shipped capture (in every mode)
// and of every shipped scenario, each measure against its value in PacingPins.json, and each
// scenario's expectations. A change that moves a measure fails and says by how much; when the
// change is meant, re-pin with
//   VEROLUX_UPDATE_PINS=1 build/tests/verolux_tests --gtest_filter='*PacingRegression*'
// (one process: ctest runs the cases in parallel) and commit the file with the change.

#include <gtest/gtest.h>
#include <json/json.h>

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <fstream>

#include "sim/Expectations.h"
#include "sim/FolderRun.h"
#include "sim/JsonDocument.h"
#include "sim/Measures.h"
#include "sim/Scenario.h"
#include "sim/Simulation.h"

namespace verolux::sim {
namespace {

const std::string PINS = VEROLUX_SOURCE_DIR "/tests/sim/PacingPins.json";

struct Replay {
    std::string name;      // its key in the pins
    std::string scenario;  // empty: the shipped capture
    uint32_t mode = 0;
};

std::vector<Replay> replays() {
    std::vector<Replay> out;
    for (uint32_t mode = 0; mode <= 5; mode++)
        out.push_back({"stutter30 mode " + std::to_string(mode), "", mode});
    for (const std::string& name : scenarioNames())
        out.push_back({"scenario " + name, name, 0});
    return out;
}

struct Played {
    Summary summary;
    std::optional<Scenario> scenario;
};

// The run's own layer only: the reference would replay mode 2 again and again.
Played play(const Replay& replay) {
    Options options;
    options.mode = replay.mode;
    options.reference = false;
    Played played;
    std::optional<Capture> capture;
    if (replay.scenario.empty()) {
        capture = readCapture(VEROLUX_SOURCE_DIR "/sim/captures/stutter30.frames.csv").value;
    } else {
        Result<Scenario> read = readScenario(replay.scenario);
        EXPECT_TRUE(read.ok()) << read.error;
        played.scenario = std::move(read.value);
        EXPECT_TRUE(applyScenario(*played.scenario, options).ok());
    }
    const Capture* game = capture ? &*capture : nullptr;
    const Scenario* scenario = played.scenario ? &*played.scenario : nullptr;
    const auto settings = gatherSettings(
            options, scenario != nullptr ? scenario->settings : std::vector<host::SettingValue>{});
    Simulation simulation(options, settings.value, game, scenario);
    Measures measures(simulation.refreshPeriod());
    const RunResult result = simulation.run({&measures}, false, nullptr);
    played.summary =
            summarizeLayer(options, simulation, result, 0, measures.result(), game, scenario);
    return played;
}

std::optional<double> pinned(const Json::Value& value) {
    return value.isNull() ? std::nullopt : std::optional<double>(value.asDouble());
}

// "animationErrorP95Ms 4.58 ms, pinned 4.21 ms: +0.37 ms worse"
std::string drift(const NamedMeasure& measure, std::optional<double> now,
                  std::optional<double> was) {
    std::string text = std::string(measure.name) + " " + measureText(measure, now) + ", pinned " +
                       measureText(measure, was);
    if (!now || !was || measure.yesNo) return text;
    const double change = *now - *was;
    const bool worse = measure.worse == Worse::HIGHER ? change > 0 : change < 0;
    char delta[64];
    snprintf(delta, sizeof(delta), ": %+.6g%s%s", change, measure.unit.empty() ? "" : " ",
             std::string(measure.unit).c_str());
    return text + delta + (measure.worse == Worse::EITHER ? "" : worse ? " worse" : " better");
}

// The shortest decimal that reads back as the same double, so that the pins read as numbers.
std::string shortest(double value) {
    char text[32];
    if (value == std::floor(value) && std::fabs(value) < 1e15) {
        snprintf(text, sizeof(text), "%.0f", value);
        return text;
    }
    for (int precision = 1; precision <= 17; precision++) {
        snprintf(text, sizeof(text), "%.*g", precision, value);
        if (std::strtod(text, nullptr) == value) break;
    }
    return text;
}

void writePins(const Json::Value& pins) {
    std::ofstream out(PINS);
    out << "{\n  \"regenerate\": \"" << pins["regenerate"].asString() << "\",\n  \"replays\": {";
    const auto names = pins["replays"].getMemberNames();
    for (size_t i = 0; i < names.size(); i++) {
        const Json::Value& entry = pins["replays"][names[i]];
        out << (i == 0 ? "" : ",") << "\n    \"" << names[i] << "\": {";
        const auto measures = entry.getMemberNames();
        for (size_t k = 0; k < measures.size(); k++) {
            const Json::Value& value = entry[measures[k]];
            out << (k == 0 ? "" : ",") << "\n      \"" << measures[k]
                << "\": " << (value.isNull() ? "null" : shortest(value.asDouble()));
        }
        out << "\n    }";
    }
    out << "\n  }\n}\n";
}

Json::Value readPins() {
    std::ifstream in(PINS);
    const std::string text{std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
    Result<Json::Value> pins = parseJsonDocument(text, PINS, 8);
    return pins.ok() && pins.value.isObject() ? pins.value : Json::Value(Json::objectValue);
}

class PacingRegressionTest : public testing::TestWithParam<Replay> {};

TEST_P(PacingRegressionTest, measuresStayAsPinnedAndExpectationsHold) {
    const Played played = play(GetParam());
    const Scenario* scenario = played.scenario ? &*played.scenario : nullptr;
    const ScenarioFacts facts = scenarioFacts(scenario);
    Json::Value pins = readPins();

    if (std::getenv("VEROLUX_UPDATE_PINS") != nullptr) {
        Json::Value& entry = pins["replays"][GetParam().name];
        for (const NamedMeasure& measure : namedMeasures()) {
            const auto value = measure.value(played.summary, facts);
            entry[std::string(measure.name)] = value ? Json::Value(*value) : Json::Value();
        }
        pins["regenerate"] =
                "VEROLUX_UPDATE_PINS=1 build/tests/verolux_tests "
                "--gtest_filter='*PacingRegression*'";
        writePins(pins);
        GTEST_SKIP() << "pinned " << GetParam().name << " in " << PINS;
    }
    const Json::Value& entry = pins["replays"][GetParam().name];
    ASSERT_TRUE(entry.isObject()) << "no pins for " << GetParam().name << " in " << PINS
                                  << "; pin it with " << pins["regenerate"].asString();
    for (const NamedMeasure& measure : namedMeasures()) {
        const auto now = measure.value(played.summary, facts);
        const auto was = pinned(entry[std::string(measure.name)]);
        EXPECT_EQ(now, was) << GetParam().name << ": " << drift(measure, now, was)
                            << " (if meant, re-pin: " << pins["regenerate"].asString() << ")";
    }
    if (scenario == nullptr) return;
    for (const CheckedExpectation& checked : checkExpectations(*scenario, played.summary))
        EXPECT_TRUE(checked.passed) << scenario->name << ": " << checked.line;
}

INSTANTIATE_TEST_SUITE_P(ShippedGames, PacingRegressionTest, testing::ValuesIn(replays()),
                         [](const testing::TestParamInfo<Replay>& info) {
                             std::string name = info.param.name;
                             for (char& c : name)
                                 if (!isalnum(static_cast<unsigned char>(c))) c = '_';
                             return name;
                         });

}  // namespace
}  // namespace verolux::sim
