#include "tools/ringlog/RecordKinds.h"

#include <algorithm>
#include <iterator>

#include "EventDispatcher.h"
#include "Ringlog.h"

namespace verolux::ringlog {

namespace {

using namespace android::Interpolation;

constexpr RecordKind KINDS[] = {
        {eFrameReceivedEvent, "eFrameReceivedEvent", "frame received", "slot", Track::eFrames},
        {eFrameReleasedEvent, "eFrameReleasedEvent", "frame released", "slot", Track::eReleases},
        {eFrameListSizeChangedEvent, "eFrameListSizeChangedEvent", "queue length", "frames",
         Track::eCounter},
        {eBlendedCompositionEvent, "eBlendedCompositionEvent", "blend", "value",
         Track::eComposition},
        {eRepeatedCompositionEvent, "eRepeatedCompositionEvent", "repeat", "value",
         Track::eComposition},
        {eDelayChangedEvent, "eDelayChangedEvent", "display delay", "ms", Track::eCounter},
        {eNewFrameCompositionEvent, "eNewFrameCompositionEvent", "new picture", "value",
         Track::eComposition},
        {eBufferRequestedEvent, "eBufferRequestedEvent", "buffer requested", "slot",
         Track::eBufferStages},
        {eBufferDequeuedEvent, "eBufferDequeuedEvent", "buffer dequeued", "slot",
         Track::eBufferStages},
        {eBufferQueuedEvent, "eBufferQueuedEvent", "buffer queued", "slot", Track::eBufferStages},
        {eBufferCompletedEvent, "eBufferCompletedEvent", "buffer completed", "slot",
         Track::eBufferStages},
        {eFrameDesiredEvent, "eFrameDesiredEvent", "frame desired", "slot", Track::eFrames},
        {eDFSChangedEvent, "eDFSChangedEvent", "render rate", "fps", Track::eCounter},
        {eRealFPSChangedEvent, "eRealFPSChangedEvent", "real game rate", "fps", Track::eCounter},
        {ePresentationRefusedEvent, "ePresentationRefusedEvent", "presentation refused", "value",
         Track::ePresentation},
        {eBufferDisplayedEvent, "eBufferDisplayedEvent", "buffer displayed", "slot",
         Track::eBufferStages},
        {eBufferReleasedEvent, "eBufferReleasedEvent", "buffer released", "slot",
         Track::eBufferStages},
        {eBufferComposedEvent, "eBufferComposedEvent", "composed", "slot", Track::eComposition},
        {eCompositionEstimateEvent, "eCompositionEstimateEvent", "composition estimate", "value",
         Track::eFrames},
        {eReleaseDelayed, "eReleaseDelayed", "release delayed", "ns (low 32 bits)",
         Track::eReleases},
        {eClientCompositionExceptionCheck, "eClientCompositionExceptionCheck",
         "client composition check", "value", Track::eOther},
        {Ringlog::FRAME_REPEATED_RECORD, "FrameRepeated", "frame repeated", "value",
         Track::eDirectRecords},
        {Ringlog::BACKPRESSURE_RECORD, "Backpressure", "backpressure", "value",
         Track::eDirectRecords},
        {Ringlog::GFPS_CHANGED_RECORD, "GFPSChanged", "game rate limit", "fps",
         Track::eDirectRecords},
};

constexpr RecordKind UNKNOWN = {0, "unknown", "unknown", "value", Track::eOther};

}  // namespace

const RecordKind& recordKind(uint32_t type) {
    const auto* found = std::find_if(std::begin(KINDS), std::end(KINDS),
                                     [type](const RecordKind& kind) { return kind.type == type; });
    return found != std::end(KINDS) ? *found : UNKNOWN;
}

const char* trackName(Track track) {
    switch (track) {
        case Track::eCounter:
            return "counters";
        case Track::eComposition:
            return "composition";
        case Track::eReleases:
            return "releases";
        case Track::eBufferStages:
            return "buffer stages";
        case Track::ePresentation:
            return "presentation";
        case Track::eDirectRecords:
            return "engine records";
        case Track::eFrames:
            return "frames";
        case Track::eOther:
            return "other";
    }
    return "other";
}

const char* modeName(uint32_t mode) {
    switch (mode) {
        case eRetimeMode:
            return "retime";
        case eFillInMode:
            return "fill-in";
        case eNoInterpMode:
            return "no interpolation";
        case eJustInTimeMode:
            return "just-in-time";
        case eUnlimitedMode:
            return "unlimited";
        case eLatencyReductionMode:
            return "latency reduction";
        default:
            return "unknown";
    }
}

}  // namespace verolux::ringlog
