#pragma once

#include <deque>
#include <string>
#include <vector>

#include "sim/Recording.h"
#include "sim/Result.h"

namespace verolux::sim {

// The rows of the space-time picture for a window of the run: the scanline on screen at each
// refresh whose present time falls in [from, to), at most maxRows of them, so that a run of any
// length keeps only the window. A run that ends before `from` keeps its last to - from instead.
class SpaceTimeWindow final : public RecordSink {
public:
    SpaceTimeWindow(nsecs_t from, nsecs_t to, size_t maxRows);

    void onRefresh(const RefreshRecord& refresh) override;

    // A PNG with one row per refresh of the window, top to bottom, and text chunks "first_refresh"
    // (the refresh index of the first row) and "rows", by which the figure script finds each
    // row's refresh in refreshes.csv.
    Status writePng(const std::string& path) const;

private:
    struct Row {
        uint64_t refresh;
        nsecs_t presentTime;
        std::vector<uint8_t> scanline;  // RGB
    };

    const nsecs_t mFrom;
    const nsecs_t mTo;
    const size_t mMaxRows;
    bool mInWindow = false;
    std::deque<Row> mRows;
};

}  // namespace verolux::sim
