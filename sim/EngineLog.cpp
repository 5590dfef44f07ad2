#include "sim/EngineLog.h"

#include <android/log.h>
#include <time.h>

#include <cerrno>
#include <cstring>

namespace verolux::sim {

namespace {

std::atomic<EngineLog*> sOpenLog{nullptr};

char priorityLetter(int priority) {
    static constexpr char LETTERS[] = "??VDIWEF";
    return priority >= 0 && priority < 8 ? LETTERS[priority] : '?';
}

}  // namespace

EngineLog::~EngineLog() {
    EngineLog* self = this;
    if (sOpenLog.compare_exchange_strong(self, nullptr)) {
        __android_log_set_logger(__android_log_stderr_logger);
    }
    std::lock_guard lock(mMutex);
    if (mFile != nullptr) fclose(mFile);
}

Status EngineLog::open(const std::string& path) {
    {
        std::lock_guard lock(mMutex);
        mFile = fopen(path.c_str(), "w");
        if (mFile == nullptr) return {errorLine("cannot write " + path + ": " + strerror(errno))};
    }
    sOpenLog = this;
    // The library's lines are at debug priority; its logLevel setting decides which it writes.
    __android_log_set_minimum_priority(ANDROID_LOG_VERBOSE);
    __android_log_set_logger(&EngineLog::write);
    return {};
}

void EngineLog::write(const __android_logger_data* data, const char* message) {
    EngineLog* log = sOpenLog.load();
    if (log == nullptr) return;
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    std::lock_guard lock(log->mMutex);
    if (log->mFile == nullptr) return;
    fprintf(log->mFile, "%ld.%06ld %c %s%s%s\n", static_cast<long>(now.tv_sec), now.tv_nsec / 1000,
            priorityLetter(data->priority), data->tag != nullptr ? data->tag : "",
            data->tag != nullptr && data->tag[0] != '\0' ? ": " : "", message);
    log->mLines++;
}

}  // namespace verolux::sim
