#include "support/LogCapture.h"

#include <android/log.h>

#include <cstdarg>
#include <cstdio>
#include <mutex>
#include <optional>

#include "Tunables.h"

static std::mutex sMutex;
static std::optional<std::vector<android::test::LogLine>> sLines;  // guarded by sMutex

extern "C" int __android_log_print(int priority, const char* tag, const char* format, ...) {
    char text[1024];
    va_list args;
    va_start(args, format);
    vsnprintf(text, sizeof(text), format, args);
    va_end(args);
    std::lock_guard lock(sMutex);
    if (sLines) sLines->push_back({priority, tag != nullptr ? tag : "", text});
    return 1;
}

namespace android::test {

LogCapture::LogCapture(int level) : mPreviousLevel(Interpolation::logLevel.exchange(level)) {
    clear();
}

LogCapture::~LogCapture() {
    Interpolation::logLevel.store(mPreviousLevel);
    std::lock_guard lock(sMutex);
    sLines.reset();
}

std::vector<LogLine> LogCapture::lines() const {
    std::lock_guard lock(sMutex);
    return sLines.value_or(std::vector<LogLine>());
}

void LogCapture::clear() {
    std::lock_guard lock(sMutex);
    sLines.emplace();
}

}  // namespace android::test
