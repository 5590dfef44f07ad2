#pragma once

#include <android/log.h>

#include <atomic>
#include <cstdio>
#include <mutex>
#include <string>

#include "sim/Result.h"

namespace verolux::sim {

// Sends the platform log of this process, where the library writes its diagnostic lines, to a
// file instead of the terminal (where the host's log library shows only warnings and above), and
// counts the lines. One at a time per process: it replaces the log's writer while it lives.
class EngineLog {
public:
    EngineLog() = default;
    ~EngineLog();
    EngineLog(const EngineLog&) = delete;
    EngineLog& operator=(const EngineLog&) = delete;

    Status open(const std::string& path);
    uint64_t lines() const { return mLines.load(); }

private:
    static void write(const __android_logger_data* data, const char* message);

    std::mutex mMutex;
    FILE* mFile = nullptr;  // guarded by mMutex
    std::atomic<uint64_t> mLines{0};
};

}  // namespace verolux::sim
