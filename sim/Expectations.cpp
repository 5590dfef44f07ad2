#include "sim/Expectations.h"

#include <cmath>
#include <cstdio>

#include "sim/Scenario.h"

namespace verolux::sim {

namespace {

constexpr double SEC_NS = 1e9;
// The detector reports multiples of 5 Hz.
constexpr double DETECTOR_STEP_HZ = 5;

using Value = std::optional<double>;

Value count(uint64_t n) {
    return static_cast<double>(n);
}

Value yesNo(bool yes) {
    return yes ? 1.0 : 0.0;
}

Value sinceStart(const Summary& s, std::optional<nsecs_t> time) {
    if (!time) return std::nullopt;
    return static_cast<double>(*time - s.facts.startTime) / SEC_NS;
}

Value perSecond(uint64_t n, const Summary& s) {
    if (s.facts.runSec <= 0) return std::nullopt;
    return static_cast<double>(n) / s.facts.runSec;
}

Value refreshDetectedAfter(const Summary& s, const ScenarioFacts& facts) {
    const MeasuredLayer& m = s.measured;
    if (!facts.lastDisplayChangeSec || !m.detectedRefreshRate || !m.refreshRateSettled) {
        return std::nullopt;
    }
    // The detector rounds to its step: the display's rate is detected when it is the nearest step.
    if (std::fabs(*m.detectedRefreshRate - s.facts.refreshHz) > DETECTOR_STEP_HZ / 2) {
        return std::nullopt;
    }
    return std::max(0.0, *sinceStart(s, m.refreshRateSettled) - *facts.lastDisplayChangeSec);
}

std::string bounds(const NamedMeasure& measure, const Expectation& e) {
    std::string text;
    auto add = [&](const char* op, const std::optional<double>& bound) {
        if (!bound) return;
        text += (text.empty() ? "" : " and ") + std::string(op) + " " + measureText(measure, *bound);
    };
    if (measure.yesNo) return measureText(measure, e.equals);
    add("=", e.equals);
    add(">=", e.atLeast);
    add("<=", e.atMost);
    return text;
}

bool holds(const Expectation& e, std::optional<double> value) {
    if (!value) return false;
    // The runs are exact; only the decimal of the file and the binary of the measure may differ.
    const double tolerance = 1e-9 * std::max(1.0, std::fabs(*value));
    if (e.equals && std::fabs(*value - *e.equals) > tolerance) return false;
    if (e.atLeast && *value < *e.atLeast - tolerance) return false;
    if (e.atMost && *value > *e.atMost + tolerance) return false;
    return true;
}

}  // namespace

ScenarioFacts scenarioFacts(const Scenario* scenario) {
    ScenarioFacts facts;
    if (scenario != nullptr && !scenario->display.empty()) {
        facts.lastDisplayChangeSec = scenario->display.back().at;
    }
    return facts;
}

const std::vector<NamedMeasure>& namedMeasures() {
    using F = ScenarioFacts;
    static const std::vector<NamedMeasure> MEASURES = {
            {"animationErrorP50Ms", "ms", false, Worse::HIGHER,
             [](const Summary& s, const F&) { return s.measured.errorP50Ms; }},
            {"animationErrorP95Ms", "ms", false, Worse::HIGHER,
             [](const Summary& s, const F&) { return s.measured.errorP95Ms; }},
            {"animationErrorP99Ms", "ms", false, Worse::HIGHER,
             [](const Summary& s, const F&) { return s.measured.errorP99Ms; }},
            {"animationErrorMaxMs", "ms", false, Worse::HIGHER,
             [](const Summary& s, const F&) { return s.measured.errorMaxMs; }},
            {"stutters", "", false, Worse::HIGHER,
             [](const Summary& s, const F&) { return count(s.measured.stutterCount); }},
            {"newPicturesPerSec", "", false, Worse::LOWER,
             [](const Summary& s, const F&) {
                 const auto& p = s.measured.pictures;
                 return perSecond(p[size_t(Picture::BLEND)] + p[size_t(Picture::NEW)], s);
             }},
            {"framesDropped", "", false, Worse::HIGHER,
             [](const Summary& s, const F&) { return count(s.measured.framesDropped); }},
            {"gameFps", "fps", false, Worse::LOWER,
             [](const Summary& s, const F&) { return s.measured.gameFps.average; }},
            {"latencyP50Ms", "ms", false, Worse::HIGHER,
             [](const Summary& s, const F&) { return s.measured.latencyP50Ms; }},
            {"latencyP99Ms", "ms", false, Worse::HIGHER,
             [](const Summary& s, const F&) { return s.measured.latencyP99Ms; }},
            {"displayDelayEndMs", "ms", false, Worse::EITHER,
             [](const Summary& s, const F&) { return s.measured.endDelayMs; }},
            {"delayChanges", "", false, Worse::EITHER,
             [](const Summary& s, const F&) { return count(s.measured.delayChanges); }},
            {"refusedPresentations", "", false, Worse::EITHER,
             [](const Summary& s, const F&) { return count(s.measured.refusedPresentations); }},
            {"clientCompositions", "", false, Worse::EITHER,
             [](const Summary& s, const F&) { return count(s.measured.clientCompositions); }},
            {"refreshRateHz", "Hz", false, Worse::EITHER,
             [](const Summary& s, const F&) -> Value {
                 if (!s.measured.detectedRefreshRate) return std::nullopt;
                 return *s.measured.detectedRefreshRate;
             }},
            {"refreshDetectedAfterSec", "s", false, Worse::HIGHER, refreshDetectedAfter},
            {"watchdogWarnings", "", false, Worse::HIGHER,
             [](const Summary& s, const F&) { return count(s.measured.warningCount); }},
            {"interpolationOff", "", true, Worse::EITHER,
             [](const Summary& s, const F&) {
                 return yesNo(s.measured.interpolationOffAt.has_value());
             }},
            {"interpolationOffAtSec", "s", false, Worse::EITHER,
             [](const Summary& s, const F&) { return sinceStart(s, s.measured.interpolationOffAt); }},
            {"clockTime", "", true, Worse::EITHER,
             [](const Summary& s, const F&) { return yesNo(s.measured.clockTimeFrom.has_value()); }},
            {"clockTimeFromSec", "s", false, Worse::EITHER,
             [](const Summary& s, const F&) { return sinceStart(s, s.measured.clockTimeFrom); }},
    };
    return MEASURES;
}

const NamedMeasure* findMeasure(std::string_view name) {
    for (const NamedMeasure& measure : namedMeasures()) {
        if (measure.name == name) return &measure;
    }
    return nullptr;
}

std::string measureText(const NamedMeasure& measure, std::optional<double> value) {
    if (!value) return "n/a";
    if (measure.yesNo) return *value != 0 ? "yes" : "no";
    char text[48];
    snprintf(text, sizeof(text), "%.6g%s%s", *value, measure.unit.empty() ? "" : " ",
             std::string(measure.unit).c_str());
    return text;
}

std::vector<CheckedExpectation> checkExpectations(const Scenario& scenario, const Summary& run) {
    const ScenarioFacts facts = scenarioFacts(&scenario);
    std::vector<CheckedExpectation> out;
    for (const Expectation& e : scenario.expectations) {
        const NamedMeasure* measure = findMeasure(e.measure);
        if (measure == nullptr) continue;  // refused when the file was read
        const std::optional<double> value = measure->value(run, facts);
        CheckedExpectation& checked = out.emplace_back();
        checked.passed = holds(e, value);
        checked.line = std::string(checked.passed ? "PASS  " : "FAIL  ") +
                       (e.that.empty() ? "" : e.that + ": ") + e.measure + " " +
                       measureText(*measure, value) + " (expected " + bounds(*measure, e) + ")";
    }
    return out;
}

}  // namespace verolux::sim
