#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <tuple>

#include "sim/Comparison.h"
#include "sim/Sweep.h"

namespace verolux::sim {
namespace {

namespace fs = std::filesystem;

class GridTest : public testing::Test {
protected:
    // Short quiet runs without figures into a folder of the test's own.
    Options options(std::vector<const char*> args) {
        args.insert(args.begin(), "verolux-sim");
        args.insert(args.end(), {"--duration=3", "--no-figures", "--quiet"});
        Result<Options> parsed = parseOptions(static_cast<int>(args.size()), args.data());
        EXPECT_TRUE(parsed.ok()) << parsed.error;
        parsed.value.outDir = mFolder.string();
        return parsed.value;
    }
    std::string summary() const {
        std::ifstream in(mFolder / "summary.txt");
        return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
    }
    void TearDown() override { fs::remove_all(mFolder); }

    const fs::path mFolder =
            fs::path(testing::TempDir()) / ("verolux-grid-" + std::to_string(getpid()));
    const std::atomic<bool> mRunning{false};
};

TEST_F(GridTest, aComparisonPutsEachModeInAColumnAndItsFilesInAFolder) {
    EXPECT_EQ(0, compareModes(options({"--compare=0,2"}), {}, nullptr, nullptr, mRunning));
    EXPECT_THAT(summary(), testing::HasSubstr("mode 0 retime: Motion: smoother than without"));
    EXPECT_THAT(summary(), testing::ContainsRegex(" +mode 0 retime +mode 2 no interpolation\n"));
    EXPECT_TRUE(fs::exists(mFolder / "report.html"));
    EXPECT_TRUE(fs::exists(mFolder / "mode-2" / "refreshes.csv"));

    const std::atomic<bool> interrupted{true};
    EXPECT_EQ(130, compareModes(options({"--compare=0,2"}), {}, nullptr, nullptr, interrupted));
}

// At 30 fps on 60 Hz a 30 ms delay leaves motion rougher than 64 ms does, and costs less latency.
TEST_F(GridTest, aSweepMarksTheSmoothestCellWithinTheLatencyBudget) {
    const std::vector<std::tuple<const char*, std::string, size_t>> cases = {
            {nullptr, "* delayMs=64", 1},
            {"--latency-budget-ms=50", "* delayMs=30", 1},
            {"--latency-budget-ms=20", "Best: none; no cell keeps latency p50 within 20 ms", 0},
    };
    for (const auto& [budget, marked, marks] : cases) {
        std::vector<const char*> args = {"--sweep=delayMs=30,64", "--set=smartDelay=0"};
        if (budget != nullptr) args.push_back(budget);
        const Options o = options(args);
        EXPECT_EQ(0, sweepSettings(o, gatherSettings(o).value, nullptr, nullptr, mRunning));
        const std::string text = summary();
        EXPECT_THAT(text, testing::HasSubstr(marked)) << text;
        size_t rows = 0;
        for (size_t at = text.find("\n  * "); at != std::string::npos;
             at = text.find("\n  * ", at + 1))
            rows++;
        EXPECT_EQ(marks, rows) << text;
    }
}

}  // namespace
}  // namespace verolux::sim
