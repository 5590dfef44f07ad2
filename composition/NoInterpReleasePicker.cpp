#include "NoInterpReleasePicker.h"

namespace android::Interpolation {

NoInterpReleasePicker::NoInterpReleasePicker(sp<FrameList>& frameList, String8& name,
                                             const uint32_t& uid)
    : ReleasePicker(frameList, name, uid, eFrameReceivedEvent | eBufferComposedEvent) {}

ReleaseChoice NoInterpReleasePicker::tryRelease() {
    beginTryReleaseLocked("NoInterpReleasePicker");
    return chooseOldestFrameOnceDisplayedLocked();
}

}  // namespace android::Interpolation
