#include "host/LayerSettings.h"

#include <mutex>

namespace verolux::host {

using android::Interpolation::Settings;
using android::Interpolation::SettingsController;

void LayerSettings::onFirstRef() {
    SettingsController::Observer::onFirstRef();
    SettingsController* controller = SettingsController::getInstance();
    std::lock_guard lock(controller->getMutex());
    onSettingsChanged(controller->getSettingsLocked(mUid));
}

void LayerSettings::onSettingsChanged(const Settings& s) {
    mInterpolating = s.gameFpsLimit >= 1;
    mGameRateLimited = s.gfpsOffsetEnabled;
}

}  // namespace verolux::host
