#include "RetimeReleasePicker.h"

namespace android::Interpolation {

RetimeReleasePicker::RetimeReleasePicker(sp<FrameList>& frameList, String8& name,
                                         const uint32_t& uid)
    : ReleasePicker(frameList, name, uid, eFrameReceivedEvent) {}

ReleaseChoice RetimeReleasePicker::tryRelease() {
    beginTryReleaseLocked("RetimeReleasePicker");
    if (!mFrameList->isOldestFrameUnused(mUpcomingDisplayTime)) return {};
    return chooseOldestFrame();
}

}  // namespace android::Interpolation
