#pragma once

#include <mutex>

#include "SettingsController.h"

namespace android::Interpolation {

// Hands an observer its uid's settings as they stand now. Under the controller's mutex, so that a
// delivery racing with it cannot be overtaken by this older record.
inline void applyCurrentSettings(SettingsController::Observer& observer) {
    SettingsController* controller = SettingsController::getInstance();
    std::lock_guard lock(controller->getMutex());
    observer.onSettingsChanged(controller->getSettingsLocked(observer.getUID()));
}

}  // namespace android::Interpolation
