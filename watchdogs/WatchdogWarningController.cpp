#include "WatchdogWarningController.h"

#include <limits>
#include <memory>

#include <binder/Parcel.h>

#include <ctime>

#include "Log.h"
#include "RollingStatistics.h"
#include "SettingsController.h"

namespace android::Interpolation {

WatchdogWarningController* WatchdogWarningController::mInstance = nullptr;
std::mutex WatchdogWarningController::mInstanceMutex;

namespace {

// One bit per valid code, set where the payload is an int: codes 0, 2 and 4.
constexpr uint32_t INT_PAYLOAD_CODES = 0b10101;
constexpr uint32_t CODE_COUNT = 5;

int64_t wallClockMs() {
    timespec ts{};
    clock_gettime(CLOCK_REALTIME, &ts);
    return int64_t{ts.tv_sec} * 1000 + ts.tv_nsec / 1'000'000;
}

}  // namespace

void WatchdogWarning::writeToParcel(Parcel* parcel) {
    if (parcel == nullptr) return;
    parcel->writeInt32(PARCEL_SIZE);
    parcel->writeInt32(code);
    parcel->writeInt64(timestamp);
    const auto index = static_cast<uint32_t>(code);
    if (index >= CODE_COUNT) {
        ILOG(1, "Invalid WatchdogWarning code %d", static_cast<int>(code));
        parcel->writeInt32(0);
        return;
    }
    const bool intPayload = ((INT_PAYLOAD_CODES >> index) & 1) != 0;
    // A payload of the other type is the caller's mistake. It is converted to the code's type
    // rather than thrown on, which would take the compositor down.
    if (intPayload != std::holds_alternative<int>(value)) {
        ILOG(1, "WatchdogWarning code %d carries a payload of the other type; converting it",
             static_cast<int>(code));
    }
    if (intPayload) {
        parcel->writeInt32(std::visit(
                [](auto v) { return MachineLearning::truncateTo<int32_t>(static_cast<double>(v)); },
                value));
    } else {
        parcel->writeFloat(std::visit([](auto v) { return static_cast<float>(v); }, value));
    }
}

WatchdogWarningController* WatchdogWarningController::getInstance() {
    std::lock_guard lock(mInstanceMutex);
    if (mInstance == nullptr) mInstance = new WatchdogWarningController();
    return mInstance;
}

void WatchdogWarningController::addWarning(unsigned int uid, WarningCode code,
                                           std::variant<int, float> value, bool record) {
    getInstance()->addWarningInstance(uid, code, value, record);
}

void WatchdogWarningController::writeWarningsToParcel(unsigned int uid, Parcel* parcel) {
    getInstance()->writeWarningsToParcelInstance(uid, parcel);
}

void WatchdogWarningController::addWarningInstance(unsigned int uid, WarningCode code,
                                                   std::variant<int, float> value, bool record) {
    std::lock_guard lock(mMutex);
    // The platform delivers the defaults with its next notifyChanges, which switches the game off.
    SettingsController::getInstance()->setSettings(uid, defaultSettings);
    if (!record) return;
    RingBuffer<WatchdogWarning>& warnings =
            mWarnings.try_emplace(uid, WARNINGS_PER_UID).first->second;
    warnings.push({code, wallClockMs(), value});
}

void WatchdogWarningController::writeWarningsToParcelInstance(unsigned int uid, Parcel* parcel) {
    std::lock_guard lock(mMutex);
    if (parcel == nullptr) return;
    auto found = mWarnings.find(uid);
    if (found == mWarnings.end()) return;
    RingBuffer<WatchdogWarning>& warnings = found->second;
    const auto size = static_cast<int32_t>(warnings.size());
    for (int32_t i = -1; i >= -size; i--)
        warnings.at(i).writeToParcel(parcel);
    mWarnings.erase(found);
}

}  // namespace android::Interpolation
