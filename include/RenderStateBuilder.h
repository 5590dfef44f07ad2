#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <mutex>

#include "EventDispatcher.h"
#include "FrameItem.h"
#include "FrameList.h"

namespace android::Interpolation {

// Answers, at every display refresh, what to compose for one layer at display time T. Subclasses
// pick and lock the frames and give them their blend weights; the base remembers what was shown
// and announces each state on the event bus: first the kind of composition (8: a blend, 16: the
// previous picture again, 64: a new picture), then eBufferComposedEvent.
class RenderStateBuilder : public virtual RefBase {
public:
    static sp<RenderStateBuilder> newBuilderFromMode(String8& name, unsigned int const& uid,
                                                     sp<FrameList>& frameList,
                                                     InterpolationMode const& mode);

    // The caller owns the state and the frame locks in it, and unlocks them once composed.
    virtual RenderState lockStateFor(nsecs_t const& displayTime);
    virtual ~RenderStateBuilder() = default;
    // Picks and locks the frames, and announces the kind of composition.
    virtual RenderState getFramesFor(nsecs_t const& displayTime) = 0;
    // Gives the picked items their alpha and blend mode.
    virtual RenderState setupFramesFor(RenderState&& state, nsecs_t const& displayTime) = 0;
    virtual RenderState setupOpaqueFrame(RenderState&& state);

protected:
    RenderStateBuilder(String8& name, unsigned int const& uid, sp<FrameList>& frameList);

    // A state with room for the two items a composition holds at most.
    static RenderState newState();
    static void pushFrame(RenderState& state, FrameItem frame);
    // Broadcasts `kind` with the picked state and hands the state back.
    RenderState announce(EventType kind, RenderState&& state) const;

    const String8 mName;
    const uint32_t mUid;
    const sp<FrameList> mFrameList;
    // Mean mID of the last state returned, per-term truncated; 0 before the first.
    nsecs_t mLastStateDisplayTime = 0;  // guarded by mMutex
    std::mutex mMutex;
};

}  // namespace android::Interpolation
