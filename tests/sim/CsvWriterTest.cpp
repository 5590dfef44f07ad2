#include <gtest/gtest.h>

#include <sstream>

#include "sim/CsvWriter.h"

namespace verolux::sim {
namespace {

constexpr nsecs_t MS = 1'000'000;

TEST(CsvWriterTest, writesTheHeaderThenOneRowPerRefreshWithEmptyCellsForWhatIsAbsent) {
    Recording recording;
    recording.startTime = 5000 * MS;

    RefreshRecord blend;
    blend.index = 7;
    blend.vsyncTime = 5000 * MS + 16'666'667;
    blend.displayTime = 5000 * MS + 20 * MS;
    blend.kind = 8;
    blend.items = {{12, 1.0f, 0, 0.75f}, {13, 0.25f, 0, 0.25f}};
    blend.contentTime = 5000 * MS + 1'234'567;
    blend.delay = 64 * MS;
    blend.cpuTime = 12'345;

    RefreshRecord nothing;
    nothing.index = 8;
    nothing.vsyncTime = 5000 * MS + 33'333'333;
    nothing.cpuTime = 999;
    recording.refreshes = {blend, nothing};

    std::ostringstream out;
    writeRefreshCsv(recording, out);
    EXPECT_EQ(
            "index,vsync_ns,display_time_ns,kind,frame0,alpha0,frame1,alpha1,content_ms,"
            "delay_ms,cpu_us\n"
            "7,16666667,20000000,8,12,1,13,0.25,1.235,64.000,12.345\n"
            "8,33333333,,,,,,,,,0.999\n",
            out.str());

    EXPECT_EQ("verolux-sim: cannot write /nonexistent/r.csv: No such file or directory",
              writeRefreshCsvFile(recording, "/nonexistent/r.csv").error);
}

}  // namespace
}  // namespace verolux::sim
