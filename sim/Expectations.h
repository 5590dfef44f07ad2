#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "sim/Summary.h"

namespace verolux::sim {

struct Scenario;

// What a scenario's changes were, for the measures that are taken against them.
struct ScenarioFacts {
    std::optional<double> lastDisplayChangeSec;  // the last change of the display's rate
};

ScenarioFacts scenarioFacts(const Scenario* scenario);

// Which way a measure gets worse, for the regression tests' messages.
enum class Worse { HIGHER, LOWER, EITHER };

// A measure of a run by name, as expectations and pins name it (sim/scenarios/README.md lists
// them): a number in its unit, or 1 and 0 for a yes or a no; nothing when the run has no value.
struct NamedMeasure {
    std::string_view name;
    std::string_view unit;  // "ms", "s", ... or empty
    bool yesNo;
    Worse worse;
    std::optional<double> (*value)(const Summary& run, const ScenarioFacts& facts);
};

const std::vector<NamedMeasure>& namedMeasures();
const NamedMeasure* findMeasure(std::string_view name);

// "4.21 ms", "yes", "n/a".
std::string measureText(const NamedMeasure& measure, std::optional<double> value);

struct CheckedExpectation {
    bool passed = false;
    std::string line;  // "PASS  that: watchdogWarnings 0 (expected = 0)"
};

// Each of the scenario's expectations against the run's layer.
std::vector<CheckedExpectation> checkExpectations(const Scenario& scenario, const Summary& run);

}  // namespace verolux::sim
