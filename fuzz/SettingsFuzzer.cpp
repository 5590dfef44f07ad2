// Feeds arbitrary bytes to the two readers of outside input: the settings parcel and the alpha
// curve. Every log line is formatted (logLevel 2) and then dropped, so that logging is bounded by
// the input too.

#include <limits>
#include <memory>

#include <android/log.h>
#include <binder/Parcel.h>
#include <utils/String8.h>

#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <vector>

#include "Function.h"
#include "SettingsController.h"
#include "Tunables.h"

extern "C" int __android_log_print(int /*priority*/, const char* /*tag*/, const char* format, ...) {
    char text[1024];
    va_list args;
    va_start(args, format);
    vsnprintf(text, sizeof(text), format, args);
    va_end(args);
    return 1;
}

namespace {

using android::Parcel;
using android::String8;
using namespace android::Interpolation;

constexpr unsigned int GAME_UID = 10001;

void fuzzSettings(const uint8_t* data, size_t size, unsigned int uid) {
    Parcel in;
    in.setData(data, size);
    SettingsController* controller = SettingsController::getInstance();
    controller->updateSettings(uid, in);

    Parcel out;
    controller->writeSettings(uid, &out);
    String8 policy;
    controller->settingsToPolicy(uid, policy);
    std::lock_guard lock(controller->getMutex());
    controller->getSettingsLocked(uid).dump();
}

void fuzzFunction(const uint8_t* data, size_t size, bool bound) {
    std::vector<float> values(size / sizeof(float));
    if (!values.empty()) memcpy(values.data(), data, values.size() * sizeof(float));
    const Function function(values, bound);
    for (float x : {-1.0f, 0.0f, 0.1f, 0.5f, 1.0f, 2.0f})
        function.getY(x);
    for (float x : values)
        function.getY(x);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    logLevel.store(2);
    if (size == 0) return 0;
    // The first byte picks the uid (0 is the tunables-only one) and the curve's bound flag.
    const uint8_t selector = data[0];
    fuzzSettings(data + 1, size - 1, (selector & 1) != 0 ? 0 : GAME_UID);
    fuzzFunction(data + 1, size - 1, (selector & 2) != 0);
    return 0;
}
