#include "RenderStateBuilder.h"

#include "FillInRenderStateBuilder.h"
#include "Log.h"
#include "MirrorSurfaceFlingerRenderState.h"
#include "RetimeRenderStateBuilder.h"
#include "UnlimitedRenderStateBuilder.h"

namespace android::Interpolation {

namespace {

// Receivers get the state by reference and copy what they keep, so the state is lent to the event
// for the broadcast instead of copied: the refresh path then allocates only the state itself.
RenderState broadcastState(uint32_t uid, EventType type, RenderState&& state) {
    EventData data(std::move(state));
    EventDispatcher::broadcastEvent(uid, type, systemTime(SYSTEM_TIME_MONOTONIC), data);
    return std::move(std::get<RenderState>(data));
}

}  // namespace

sp<RenderStateBuilder> RenderStateBuilder::newBuilderFromMode(String8& name, unsigned int const& uid,
                                                              sp<FrameList>& frameList,
                                                              InterpolationMode const& mode) {
    switch (mode) {
        case eFillInMode:
            return new FillInRenderStateBuilder(name, uid, frameList);
        case eNoInterpMode:
        case eJustInTimeMode:
        case eLatencyReductionMode:
            return new MirrorSurfaceFlingerRenderState(name, uid, frameList);
        case eUnlimitedMode:
            return new UnlimitedRenderStateBuilder(name, uid, frameList);
        default:
            return new RetimeRenderStateBuilder(name, uid, frameList);
    }
}

RenderStateBuilder::RenderStateBuilder(String8& name, unsigned int const& uid,
                                       sp<FrameList>& frameList)
    : mName(name), mUid(uid), mFrameList(frameList) {}

RenderState RenderStateBuilder::lockStateFor(nsecs_t const& displayTime) {
    std::unique_lock lock(mMutex);
    ILOG(2, "RenderStateBuilder::lockStateFor [%s] uid %u displayTime %ld", mName.c_str(), mUid,
         displayTime);
    RenderState state = setupFramesFor(getFramesFor(displayTime), displayTime);
    mLastStateDisplayTime = state.meanFrameID();
    lock.unlock();
    return broadcastState(mUid, eBufferComposedEvent, std::move(state));
}

RenderState RenderStateBuilder::setupOpaqueFrame(RenderState&& state) {
    if (!state.items.empty()) {
        state.items[0].alpha = 1.0f;
        state.items[0].blend = 0;
    } else {
        __android_log_print(ANDROID_LOG_WARN, nullptr,
                            "[%s] RenderStateBuilder: created RenderState with no frames",
                            mName.c_str());
    }
    return std::move(state);
}

RenderState RenderStateBuilder::newState() {
    RenderState state;
    state.items.reserve(2);
    return state;
}

void RenderStateBuilder::pushFrame(RenderState& state, FrameItem frame) {
    state.items.push_back(RenderItem{std::move(frame), 0.0f, 0});
}

RenderState RenderStateBuilder::announce(EventType kind, RenderState&& state) const {
    return broadcastState(mUid, kind, std::move(state));
}

}  // namespace android::Interpolation
