#pragma once

#include <json/value.h>

#include <string>

#include "sim/Recording.h"
#include "sim/Result.h"

namespace verolux::sim {

// A Chrome trace-event JSON object ("traceEvents", "displayTimeUnit": "ms") that Perfetto's UI
// opens. Each recording is a process (the run is pid 1, the reference pid 2), its times in
// microseconds from its own start, so that the two runs line up. Per process:
//   - thread "display": an instant "vsync" per refresh;
//   - thread "composition": a complete slice per refresh from its vsync to the next, named after
//     the state ("blend 12+13", "repeat 12", "new 13", "no state"), args kind, frames, alphas,
//     weights and content_ms;
//   - thread "slot N" per buffer-queue slot: a complete slice per frame from queue to release
//     (to the end of the run when never released), with instants "render done", "acquire" and
//     "first display". A slot holds one frame at a time, so its slices never overlap. Frames
//     without a slot are async slices (b/n/e, id = frame number) instead;
//   - counter "display delay" (ms) at each delay change.
Json::Value buildTrace(const Recording& run, const Recording* reference = nullptr);
Status writeTraceFile(const std::string& path, const Recording& run,
                      const Recording* reference = nullptr);

}  // namespace verolux::sim
