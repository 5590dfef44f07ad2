#include "sim/FolderRun.h"

#include <json/json.h>

#include <cmath>
#include <filesystem>
#include <fstream>

#include "sim/EngineLog.h"
#include "sim/GameScript.h"
#include "sim/Outputs.h"
#include "sim/SettingsKeys.h"

namespace verolux::sim {

namespace {

constexpr uint64_t BYTES_PER_PIXEL = 4;  // RGBA 8888

// A number as a person writes it: "30", "59.94", "0.5".
std::string plain(double value) {
    char text[32];
    snprintf(text, sizeof(text), "%.2f", value);
    std::string out = text;
    while (out.back() == '0')
        out.pop_back();
    if (out.back() == '.') out.pop_back();
    return out;
}

std::string modeText(uint32_t mode) {
    return std::to_string(mode) + " " + modeName(mode);
}

std::string gameText(const Options& options, const Capture* capture, const Scenario* scenario) {
    if (scenario != nullptr) {
        return "scenario " + scenario->name + " (" + plain(options.fps) + " fps to start, seed " +
               std::to_string(options.seed) + ")";
    }
    if (capture != nullptr) {
        return "capture " + std::filesystem::path(options.capturePath).filename().string() + " (" +
               std::to_string(capture->frames.size()) + " frames over " +
               plain(capture->span() / 1e9) + " s, " + plain(capture->fps()) + " fps" +
               (capture->format == "PresentMon" ? ", PresentMon" : "") + ")";
    }
    return plain(options.fps) + " fps game (jitter " + plain(options.jitterMs) + " ms, render " +
           plain(options.renderMs) + " ms, seed " + std::to_string(options.seed) + ")";
}

std::string durationText(const Options& options, const Capture* capture) {
    if (capture != nullptr && options.loop)
        return plain(options.durationSec) + " s, capture looped";
    if (capture != nullptr && !options.durationGiven) return "until the capture ends";
    return plain(options.durationSec) + " s";
}

std::string buffersText(const LayerPlan& layer) {
    return std::to_string(layer.buffers.count) +
           (layer.buffers.fixed ? " (fixed)" : " (sized by the host)");
}

std::string displayText(const Options& options, const Scenario* scenario) {
    std::string text = plain(options.hz) + " Hz";
    if (scenario != nullptr) {
        for (const DisplayChange& change : scenario->display)
            text += ", " + plain(change.hz) + " Hz from " + plain(change.at) + " s";
    }
    return text;
}

std::vector<std::pair<std::string, std::string>> describe(
        const Options& options, const Capture* capture, const Scenario* scenario,
        const std::vector<host::SettingValue>& settings, const Simulation& simulation) {
    std::vector<std::pair<std::string, std::string>> rows = {
            {"mode", modeText(options.mode)},
            {"game", gameText(options, capture, scenario)},
            {"display", displayText(options, scenario)},
            {"duration", durationText(options, capture)},
            {"time", timeModeName(options.time)},
    };
    if (scenario != nullptr && !scenario->description.empty())
        rows.push_back({"scenario", scenario->description});
    for (const LayerPlan& layer : simulation.layers())
        rows.push_back({layer.role + " buffers", buffersText(layer)});
    std::string given;
    for (const auto& setting : settings)
        given += (given.empty() ? "" : " ") + describeSetting(setting);
    rows.push_back({"settings", given.empty() ? "defaults" : given});
    rows.push_back({"game resolution",
                    std::to_string(options.gameWidth) + "x" + std::to_string(options.gameHeight)});
    rows.push_back({"space-time window", "from " + plain(options.pictureAtSec) + " s for 2 s"});
    return rows;
}

Json::Value runJson(const std::vector<std::pair<std::string, std::string>>& described,
                    const Simulation& simulation, const std::vector<Outputs::Layer>& layers,
                    const Options& options) {
    Json::Value json(Json::objectValue);
    for (const auto& [name, value] : described)
        json["options"][name] = value;
    json["refresh_period_ns"] = Json::Int64(simulation.refreshPeriod());
    json["picture_from_s"] = options.pictureAtSec;
    for (const Outputs::Layer& layer : layers) {
        if (!layer.files) continue;  // the figures draw the layers that have files
        Json::Value entry(Json::objectValue);
        entry["role"] = layer.role;
        entry["title"] = layer.title;
        entry["prefix"] = Outputs::prefix(layer.role);
        json["layers"].append(entry);
    }
    return json;
}

void announce(std::ostream& out, const Options& options, const Capture* capture,
              const Scenario* scenario, const Simulation& simulation) {
    out << "verolux-sim: mode " << modeText(options.mode)
        << (options.layers > 1 ? " (" + std::to_string(options.layers) + " layers)" : "")
        << (options.reference ? " against mode 2 no interpolation" : "") << "; "
        << gameText(options, capture, scenario) << " on a " << displayText(options, scenario)
        << " display; " << simulation.layers().front().buffers.count << " buffers";
    if (options.reference) out << " (reference " << simulation.layers()[1].buffers.count << ")";
    out << "; " << durationText(options, capture) << " in " << timeModeName(options.time)
        << " time. Ctrl-C stops early and keeps the results." << std::endl;
}

// Writes `bytes` to the file, or notes why it could not.
void writeFile(const std::filesystem::path& path, const char* bytes, size_t size,
               std::vector<std::string>& errors) {
    std::ofstream file(path, std::ios::binary);
    file.write(bytes, static_cast<std::streamsize>(size));
    if (!file) errors.push_back(errorLine("cannot write " + path.string()));
}

}  // namespace

Summary summarizeLayer(const Options& options, const Simulation& simulation,
                       const RunResult& result, size_t layer, const MeasuredLayer& measured,
                       const Capture* capture, const Scenario* scenario) {
    const LayerPlan& plan = simulation.layers()[layer];
    LayerFacts facts;
    facts.role = plan.role;
    facts.mode = plan.mode;
    facts.time = options.time;
    facts.runSec = (result.endTime - simulation.startTime()) / 1e9;
    facts.buffers = plan.buffers.count;
    facts.buffersFixed = plan.buffers.fixed;
    facts.bufferBytes =
            uint64_t{plan.buffers.count} * options.gameWidth * options.gameHeight * BYTES_PER_PIXEL;
    facts.resolution = std::to_string(options.gameWidth) + "x" + std::to_string(options.gameHeight);
    facts.ownFps = options.fps;
    if (capture != nullptr) facts.ownFps = capture->fpsOverFirst(measured.framesQueued);
    if (scenario != nullptr) {
        facts.ownFps = GameScript(options.fps, options.jitterMs, options.renderMs, &scenario->game)
                               .meanFps(facts.runSec);
    }
    facts.refreshHz = result.displayHz;
    if (scenario != nullptr) {
        for (const DisplayChange& change : scenario->display)
            facts.refreshRateChanged |= change.at < facts.runSec && change.hz != options.hz;
    }
    facts.startTime = simulation.startTime();
    facts.captureEnded = result.captureEnded;
    return {facts, measured};
}

Result<FolderRun> runIntoFolder(const Options& options,
                                const std::vector<host::SettingValue>& settings,
                                const Capture* capture, const std::atomic<bool>& interrupted,
                                std::ostream* progress, const Scenario* scenario) {
    using R = Result<FolderRun>;
    std::error_code error;
    std::filesystem::create_directories(options.outDir, error);
    if (error)
        return R::failure(errorLine("cannot create " + options.outDir + ": " + error.message()));
    const std::filesystem::path out(options.outDir);
    EngineLog engineLog;
    if (Status opened = engineLog.open((out / "engine.log").string()); !opened.ok()) {
        return R::failure(opened.error);
    }

    Simulation simulation(options, settings, capture, scenario);
    std::vector<Outputs::Layer> layers;
    // The copies of the run (--layers) are measured only: their files would repeat the run's.
    const size_t withFiles = options.reference ? 2 : 1;
    for (const LayerPlan& plan : simulation.layers()) {
        layers.push_back({plan.role, plan.role + ": mode " + modeText(plan.mode), plan.uid,
                          layers.size() < withFiles});
    }
    R result;
    FolderRun& run = result.value;
    run.described = describe(options, capture, scenario, settings, simulation);
    const Json::Value runDescription = runJson(run.described, simulation, layers, options);
    {
        std::ofstream file(out / "run.json");
        file << runDescription.toStyledString();
        if (!file) return R::failure(errorLine("cannot write " + (out / "run.json").string()));
    }
    Outputs outputs(options.outDir, simulation.startTime(), simulation.refreshPeriod(),
                    simulation.startTime() + std::llround(options.pictureAtSec * 1e9));
    if (Status opened = outputs.open(layers, runDescription["options"]); !opened.ok()) {
        return R::failure(opened.error);
    }

    if (progress != nullptr) announce(*progress, options, capture, scenario, simulation);
    run.result = simulation.run(outputs.sinks(), interrupted, progress);
    if (progress != nullptr && options.time == TimeMode::SIMULATED) {
        const double simulated = (run.result.endTime - simulation.startTime()) / 1e9;
        const double wall = run.result.wallSeconds;
        char line[160];
        snprintf(line, sizeof(line), "verolux-sim: simulated %.1f s in %.2f s (%.0fx real time)",
                 simulated, wall, wall > 0 ? simulated / wall : 0.0);
        *progress << line << std::endl;
    }
    if (Status finished = outputs.finish(); !finished.ok()) run.errors.push_back(finished.error);
    writeFile(out / "dumpsys.txt", run.result.dump.data(), run.result.dump.size(), run.errors);
    writeFile(out / "ringlog.bin", reinterpret_cast<const char*>(run.result.ringLogs.data()),
              run.result.ringLogs.size(), run.errors);

    for (size_t i = 0; i < simulation.layers().size(); i++) {
        run.summaries.push_back(summarizeLayer(options, simulation, run.result, i,
                                               outputs.measures(i).result(), capture, scenario));
    }
    run.hasReference = options.reference;
    const std::vector<Summary> copies(run.summaries.begin() + (options.reference ? 2 : 1),
                                      run.summaries.end());
    run.summaryText = formatSummary(run.run(), run.reference()) + formatCopies(copies);
    if (scenario != nullptr && !scenario->expectations.empty()) {
        run.expectations = checkExpectations(*scenario, run.run());
        run.summaryText += "Expectations of scenario " + scenario->name + ":\n";
        for (const CheckedExpectation& checked : run.expectations)
            run.summaryText += "  " + checked.line + "\n";
    }
    writeFile(out / "summary.txt", run.summaryText.data(), run.summaryText.size(), run.errors);
    run.engineLogLines = engineLog.lines();
    return result;
}

}  // namespace verolux::sim
