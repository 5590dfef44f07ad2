// verolux-sim: plays a simulated game and display against the engine, through the reference
// host, in simulated or real time, and reports what the screen showed.

#include <signal.h>
#include <sys/resource.h>

#include <atomic>
#include <iostream>
#include <optional>
#include <string>

#include "sim/Capture.h"
#include "sim/Comparison.h"
#include "sim/Expectations.h"
#include "sim/FolderRun.h"
#include "sim/Options.h"
#include "sim/Report.h"
#include "sim/Scenario.h"
#include "sim/SettingsKeys.h"
#include "sim/Sweep.h"

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
    Result<Options> parsed = parseOptions(argc, argv);
    if (!parsed.ok()) return fail(parsed.error);
    Options& options = parsed.value;
    if (options.help) {
        std::cout << usage();
        return 0;
    }

    std::optional<Scenario> scenario;
    if (!options.scenario.empty()) {
        Result<Scenario> read = readScenario(options.scenario);
        if (!read.ok()) return fail(read.error);
        scenario = std::move(read.value);
        if (const Status applied = applyScenario(*scenario, options); !applied.ok()) {
            return fail(applied.error);
        }
    }
    const Result<std::vector<verolux::host::SettingValue>> settings = gatherSettings(
            options, scenario ? scenario->settings : std::vector<verolux::host::SettingValue>{});
    if (!settings.ok()) return fail(settings.error);

    std::optional<Capture> capture;
    if (!options.capturePath.empty()) {
        Result<Capture> read = readCapture(options.capturePath);
        if (!read.ok()) return fail(read.error);
        capture = std::move(read.value);
    }

    installInterruptHandler();
    const Capture* game = capture ? &*capture : nullptr;
    const Scenario* played = scenario ? &*scenario : nullptr;
    if (!options.compare.empty()) {
        return compareModes(options, settings.value, game, played, sInterrupted);
    }
    if (!options.sweep.empty()) {
        return sweepSettings(options, settings.value, game, played, sInterrupted);
    }
    const Result<FolderRun> ran = runIntoFolder(options, settings.value, game, sInterrupted,
                                                options.quiet ? nullptr : &std::cerr, played);
    if (!ran.ok()) return fail(ran.error);
    const FolderRun& run = ran.value;
    int status = run.result.interrupted ? 130 : 0;
    auto check = [&](const Status& done) {
        if (!done.ok()) {
            std::cerr << done.error << std::endl;
            status = status == 0 ? 1 : status;
        }
    };
    for (const std::string& error : run.errors)
        check(Status{error});
    if (run.result.interrupted && !options.quiet) {
        std::cout << "Interrupted: results cover the run so far.\n";
    }
    if (!options.quiet) std::cout << run.summaryText << std::flush;
    for (const CheckedExpectation& checked : run.expectations) {
        if (checked.passed) continue;
        if (options.quiet) std::cout << checked.line << "\n";
        status = status == 0 ? 1 : status;
    }

    if (options.figures) {
        if (!options.quiet) std::cerr << "verolux-sim: drawing the figures..." << std::endl;
        const Status drawn = drawFigures(options.outDir);
        if (!drawn.ok()) std::cerr << drawn.error << std::endl;
    }
    ReportPage page = runPage(run.described, run.run(), run.reference());
    for (const CheckedExpectation& checked : run.expectations)
        page.expectations.push_back(checked.line);
    check(writeReport(options.outDir, page));

    if (options.quiet) return status;
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    std::cout << "\nIn " << options.outDir << ":\n"
              << "  report.html     the summary and the figures on one page (open in a browser)\n"
              << "  summary.txt     the summary above\n"
              << "  frames.csv      one row per game frame; refreshes.csv one per refresh;\n"
              << "  presentmon.csv  the frames in PresentMon's columns"
              << (run.reference() != nullptr ? " (reference-*.csv: mode 2)" : "") << "\n"
              << "  trace.json      open in https://ui.perfetto.dev\n"
              << "  dumpsys.txt     each layer's dump at the end of the run\n"
              << "  ringlog.bin     each layer's event ring log (verolux-ringlog reads it)\n"
              << "  *.png           the figures\n"
              << "  engine.log      " << run.engineLogLines
              << (run.engineLogLines == 1 ? " line" : " lines") << " from the library (logLevel "
              << logLevelOf(settings.value) << "; --set logLevel=2 logs every step)\n"
              << "Peak memory of the simulator: " << usage.ru_maxrss / 1024 << " MiB." << std::endl;
    return status;
}
