#include "UnlimitedReleasePicker.h"

namespace android::Interpolation {

UnlimitedReleasePicker::UnlimitedReleasePicker(sp<FrameList>& frameList, String8& name,
                                               const uint32_t& uid)
    : ReleasePicker(frameList, name, uid, eFrameReceivedEvent | eBufferComposedEvent) {}

ReleaseChoice UnlimitedReleasePicker::tryRelease() {
    beginTryReleaseLocked("UnlimitedReleasePicker");
    return chooseOldestFrameOnceDisplayedLocked();
}

}  // namespace android::Interpolation
