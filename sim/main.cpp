// verolux-sim: plays a simulated game and display in real time against the engine, through the
// reference host, and reports what the screen showed.

#include <signal.h>
#include <sys/resource.h>

#include <json/json.h>

#include <atomic>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <optional>
#include <string>

#include "sim/Capture.h"
#include "sim/EngineLog.h"
#include "sim/Options.h"
#include "sim/Outputs.h"
#include "sim/Report.h"
#include "sim/SettingsKeys.h"
#include "sim/Simulation.h"
#include "sim/Summary.h"

namespace {

using namespace verolux::sim;

constexpr uint64_t BYTES_PER_PIXEL = 4;  // RGBA 8888

std::atomic<bool> sInterrupted{false};

void onInterrupt(int) {
    sInterrupted = true;
}

void installInterruptHandler() {
    struct sigaction action {};
    action.sa_handler = onInterrupt;
    sigemptyset(&action.sa_mask);
    sigaction(SIGINT, &action, nullptr);
    sigaction(SIGTERM, &action, nullptr);
}

int fail(const std::string& errorLine) {
    std::cerr << errorLine << std::endl;
    return 2;
}

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

std::string gameText(const Options& options, const std::optional<Capture>& capture) {
    if (capture) {
        return "capture " + std::filesystem::path(options.capturePath).filename().string() + " (" +
               std::to_string(capture->frames.size()) + " frames over " +
               plain(capture->span() / 1e9) + " s, " + plain(capture->fps()) + " fps" +
               (capture->format == "PresentMon" ? ", PresentMon" : "") + ")";
    }
    return plain(options.fps) + " fps game (jitter " + plain(options.jitterMs) + " ms, render " +
           plain(options.renderMs) + " ms, seed " + std::to_string(options.seed) + ")";
}

std::string durationText(const Options& options, const std::optional<Capture>& capture) {
    if (capture && options.loop) return plain(options.durationSec) + " s, capture looped";
    if (capture && !options.durationGiven) return "until the capture ends";
    return plain(options.durationSec) + " s";
}

std::string buffersText(const LayerPlan& layer) {
    return std::to_string(layer.buffers.count) +
           (layer.buffers.fixed ? " (fixed)" : " (sized by the host)");
}

std::vector<std::pair<std::string, std::string>> describe(
        const Options& options, const std::optional<Capture>& capture,
        const std::vector<verolux::host::SettingValue>& settings, const Simulation& simulation) {
    std::vector<std::pair<std::string, std::string>> rows = {
            {"mode", modeText(options.mode)},
            {"game", gameText(options, capture)},
            {"display", plain(options.hz) + " Hz"},
            {"duration", durationText(options, capture)},
    };
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

}  // namespace

int main(int argc, char** argv) {
    const Result<Options> parsed = parseOptions(argc, argv);
    if (!parsed.ok()) return fail(parsed.error);
    const Options& options = parsed.value;
    if (options.help) {
        std::cout << usage();
        return 0;
    }

    const Result<std::vector<verolux::host::SettingValue>> settings = gatherSettings(options);
    if (!settings.ok()) return fail(settings.error);

    std::optional<Capture> capture;
    if (!options.capturePath.empty()) {
        Result<Capture> read = readCapture(options.capturePath);
        if (!read.ok()) return fail(read.error);
        capture = std::move(read.value);
    }

    std::error_code error;
    std::filesystem::create_directories(options.outDir, error);
    if (error) return fail(errorLine("cannot create " + options.outDir + ": " + error.message()));
    const std::filesystem::path out(options.outDir);
    EngineLog engineLog;
    if (Status opened = engineLog.open((out / "engine.log").string()); !opened.ok()) {
        return fail(opened.error);
    }

    Simulation simulation(options, settings.value, capture ? &*capture : nullptr);
    std::vector<Outputs::Layer> layers;
    // The copies of the run (--layers) are measured only: their files would repeat the run's.
    const size_t withFiles = options.reference ? 2 : 1;
    for (const LayerPlan& plan : simulation.layers()) {
        layers.push_back({plan.role, plan.role + ": mode " + modeText(plan.mode), plan.uid,
                          layers.size() < withFiles});
    }
    const auto described = describe(options, capture, settings.value, simulation);
    const Json::Value runDescription = runJson(described, simulation, layers, options);
    {
        std::ofstream file(out / "run.json");
        file << runDescription.toStyledString();
        if (!file) return fail(errorLine("cannot write " + (out / "run.json").string()));
    }
    Outputs outputs(options.outDir, simulation.startTime(), simulation.refreshPeriod(),
                    simulation.startTime() + std::llround(options.pictureAtSec * 1e9));
    if (Status opened = outputs.open(layers, runDescription["options"]); !opened.ok()) {
        return fail(opened.error);
    }

    installInterruptHandler();
    if (!options.quiet) {
        std::cerr << "verolux-sim: mode " << modeText(options.mode)
                  << (options.layers > 1 ? " (" + std::to_string(options.layers) + " layers)" : "")
                  << (options.reference ? " against mode 2 no interpolation" : "") << "; "
                  << gameText(options, capture) << " on a " << plain(options.hz) << " Hz display; "
                  << simulation.layers().front().buffers.count << " buffers";
        if (options.reference) {
            std::cerr << " (reference " << simulation.layers()[1].buffers.count << ")";
        }
        std::cerr << "; " << durationText(options, capture)
                  << ". Ctrl-C stops early and keeps the results." << std::endl;
    }
    const RunResult result =
            simulation.run(outputs.sinks(), sInterrupted, options.quiet ? nullptr : &std::cerr);
    int status = result.interrupted ? 130 : 0;
    auto check = [&](const Status& done) {
        if (!done.ok()) {
            std::cerr << done.error << std::endl;
            status = status == 0 ? 1 : status;
        }
    };
    check(outputs.finish());
    {
        std::ofstream file(out / "dumpsys.txt");
        file << result.dump;
        if (!file) check(Status{errorLine("cannot write " + (out / "dumpsys.txt").string())});
    }
    {
        std::ofstream file(out / "ringlog.bin", std::ios::binary);
        file.write(reinterpret_cast<const char*>(result.ringLogs.data()),
                   static_cast<std::streamsize>(result.ringLogs.size()));
        if (!file) check(Status{errorLine("cannot write " + (out / "ringlog.bin").string())});
    }

    std::vector<Summary> summaries;
    for (size_t i = 0; i < simulation.layers().size(); i++) {
        const LayerPlan& plan = simulation.layers()[i];
        LayerFacts facts;
        facts.role = plan.role;
        facts.mode = plan.mode;
        facts.runSec = (result.endTime - simulation.startTime()) / 1e9;
        facts.buffers = plan.buffers.count;
        facts.buffersFixed = plan.buffers.fixed;
        facts.bufferBytes = uint64_t{plan.buffers.count} * options.gameWidth * options.gameHeight *
                            BYTES_PER_PIXEL;
        facts.resolution =
                std::to_string(options.gameWidth) + "x" + std::to_string(options.gameHeight);
        const MeasuredLayer measured = outputs.measures(i).result();
        facts.ownFps = capture ? capture->fpsOverFirst(measured.framesQueued) : options.fps;
        facts.refreshHz = options.hz;
        facts.startTime = simulation.startTime();
        facts.captureEnded = result.captureEnded;
        summaries.push_back({facts, measured});
    }
    const Summary* reference = options.reference ? &summaries[1] : nullptr;
    const std::vector<Summary> copies(summaries.begin() + (options.reference ? 2 : 1),
                                      summaries.end());
    const std::string summary = formatSummary(summaries[0], reference) + formatCopies(copies);
    {
        std::ofstream file(out / "summary.txt");
        file << summary;
        if (!file) check(Status{errorLine("cannot write " + (out / "summary.txt").string())});
    }
    if (result.interrupted) std::cout << "Interrupted: results cover the run so far.\n";
    std::cout << summary << std::flush;

    if (!options.quiet) std::cerr << "verolux-sim: drawing the figures..." << std::endl;
    const Status drawn = drawFigures(options.outDir);
    if (!drawn.ok()) std::cerr << drawn.error << std::endl;
    check(writeReport(options.outDir, described, summaries[0], reference));

    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    std::cout << "\nIn " << options.outDir << ":\n"
              << "  report.html     the summary and the figures on one page (open in a browser)\n"
              << "  summary.txt     the summary above\n"
              << "  frames.csv      one row per game frame; refreshes.csv one per refresh;\n"
              << "  presentmon.csv  the frames in PresentMon's columns"
              << (reference != nullptr ? " (reference-*.csv: mode 2)" : "") << "\n"
              << "  trace.json      open in https://ui.perfetto.dev\n"
              << "  dumpsys.txt     each layer's dump at the end of the run\n"
              << "  ringlog.bin     each layer's event ring log (verolux-ringlog reads it)\n"
              << "  *.png           the figures\n"
              << "  engine.log      " << engineLog.lines()
              << (engineLog.lines() == 1 ? " line" : " lines") << " from the library (logLevel "
              << verolux::sim::logLevelOf(settings.value) << "; --set logLevel=2 logs every step)\n"
              << "Peak memory of the simulator: " << usage.ru_maxrss / 1024 << " MiB." << std::endl;
    return status;
}
