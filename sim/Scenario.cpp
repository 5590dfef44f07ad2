#include "sim/Scenario.h"

#include <json/value.h>

#include <algorithm>
#include <cinttypes>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <initializer_list>

#include "sim/Expectations.h"
#include "sim/JsonDocument.h"
#include "sim/SettingsKeys.h"

namespace verolux::sim {

namespace {

constexpr size_t MAX_SCENARIO_BYTES = 1 << 20;
// Object, list, item, settings, curve, point.
constexpr int MAX_SCENARIO_DEPTH = 8;
constexpr double LONGEST_RUN_SEC = 3600;
constexpr size_t MAX_ENTRIES = 10'000;

// The options a scenario may give defaults for: those that describe the game, the display and
// the run, not where its inputs and outputs are or how several runs are arranged.
constexpr std::string_view DEFAULTABLE_OPTIONS[] = {
        "duration",    "fps",
        "jitter-ms",   "render-ms",
        "seed",        "hz",
        "mode",        "slots",
        "layers",      "game-width",
        "game-height", "width",
        "picture-at",  "client-composition",
};

// "a, b, c".
template <typename Names>
std::string listed(const Names& names) {
    std::string text;
    for (std::string_view name : names)
        text += (text.empty() ? "" : ", ") + std::string(name);
    return text;
}

// "game[0].fps", or "description" at the top.
std::string member(const std::string& where, const char* key) {
    return where.empty() ? key : where + "." + key;
}

std::string formatValue(double value) {
    char text[32];
    snprintf(text, sizeof(text), "%g", value);
    return text;
}

// Walks the scenario's JSON; the first problem found ends the walk and is kept.
class ScenarioReader {
public:
    explicit ScenarioReader(std::string_view source) : mSource(source) {}

    bool failed() const { return !mError.empty(); }
    const std::string& error() const { return mError; }

    bool fail(const std::string& where, const std::string& what) {
        if (mError.empty()) {
            mError = errorLine(mSource + ": " + (where.empty() ? "" : where + ": ") + what);
        }
        return false;
    }

    // Every member of `object` is one of `keys`.
    bool onlyKeys(const Json::Value& object, const std::string& where,
                  std::initializer_list<std::string_view> keys) {
        if (!object.isObject())
            return fail(where, "expected an object (got " + describeJson(object) + ")");
        for (const std::string& name : object.getMemberNames()) {
            if (std::find(keys.begin(), keys.end(), name) == keys.end()) {
                return fail(where,
                            "unknown key " + sim::quoted(name) + " (known: " + listed(keys) + ")");
            }
        }
        return true;
    }

    // The list under `key`, or an empty one when absent.
    const Json::Value& list(const Json::Value& object, const char* key) {
        static const Json::Value EMPTY(Json::arrayValue);
        const Json::Value& value = object[key];
        if (value.isNull()) return EMPTY;
        if (!value.isArray()) {
            fail(key, "expected a list (got " + describeJson(value) + ")");
            return EMPTY;
        }
        if (value.size() > MAX_ENTRIES) {
            fail(key, "more than " + std::to_string(MAX_ENTRIES) + " entries");
            return EMPTY;
        }
        return value;
    }

    // A number from min to max under `key`; nothing when it is absent and not required.
    std::optional<double> number(const Json::Value& object, const char* key,
                                 const std::string& where, double min, double max,
                                 bool required = false) {
        const Json::Value& value = object[key];
        const std::string at = member(where, key);
        if (value.isNull()) {
            if (required) fail(where, "needs " + std::string(key));
            return std::nullopt;
        }
        if (!isJsonNumber(value)) {
            fail(at, "expects a number (got " + describeJson(value) + ")");
            return std::nullopt;
        }
        const double number = value.asDouble();
        if (!(number >= min && number <= max)) {
            fail(at, "must be between " + formatValue(min) + " and " + formatValue(max) + " (got " +
                             formatValue(number) + ")");
            return std::nullopt;
        }
        return number;
    }

    std::optional<double> time(const Json::Value& object, const char* key, const std::string& where,
                               bool required) {
        return number(object, key, where, 0, LONGEST_RUN_SEC, required);
    }

    std::string text(const Json::Value& object, const char* key, const std::string& where) {
        const Json::Value& value = object[key];
        if (value.isNull()) return {};
        if (!value.isString()) {
            fail(member(where, key), "expects a text (got " + describeJson(value) + ")");
            return {};
        }
        return value.asString();
    }

    void options(const Json::Value& object, Scenario& out) {
        if (object.isNull()) return;
        if (!object.isObject()) {
            fail("options", "expected an object of options (got " + describeJson(object) + ")");
            return;
        }
        for (const std::string& name : object.getMemberNames()) {
            const auto* option =
                    std::find(std::begin(DEFAULTABLE_OPTIONS), std::end(DEFAULTABLE_OPTIONS), name);
            if (option == std::end(DEFAULTABLE_OPTIONS)) {
                fail("options",
                     "no default for " + sim::quoted(name) +
                             " (options a scenario sets: " + listed(DEFAULTABLE_OPTIONS) + ")");
                return;
            }
            const Json::Value& value = object[name];
            char text[32];
            if (value.isUInt64()) {
                snprintf(text, sizeof(text), "%" PRIu64, value.asUInt64());
            } else if (value.isInt64()) {
                snprintf(text, sizeof(text), "%" PRId64, value.asInt64());
            } else if (isJsonNumber(value)) {
                snprintf(text, sizeof(text), "%.17g", value.asDouble());
            } else {
                fail("options." + name, "expects a number (got " + describeJson(value) + ")");
                return;
            }
            out.options.emplace_back(name, text);
        }
    }

    void settings(const Json::Value& object, const std::string& where,
                  std::vector<host::SettingValue>& out) {
        if (object.isNull()) return;
        Result<std::vector<host::SettingValue>> read =
                settingsFromJson(object, mSource + ": " + where);
        if (!read.ok()) {
            if (mError.empty()) mError = read.error;
            return;
        }
        out = std::move(read.value);
    }

    // Reads each entry of the list under `key` with `read(entry, where)`, after checking that it
    // is an object of `keys`; stops at the first problem.
    template <typename Read>
    void each(const Json::Value& object, const char* key,
              std::initializer_list<std::string_view> keys, Read read) {
        const Json::Value& entries = list(object, key);
        for (Json::ArrayIndex i = 0; i < entries.size() && !failed(); i++) {
            const std::string where = std::string(key) + "[" + std::to_string(i) + "]";
            if (onlyKeys(entries[i], where, keys)) read(entries[i], where);
        }
    }

    void game(const Json::Value& object, Scenario& out) {
        each(object, "game",
             {"from", "until", "fps", "rampTo", "rampSec", "jitterMs", "renderMs", "spikeEverySec",
              "spikeRenderMs", "reuseTimestampEvery"},
             [&](const Json::Value& item, const std::string& where) {
                 GameSegment& segment = out.game.emplace_back();
                 segment.from = time(item, "from", where, false).value_or(0);
                 segment.until = time(item, "until", where, false);
                 segment.fps = number(item, "fps", where, 0.1, 1000);
                 segment.rampTo = number(item, "rampTo", where, 0.1, 1000);
                 segment.rampSec = number(item, "rampSec", where, 0.001, LONGEST_RUN_SEC);
                 segment.jitterMs = number(item, "jitterMs", where, 0, 1000);
                 segment.renderMs = number(item, "renderMs", where, 0, 1000);
                 segment.spikeEverySec =
                         number(item, "spikeEverySec", where, 0.001, LONGEST_RUN_SEC);
                 segment.spikeRenderMs = number(item, "spikeRenderMs", where, 0, 1000);
                 if (const auto every = number(item, "reuseTimestampEvery", where, 2, 1e6)) {
                     if (std::floor(*every) != *every) {
                         fail(where + ".reuseTimestampEvery",
                              "expects a whole number (got " + formatValue(*every) + ")");
                     }
                     segment.reuseTimestampEvery = static_cast<uint32_t>(*every);
                 }
                 if (failed()) return;
                 if (segment.until && *segment.until <= segment.from) {
                     fail(where, "until must be after from");
                 } else if (segment.rampTo.has_value() != segment.rampSec.has_value() ||
                            (segment.rampTo && !segment.fps)) {
                     fail(where, "a sawtooth needs fps, rampTo and rampSec together");
                 } else if (segment.spikeEverySec.has_value() != segment.spikeRenderMs.has_value()) {
                     fail(where, "spikes need spikeEverySec and spikeRenderMs together");
                 }
             });
    }

    void display(const Json::Value& object, Scenario& out) {
        each(object, "display", {"at", "hz"},
             [&](const Json::Value& item, const std::string& where) {
                 const auto at = time(item, "at", where, true);
                 const auto hz = number(item, "hz", where, 1, 1000, true);
                 if (at && hz) out.display.push_back({*at, *hz});
             });
    }

    void clientComposition(const Json::Value& object, Scenario& out) {
        each(object, "clientComposition", {"from", "until", "share"},
             [&](const Json::Value& item, const std::string& where) {
                 ClientCompositionBurst burst;
                 burst.from = time(item, "from", where, true).value_or(0);
                 burst.until = time(item, "until", where, true).value_or(0);
                 burst.share = number(item, "share", where, 0, 1).value_or(1);
                 if (!failed() && burst.until <= burst.from)
                     fail(where, "until must be after from");
                 out.clientComposition.push_back(burst);
             });
    }

    void deliveries(const Json::Value& object, Scenario& out) {
        each(object, "deliveries", {"at", "settings"},
             [&](const Json::Value& item, const std::string& where) {
                 SettingsDelivery delivery;
                 delivery.at = time(item, "at", where, true).value_or(0);
                 if (item["settings"].isNull()) {
                     fail(where, "needs settings");
                     return;
                 }
                 settings(item["settings"], where + ".settings", delivery.settings);
                 out.deliveries.push_back(std::move(delivery));
             });
    }

    // A bound: a number, or true or false for a measure that is a yes or a no.
    std::optional<double> bound(const Json::Value& item, const char* key, const std::string& where,
                                const NamedMeasure& measure) {
        const Json::Value& value = item[key];
        if (value.isNull()) return std::nullopt;
        if (measure.yesNo) {
            if (value.isBool() && std::string_view(key) == "equals") return value.asBool() ? 1 : 0;
            fail(member(where, key), std::string(measure.name) +
                                             " is a yes or a no: expect it with equals true or "
                                             "false (got " +
                                             describeJson(value) + ")");
            return std::nullopt;
        }
        return number(item, key, where, -1e12, 1e12);
    }

    void expectations(const Json::Value& object, Scenario& out) {
        each(object, "expect", {"that", "measure", "equals", "atLeast", "atMost"},
             [&](const Json::Value& item, const std::string& where) {
                 Expectation expectation;
                 expectation.that = text(item, "that", where);
                 expectation.measure = text(item, "measure", where);
                 const NamedMeasure* measure = findMeasure(expectation.measure);
                 if (failed()) return;
                 if (measure == nullptr) {
                     fail(where + ".measure", "no measure named " +
                                                      sim::quoted(expectation.measure) +
                                                      " (see sim/scenarios/README.md)");
                     return;
                 }
                 expectation.equals = bound(item, "equals", where, *measure);
                 expectation.atLeast = bound(item, "atLeast", where, *measure);
                 expectation.atMost = bound(item, "atMost", where, *measure);
                 if (failed()) return;
                 if (!expectation.equals && !expectation.atLeast && !expectation.atMost) {
                     fail(where, "needs equals, atLeast or atMost");
                     return;
                 }
                 out.expectations.push_back(std::move(expectation));
             });
    }

private:
    const std::string mSource;
    std::string mError;
};

std::string withoutErrorPrefix(const std::string& line) {
    const std::string prefix = errorLine("");
    return line.rfind(prefix, 0) == 0 ? line.substr(prefix.size()) : line;
}

}  // namespace

std::string scenarioFolder() {
    return VEROLUX_SCENARIO_FOLDER;
}

std::vector<std::string> scenarioNames() {
    std::vector<std::string> names;
    std::error_code error;
    for (const auto& entry : std::filesystem::directory_iterator(scenarioFolder(), error)) {
        if (entry.path().extension() == ".json") names.push_back(entry.path().stem().string());
    }
    std::sort(names.begin(), names.end());
    return names;
}

Result<Scenario> parseScenario(std::string_view text, std::string_view source) {
    using R = Result<Scenario>;
    const Result<Json::Value> root = parseJsonDocument(text, source, MAX_SCENARIO_DEPTH);
    if (!root.ok()) return R::failure(root.error);
    ScenarioReader reader(source);
    R result;
    Scenario& scenario = result.value;
    scenario.path = source;
    scenario.name = std::filesystem::path(source).stem().string();
    if (!reader.onlyKeys(root.value, "",
                         {"description", "options", "settings", "game", "display",
                          "clientComposition", "deliveries", "expect"})) {
        return R::failure(reader.error());
    }
    scenario.description = reader.text(root.value, "description", "");
    reader.options(root.value["options"], scenario);
    reader.settings(root.value["settings"], "settings", scenario.settings);
    reader.game(root.value, scenario);
    reader.display(root.value, scenario);
    reader.clientComposition(root.value, scenario);
    reader.deliveries(root.value, scenario);
    reader.expectations(root.value, scenario);
    if (reader.failed()) return R::failure(reader.error());
    // Events at one time happen in the order of the file.
    auto byTime = [](const auto& a, const auto& b) { return a.at < b.at; };
    std::stable_sort(scenario.display.begin(), scenario.display.end(), byTime);
    std::stable_sort(scenario.deliveries.begin(), scenario.deliveries.end(), byTime);
    return result;
}

Result<Scenario> readScenario(std::string_view nameOrPath) {
    using R = Result<Scenario>;
    const bool isPath = nameOrPath.find('/') != std::string_view::npos ||
                        std::filesystem::path(nameOrPath).extension() == ".json";
    std::string path(nameOrPath);
    if (!isPath) {
        const std::vector<std::string> names = scenarioNames();
        if (std::find(names.begin(), names.end(), nameOrPath) == names.end()) {
            return R::failure(errorLine("no scenario named " + quoted(nameOrPath) +
                                        " (shipped: " + listed(names) + "; or give a .json file)"));
        }
        path = (std::filesystem::path(scenarioFolder()) / (path + ".json")).string();
    }
    const Result<std::string> text = readSmallFile(path, MAX_SCENARIO_BYTES, "scenario file");
    if (!text.ok()) return R::failure(text.error);
    return parseScenario(text.value, path);
}

Status applyScenario(const Scenario& scenario, Options& options) {
    if (options.time == TimeMode::REAL) {
        return {
                errorLine("--scenario plays in simulated time only: its events are events of the "
                          "simulated clock (drop --time real)")};
    }
    if (!options.capturePath.empty()) {
        return {errorLine("--scenario and --capture both describe the game: give one")};
    }
    for (const auto& [name, text] : scenario.options) {
        if (options.given("--" + name)) continue;
        const std::string error = applyOption("--" + name, text, options);
        if (!error.empty()) {
            return {errorLine(scenario.path + ": options: " + withoutErrorPrefix(error))};
        }
    }
    return {};
}

}  // namespace verolux::sim
