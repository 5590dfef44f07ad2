#include "support/TraceCapture.h"

#include <cutils/trace.h>

#include <atomic>
#include <mutex>

static std::atomic<uint64_t> sEnabledTags{0};
static std::mutex sMutex;
static std::vector<std::string> sEvents;  // guarded by sMutex

static void record(std::string event) {
    std::lock_guard lock(sMutex);
    sEvents.push_back(std::move(event));
}

extern "C" uint64_t atrace_get_enabled_tags() {
    return sEnabledTags.load();
}

extern "C" void atrace_begin_body(const char* name) {
    record(std::string("B|") + name);
}

extern "C" void atrace_end_body() {
    record("E");
}

extern "C" void atrace_int_body(const char* name, int32_t value) {
    record(std::string("C|") + name + "|" + std::to_string(value));
}

namespace android::test {

TraceCapture::TraceCapture() {
    sEnabledTags.store(ATRACE_TAG_GRAPHICS);
    std::lock_guard lock(sMutex);
    sEvents.clear();
}

TraceCapture::~TraceCapture() {
    sEnabledTags.store(0);
}

std::vector<std::string> TraceCapture::events() const {
    std::lock_guard lock(sMutex);
    return sEvents;
}

}  // namespace android::test
