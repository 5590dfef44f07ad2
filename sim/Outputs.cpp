#include "sim/Outputs.h"

#include <cerrno>
#include <cstring>
#include <filesystem>

namespace verolux::sim {

struct Outputs::LayerOutputs {
    LayerOutputs(const Layer& layer, nsecs_t refreshPeriod, nsecs_t pictureFrom)
        : role(layer.role),
          measures(refreshPeriod),
          picture(pictureFrom, pictureFrom + PICTURE_WINDOW, MAX_PICTURE_ROWS) {}

    const std::string role;
    std::ofstream framesFile;
    std::ofstream refreshesFile;
    std::ofstream presentMonFile;
    std::unique_ptr<FramesCsv> frames;
    std::unique_ptr<RefreshesCsv> refreshes;
    std::unique_ptr<PresentMonCsv> presentMon;
    Measures measures;
    SpaceTimeWindow picture;
    SinkFanout sinks;
};

Outputs::Outputs(std::string folder, nsecs_t origin, nsecs_t refreshPeriod, nsecs_t pictureFrom)
    : mFolder(std::move(folder)),
      mOrigin(origin),
      mRefreshPeriod(refreshPeriod),
      mPictureFrom(pictureFrom) {}

Outputs::~Outputs() = default;

std::string Outputs::path(const std::string& name) const {
    return (std::filesystem::path(mFolder) / name).string();
}

Status Outputs::openFile(const std::string& name, std::ofstream& out) {
    const std::string file = path(name);
    out.open(file, std::ios::binary | std::ios::trunc);
    if (!out) return {errorLine("cannot write " + file + ": " + strerror(errno))};
    return {};
}

Status Outputs::open(const std::vector<Layer>& layers, const Json::Value& options) {
    if (Status status = openFile("trace.json", mTraceFile); !status.ok()) return status;
    mTrace = std::make_unique<TraceWriter>(mTraceFile, mOrigin, options);
    int pid = 1;
    for (const Layer& layer : layers) {
        auto& out = *mLayers.emplace_back(
                std::make_unique<LayerOutputs>(layer, mRefreshPeriod, mPictureFrom));
        if (!layer.files) {
            out.sinks.add(&out.measures);
            continue;
        }
        const std::string prefix = Outputs::prefix(layer.role);
        for (auto [name, file] : {std::pair{"frames.csv", &out.framesFile},
                                  std::pair{"refreshes.csv", &out.refreshesFile},
                                  std::pair{"presentmon.csv", &out.presentMonFile}}) {
            if (Status status = openFile(prefix + name, *file); !status.ok()) return status;
        }
        out.frames = std::make_unique<FramesCsv>(out.framesFile, mOrigin);
        out.refreshes = std::make_unique<RefreshesCsv>(out.refreshesFile, mOrigin);
        out.presentMon = std::make_unique<PresentMonCsv>(out.presentMonFile, mOrigin,
                                                         "verolux-sim-" + layer.role, layer.uid);
        for (RecordSink* sink : std::initializer_list<RecordSink*>{
                     &out.measures, out.frames.get(), out.refreshes.get(), out.presentMon.get(),
                     &out.picture, &mTrace->addLayer(pid++, layer.title, mRefreshPeriod)}) {
            out.sinks.add(sink);
        }
    }
    return {};
}

std::vector<RecordSink*> Outputs::sinks() {
    std::vector<RecordSink*> sinks;
    for (auto& layer : mLayers)
        sinks.push_back(&layer->sinks);
    return sinks;
}

Status Outputs::finish() {
    Status first;
    auto keep = [&first](Status status) {
        if (first.ok() && !status.ok()) first = std::move(status);
    };
    if (mTrace != nullptr) mTrace->finish();
    mTraceFile.close();
    if (!mTraceFile) keep({errorLine("cannot write " + path("trace.json"))});
    for (auto& layer : mLayers) {
        if (layer->frames == nullptr) continue;  // measured only
        const std::string prefix = Outputs::prefix(layer->role);
        for (auto [name, file] : {std::pair{"frames.csv", &layer->framesFile},
                                  std::pair{"refreshes.csv", &layer->refreshesFile},
                                  std::pair{"presentmon.csv", &layer->presentMonFile}}) {
            file->close();
            if (!*file) keep({errorLine("cannot write " + path(prefix + name))});
        }
        keep(layer->picture.writePng(path(prefix + "spacetime-rows.png")));
    }
    return first;
}

const Measures& Outputs::measures(size_t layer) const {
    return mLayers.at(layer)->measures;
}

}  // namespace verolux::sim
