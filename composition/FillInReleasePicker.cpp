#include "FillInReleasePicker.h"

namespace android::Interpolation {

FillInReleasePicker::FillInReleasePicker(sp<FrameList>& frameList, String8& name,
                                         const uint32_t& uid)
    : ReleasePicker(frameList, name, uid, eFrameReceivedEvent) {}

ReleaseChoice FillInReleasePicker::tryRelease() {
    beginTryReleaseLocked("FillInReleasePicker");
    if (mFrameList->size() < QUEUE_DEPTH) return {};
    return chooseOldestFrame();
}

}  // namespace android::Interpolation
