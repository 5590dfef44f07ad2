#pragma once

#include <json/value.h>

#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include "sim/Recording.h"

namespace verolux::sim {

// A Chrome trace-event JSON file that Perfetto's UI opens, written event by event as records
// come. The run's options are the file's "metadata". Each layer is a process, its times in
// microseconds from the start of the run, so that the run and the reference line up:
//   - track "display": a slice per refresh from its present for one refresh period, named after
//     the picture on screen (blend, new, repeat, held), args frames, alphas, weights, content_ms;
//   - track "game": the producer's waits for a free buffer ("wait for buffer") and its drawing of
//     each frame ("draw", arg frame);
//   - track "slot N" per buffer: "frame N" from queue to release, with instants "render done",
//     "acquire" and "first present";
//   - counters "queue length" (frames), "display delay" (ms), "content age" (ms), "detected refresh
//     rate" (Hz), "game-rate limit" (fps, 0 while none is applied), and per second of the run
//     "game fps" (frames queued), "displayed fps" (new pictures) and "render rate" (refreshes the
//     layer presented at);
//   - instants "refused presentation" on the display track, and "watchdog warning" (code, value).
class TraceWriter {
public:
    TraceWriter(std::ostream& out, nsecs_t origin, const Json::Value& options);
    ~TraceWriter();
    TraceWriter(const TraceWriter&) = delete;
    TraceWriter& operator=(const TraceWriter&) = delete;

    // The sink of one layer's records; it lives as long as the writer.
    RecordSink& addLayer(int pid, const std::string& title, nsecs_t refreshPeriod);
    // Ends the file; nothing may be written after.
    void finish();

private:
    class LayerTrace;

    std::ostream& mOut;
    const nsecs_t mOrigin;
    bool mFinished = false;
    std::vector<std::unique_ptr<LayerTrace>> mLayers;
};

}  // namespace verolux::sim
