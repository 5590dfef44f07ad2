#pragma once

#include <cstdint>

namespace verolux::ringlog {

// Where a trace shows a record: a thread of the layer's process, or a counter.
enum class Track : int {
    eCounter = 0,
    eComposition = 1,
    eReleases = 2,
    eBufferStages = 3,
    ePresentation = 4,
    eDirectRecords = 5,
    eFrames = 6,
    eOther = 7,
};

struct RecordKind {
    uint32_t type;
    const char* name;       // the engine's own name for the event or record
    const char* traceName;  // the instant's or counter's name in a trace
    const char* valueName;  // what the value is: an instant's argument, a counter's unit
    Track track;
};

// What a ring-log record of this type is; unknown types get "unknown" on the track eOther.
const RecordKind& recordKind(uint32_t type);

// The name of a track (a thread of the layer's process in the trace).
const char* trackName(Track track);

// The mode's name, or "unknown".
const char* modeName(uint32_t mode);

}  // namespace verolux::ringlog
