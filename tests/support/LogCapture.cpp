#include "support/LogCapture.h"

#include <android/log.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <mutex>

#include "Tunables.h"

namespace {

std::mutex sMutex;
bool sCapturing = false;                     // guarded by sMutex
std::vector<android::test::LogLine> sLines;  // guarded by sMutex

}  // namespace

extern "C" int __android_log_print(int priority, const char* tag, const char* format, ...) {
    char text[1024];
    va_list args;
    va_start(args, format);
    vsnprintf(text, sizeof(text), format, args);
    va_end(args);
    std::lock_guard lock(sMutex);
    if (sCapturing) sLines.push_back({priority, tag != nullptr ? tag : "", text});
    return 1;
}

namespace android::test {

LogCapture::LogCapture(int level) : mPreviousLevel(Interpolation::logLevel.exchange(level)) {
    std::lock_guard lock(sMutex);
    sLines.clear();
    sCapturing = true;
}

LogCapture::~LogCapture() {
    Interpolation::logLevel.store(mPreviousLevel);
    std::lock_guard lock(sMutex);
    sCapturing = false;
    sLines.clear();
}

std::vector<LogLine> LogCapture::lines() const {
    std::lock_guard lock(sMutex);
    return sLines;
}

std::vector<std::string> LogCapture::texts() const {
    std::lock_guard lock(sMutex);
    std::vector<std::string> texts;
    for (const LogLine& line : sLines)
        texts.push_back(line.text);
    return texts;
}

int LogCapture::count(const std::string& text) const {
    std::lock_guard lock(sMutex);
    return static_cast<int>(std::count_if(sLines.begin(), sLines.end(),
                                          [&](const LogLine& line) { return line.text == text; }));
}

void LogCapture::clear() {
    std::lock_guard lock(sMutex);
    sLines.clear();
}

}  // namespace android::test
