#pragma once

#include <utils/Timers.h>

#include <cstdint>
#include <vector>

#include "EventDispatcher.h"

namespace android::Interpolation {

// One event flattened for a log: no references, 16 bytes, laid out as it is written to a parcel.
struct SerializableEvent {
    EventType type;
    int32_t value;  // the event's one number; 0 where it has none
    nsecs_t time;   // normally the event's time; eFrameDesiredEvent and
                    // eCompositionEstimateEvent carry the time they name instead
};
static_assert(sizeof(SerializableEvent) == 16, "the ring log's parcel layout");

// Receives the records of one event as they are flattened, so that a caller with storage of its
// own (the ring log, on every event of its layer) needs no vector.
class SerializableEventSink {
public:
    virtual void add(const SerializableEvent& record) = 0;

protected:
    ~SerializableEventSink() = default;
};

// Flattens one event into `sink`: one record for most events, one per render item for
// eBufferComposedEvent, none (and a log line) for a payload of the wrong kind or an unknown type.
void serializeEvent(const EventType& type, const nsecs_t& time, const EventData& data,
                    SerializableEventSink& sink);

// The records of serializeEvent as a vector.
std::vector<SerializableEvent> make_serializable(const EventType& type, const nsecs_t& time,
                                                 const EventData& data);

}  // namespace android::Interpolation
