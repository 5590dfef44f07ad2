// verolux-ringlog: reads the ring log of one or more layers as the engine's writeToParcel wrote
// it, and shows it as a table, CSV, a per-second summary or a Perfetto trace.

#include <cerrno>
#include <cstring>
#include <fstream>
#include <iostream>
#include <string>

#include "tools/ringlog/PerfettoTrace.h"
#include "tools/ringlog/RinglogReader.h"
#include "tools/ringlog/RinglogReport.h"

namespace {

using namespace verolux::ringlog;

constexpr const char* USAGE =
        "usage: verolux-ringlog [--csv | --summary] [--perfetto OUT.json] RINGLOG\n"
        "\n"
        "Reads a ring log as the engine's writeToParcel wrote it (one or more layers back to\n"
        "back) and prints each layer's header and records, oldest first.\n"
        "  --csv                one line per record: layer,time_ns,type,event,value\n"
        "  --summary            per second: frames, composition kinds, repeated frames,\n"
        "                       backpressure, refused presentations, queue and delay\n"
        "  --perfetto OUT.json  also write a trace for https://ui.perfetto.dev; alone, print\n"
        "                       only the headers\n";

struct Arguments {
    bool csv = false;
    bool summary = false;
    std::string perfettoPath;
    std::string ringlogPath;
};

int fail(const std::string& message) {
    std::cerr << "verolux-ringlog: " << message << std::endl;
    return 1;
}

// Returns the error, or nothing when the arguments are good.
std::string parseArguments(int argc, char** argv, Arguments& arguments) {
    for (int i = 1; i < argc; i++) {
        const std::string argument = argv[i];
        if (argument == "--csv") {
            arguments.csv = true;
        } else if (argument == "--summary") {
            arguments.summary = true;
        } else if (argument == "--perfetto") {
            if (++i == argc) return "--perfetto needs an output file";
            arguments.perfettoPath = argv[i];
        } else if (argument.size() > 1 && argument[0] == '-') {
            return "unknown option \"" + printable(argument) + "\"; see --help";
        } else if (!arguments.ringlogPath.empty()) {
            return "one ring log at a time; see --help";
        } else {
            arguments.ringlogPath = argument;
        }
    }
    if (arguments.ringlogPath.empty()) return "no ring log given; see --help";
    if (arguments.csv && arguments.summary) return "--csv and --summary exclude each other";
    return {};
}

}  // namespace

int main(int argc, char** argv) {
    for (int i = 1; i < argc; i++) {
        if (std::string(argv[i]) == "--help" || std::string(argv[i]) == "-h") {
            std::cout << USAGE;
            return 0;
        }
    }
    Arguments arguments;
    if (const std::string error = parseArguments(argc, argv, arguments); !error.empty()) {
        std::cerr << "verolux-ringlog: " << error << std::endl;
        return 2;
    }

    const RinglogFile file = readRinglogFile(arguments.ringlogPath);
    if (!file.ok()) return fail(printable(arguments.ringlogPath) + ": " + file.error);
    // Opened before anything is printed, so that a bad output path is the only thing reported.
    std::ofstream trace;
    if (!arguments.perfettoPath.empty()) {
        trace.open(arguments.perfettoPath, std::ios::binary | std::ios::trunc);
        if (!trace) {
            return fail("cannot write " + printable(arguments.perfettoPath) + ": " +
                        strerror(errno));
        }
    }

    if (arguments.csv) {
        writeCsv(file.dumps, std::cout);
    } else {
        for (size_t i = 0; i < file.dumps.size(); i++) {
            if (i > 0) std::cout << "\n";
            if (arguments.summary) {
                writeSummary(file.dumps[i], std::cout);
            } else if (arguments.perfettoPath.empty()) {
                writeTable(file.dumps[i], std::cout);
            } else {
                writeHeader(file.dumps[i], std::cout);
            }
        }
    }

    if (trace.is_open()) {
        const size_t events = writePerfettoTrace(file.dumps, trace);
        trace.close();
        if (!trace) {
            return fail("cannot write " + printable(arguments.perfettoPath) + ": " +
                        strerror(errno));
        }
        // On stderr, so that the CSV or summary on stdout stays clean.
        std::cerr << printable(arguments.perfettoPath) << ": " << events
                  << " trace events; open it at https://ui.perfetto.dev" << std::endl;
    }
    std::cout.flush();
    return std::cout ? 0 : fail("cannot write the output");
}
