#pragma once

#include <utils/Singleton.h>

#include <mutex>

namespace android {

// The compositor's side of the interpolation engine. The engine marks its settings controller as
// created here, so that the compositor knows settings can be delivered.
class InterpolationGui : public Singleton<InterpolationGui> {
public:
    bool mSettingsControllerCreated = false;  // guarded by mMutex
    std::mutex mMutex;

private:
    friend class Singleton<InterpolationGui>;
    InterpolationGui() = default;
};

}  // namespace android
