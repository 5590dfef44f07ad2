#pragma once

#include <cstdint>
#include <map>
#include <mutex>
#include <variant>

#include "RingBuffer.h"

namespace android {

class Parcel;

namespace Interpolation {

// Why a watchdog switched a game off. The code decides the payload's type: codes 0, 2 and 4 carry
// an int, 1 and 3 a float; 5 and above are invalid.
enum WarningCode : int32_t {
    LOW_GAME_FPS = 0,                // int: the average FPS, truncated
    LATENCY_REDUCTION_UNSTABLE = 1,  // float: the stability
    RESERVED_INT_2 = 2,
    RESERVED_FLOAT_3 = 3,
    HIGH_GAME_FPS = 4,  // int: the average FPS, truncated
};

struct WatchdogWarning {
    // Size in bytes of one record in a parcel: the size word itself, the code, the timestamp and
    // the value.
    static constexpr int32_t PARCEL_SIZE = 20;

    WarningCode code = LOW_GAME_FPS;
    int64_t timestamp = 0;  // wall-clock milliseconds since the epoch
    std::variant<int, float> value;

    // int32 size, int32 code, int64 timestamp, then the value as int32 or float by the code.
    void writeToParcel(Parcel* parcel);
};

// The process-wide record of why the feature was switched off for each game. A warning resets the
// game's settings to the defaults, recorded or not; the recorded ones wait, the newest ten per
// uid, until the settings client fetches them, which delivers each one once.
class WatchdogWarningController {
public:
    static constexpr uint32_t WARNINGS_PER_UID = 10;

    virtual ~WatchdogWarningController() = default;

    static void addWarning(unsigned int uid, WarningCode code, std::variant<int, float> value,
                           bool record);
    // Lock order: this controller's mutex, then the settings controller's.
    void addWarningInstance(unsigned int uid, WarningCode code, std::variant<int, float> value,
                            bool record);

    // Writes the uid's warnings, oldest first, with no count ahead of them, and forgets them. A
    // null parcel leaves them in place.
    static void writeWarningsToParcel(unsigned int uid, Parcel* parcel);
    void writeWarningsToParcelInstance(unsigned int uid, Parcel* parcel);

private:
    WatchdogWarningController() = default;

    // Created on first use and never destroyed.
    static WatchdogWarningController* getInstance();

    std::mutex mMutex;
    std::map<unsigned int, RingBuffer<WatchdogWarning>> mWarnings;  // guarded by mMutex

    static WatchdogWarningController* mInstance;  // guarded by mInstanceMutex
    static std::mutex mInstanceMutex;
};

}  // namespace Interpolation
}  // namespace android
