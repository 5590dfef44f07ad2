#include <gui/InterpolationGui.h>

namespace android {
ANDROID_SINGLETON_STATIC_INSTANCE(InterpolationGui);
}  // namespace android
