#include "SerializableEvent.h"

#include <variant>

#include "Log.h"

namespace android::Interpolation {

namespace {

constexpr nsecs_t NS_PER_MS = 1'000'000;

// The payload of the alternative an event needs, or null and `missing` in the log.
template <typename T>
const T* payload(const EventData& data, const char* missing) {
    const T* value = std::get_if<T>(&data);
    if (value == nullptr) ILOG(2, "%s", missing);
    return value;
}

void addSlot(SerializableEventSink& sink, EventType type, nsecs_t time, const EventData& data,
             const char* missing) {
    if (const auto* frame = payload<FrameItem>(data, missing)) {
        sink.add({type, frame->mTextureSlot, time});
    }
}

void addInteger(SerializableEventSink& sink, EventType type, nsecs_t time, const EventData& data,
                const char* missing) {
    if (const auto* value = payload<int>(data, missing)) sink.add({type, *value, time});
}

class VectorSink final : public SerializableEventSink {
public:
    void add(const SerializableEvent& record) override { records.push_back(record); }

    std::vector<SerializableEvent> records;
};

}  // namespace

// The asymmetries are the log format's own and readers rely on them: the delay change is in
// milliseconds while eReleaseDelayed keeps the low 32 bits of its nanoseconds, and event 8 is
// logged as a new picture when its state holds one item or none.
void serializeEvent(const EventType& type, const nsecs_t& time, const EventData& data,
                    SerializableEventSink& sink) {
    switch (type) {
        case eFrameReceivedEvent:
            return addSlot(sink, type, time, data,
                           "make_serializable eFrameReceivedEvent received with no FrameItem data");
        case eFrameReleasedEvent:
            return addSlot(sink, type, time, data,
                           "make_serializable eFrameReleasedEvent received with no FrameItem data");
        case eFrameListSizeChangedEvent:
            return addInteger(
                    sink, type, time, data,
                    "make_serializable eFrameListSizeChangedEvent received with no integer data");
        case eBlendedCompositionEvent: {
            const auto* state = std::get_if<RenderState>(&data);
            const bool single = state != nullptr && state->items.size() <= 1;
            return sink.add({single ? eNewFrameCompositionEvent : type, 0, time});
        }
        case eRepeatedCompositionEvent:
        case eNewFrameCompositionEvent:
        case ePresentationRefusedEvent:
            return sink.add({type, 0, time});
        case eDelayChangedEvent:
            if (const auto* delay = payload<nsecs_t>(
                        data, "make_serializable eDelayChangedEvent contained no nsecs_t data")) {
                sink.add({type, static_cast<int32_t>(*delay / NS_PER_MS), time});
            }
            return;
        case eBufferRequestedEvent:
            return addInteger(sink, type, time, data,
                              "make_serializable eBufferRequestedEvent contained no integer data");
        case eBufferDequeuedEvent:
            return addInteger(sink, type, time, data,
                              "make_serializable eBufferDequeuedEvent contained no integer data");
        case eBufferQueuedEvent:
            return addInteger(sink, type, time, data,
                              "make_serializable eBufferQueuedEvent contained no integer data");
        case eBufferCompletedEvent:
            return addInteger(sink, type, time, data,
                              "make_serializable eBufferCompletedEvent contained no integer data");
        case eFrameDesiredEvent:
            if (const auto* frame = payload<FrameItem>(
                        data,
                        "make_serializable eFrameDesiredEvent received with no FrameItem data")) {
                sink.add({type, frame->mTextureSlot, frame->mID});
            }
            return;
        case eDFSChangedEvent:
            return addInteger(sink, type, time, data,
                              "make_serializable eDFSChangedEvent contained no integer data");
        case eRealFPSChangedEvent:
            return addInteger(sink, type, time, data,
                              "make_serializable eRealFPSChangedEvent contained no integer data");
        case eBufferDisplayedEvent:
            return addInteger(sink, type, time, data,
                              "make_serializable eBufferDisplayedEvent contained no integer data");
        case eBufferReleasedEvent:
            return addInteger(sink, type, time, data,
                              "make_serializable eBufferReleasedEvent contained no integer data");
        case eBufferComposedEvent:
            if (const auto* state = payload<RenderState>(
                        data,
                        "make_serializable eBufferComposedEvent contained no RenderState data")) {
                for (const RenderItem& item : state->items)
                    sink.add({type, item.frame.mTextureSlot, time});
            }
            return;
        case eCompositionEstimateEvent:
            if (const auto* estimate = payload<nsecs_t>(
                        data,
                        "make_serializable eCompositionEstimateEvent contained no nsecs_t data")) {
                sink.add({type, 0, *estimate});
            }
            return;
        case eReleaseDelayed:
            if (const auto* delay = payload<nsecs_t>(
                        data, "make_serializable eReleaseDelayed contained no nsecs_t data")) {
                const auto low = static_cast<uint32_t>(static_cast<uint64_t>(*delay));
                sink.add({type, static_cast<int32_t>(low), time});
            }
            return;
        case eClientCompositionExceptionCheck:
            if (const auto* check = payload<bool>(
                        data,
                        "make_serializable eClientCompositionExceptionCheck contained no boolean "
                        "data")) {
                sink.add({type, *check ? 1 : 0, time});
            }
            return;
    }
    ILOG(1, "make_serializable EventType %u not handled", static_cast<uint32_t>(type));
}

std::vector<SerializableEvent> make_serializable(const EventType& type, const nsecs_t& time,
                                                 const EventData& data) {
    VectorSink sink;
    serializeEvent(type, time, data, sink);
    return std::move(sink.records);
}

}  // namespace android::Interpolation
