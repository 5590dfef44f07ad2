// verolux-sim: plays a simulated game and display in real time against the engine, through the
// reference host, and reports what it did to the game's pacing.

#include <signal.h>

#include <atomic>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <optional>
#include <string>

#include "sim/Capture.h"
#include "sim/CsvWriter.h"
#include "sim/Options.h"
#include "sim/PngWriter.h"
#include "sim/Simulation.h"
#include "sim/Summary.h"
#include "sim/TraceWriter.h"

namespace {

using namespace verolux::sim;

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
    if (error) {
        return fail(errorLine("cannot create " + options.outDir + ": " + error.message()));
    }

    if (options.mode == 1 && options.slots < 5) {
        // Not an error: the stall is what such a configuration does, and worth seeing.
        std::cerr << "verolux-sim: note: mode 1 keeps four frames queued before it releases one; "
                  << "with " << options.slots << " slots the game stalls (try --slots 5)"
                  << std::endl;
    }
    installInterruptHandler();
    if (!options.quiet) {
        std::cerr << "verolux-sim: mode " << options.mode << ", "
                  << (capture ? "capture " + options.capturePath
                              : std::to_string(options.fps) + " fps game")
                  << " on a " << options.hz << " Hz display for " << options.durationSec
                  << " s (Ctrl-C stops early and still writes the results)" << std::endl;
    }
    Simulation simulation(options, settings.value, capture ? &*capture : nullptr);
    const SimulationResult result =
            simulation.run(sInterrupted, options.quiet ? nullptr : &std::cerr);
    const Recording* reference = result.reference ? &*result.reference : nullptr;

    const std::filesystem::path out(options.outDir);
    const std::string csvPath = (out / "refreshes.csv").string();
    const std::string referenceCsvPath = (out / "reference-refreshes.csv").string();
    const std::string tracePath = (out / "trace.json").string();
    const std::string pngPath = (out / "spacetime.png").string();
    const std::string summaryPath = (out / "summary.txt").string();

    int status = result.interrupted ? 130 : 0;
    auto check = [&](const Status& written) {
        if (!written.ok()) {
            std::cerr << written.error << std::endl;
            status = 1;
        }
    };
    check(writeRefreshCsvFile(result.run, csvPath));
    if (reference != nullptr) check(writeRefreshCsvFile(*reference, referenceCsvPath));
    check(writeTraceFile(tracePath, result.run, reference));
    check(writeSpaceTimePng(pngPath, result.run, reference));

    const Summary runSummary = summarize(result.run);
    std::optional<Summary> referenceSummary;
    if (reference != nullptr) referenceSummary = summarize(*reference);
    const std::string summary =
            formatSummary(runSummary, referenceSummary ? &*referenceSummary : nullptr);
    {
        std::ofstream file(summaryPath);
        file << summary;
        if (!file) check(Status{errorLine("cannot write " + summaryPath)});
    }

    if (result.interrupted) std::cout << "Interrupted: results cover the run so far." << std::endl;
    std::cout << summary << "\nFiles:\n"
              << "  summary      " << summaryPath << "\n"
              << "  per refresh  " << csvPath << "\n";
    if (reference != nullptr) std::cout << "  reference    " << referenceCsvPath << "\n";
    std::cout << "  trace        " << tracePath << "  (open in https://ui.perfetto.dev)\n"
              << "  picture      " << pngPath << std::endl;
    return status;
}
