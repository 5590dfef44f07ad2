#pragma once

#include <json/value.h>

#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "sim/CsvWriter.h"
#include "sim/Measures.h"
#include "sim/Result.h"
#include "sim/SpaceTimeWindow.h"
#include "sim/TraceWriter.h"

namespace verolux::sim {

// The files of a run in its output folder, written as records come, and each layer's measures.
// Per layer, the reference's names starting with "reference-": frames.csv, refreshes.csv,
// presentmon.csv and the space-time rows (spacetime-rows.png); for all, trace.json. A layer
// opened without files is only measured.
class Outputs {
public:
    struct Layer {
        std::string role;   // "run" or "reference"
        std::string title;  // "run: mode 0 retime"
        uint32_t uid = 0;
        bool files = true;  // false: measured only, for a copy of a layer that has them
    };
    // The space-time picture's window: this long from its start, at most this many rows.
    static constexpr nsecs_t PICTURE_WINDOW = 2'000'000'000;
    static constexpr size_t MAX_PICTURE_ROWS = 4096;

    Outputs(std::string folder, nsecs_t origin, nsecs_t refreshPeriod, nsecs_t pictureFrom);
    ~Outputs();

    // Creates the files; `options` goes into the trace's metadata.
    Status open(const std::vector<Layer>& layers, const Json::Value& options);
    // One per layer, in the order given to open().
    std::vector<RecordSink*> sinks();
    // Ends and closes every file; the first error, if any.
    Status finish();

    const Measures& measures(size_t layer) const;
    std::string path(const std::string& name) const;
    static std::string prefix(const std::string& role) { return role == "run" ? "" : role + "-"; }

private:
    struct LayerOutputs;

    Status openFile(const std::string& name, std::ofstream& out);

    const std::string mFolder;
    const nsecs_t mOrigin;
    const nsecs_t mRefreshPeriod;
    const nsecs_t mPictureFrom;
    std::ofstream mTraceFile;
    std::unique_ptr<TraceWriter> mTrace;
    std::vector<std::unique_ptr<LayerOutputs>> mLayers;
};

}  // namespace verolux::sim
