#include "sim/TraceWriter.h"

#include <json/writer.h>

#include <cinttypes>
#include <cstdarg>
#include <cstdio>

#include "sim/WarningLedger.h"

namespace verolux::sim {

namespace {

constexpr int DISPLAY_TID = 1;
constexpr int GAME_TID = 2;
constexpr int UNKNOWN_SLOT_TID = 9;
constexpr int FIRST_SLOT_TID = 10;
constexpr nsecs_t SECOND = 1'000'000'000;

std::string compactJson(const Json::Value& value) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, value);
}

// Events counted per second of the run, reported when the second is over.
class PerSecond {
public:
    // Returns the seconds that ended before `time`, with their counts, through `report`.
    template <typename Report>
    void add(nsecs_t time, nsecs_t origin, Report report) {
        const nsecs_t second = (time - origin) / SECOND;
        if (mSecond < 0) mSecond = second;
        for (; mSecond < second; mSecond++) {
            report(origin + (mSecond + 1) * SECOND, mCount);
            mCount = 0;
        }
        mCount++;
    }

private:
    nsecs_t mSecond = -1;
    uint64_t mCount = 0;
};

}  // namespace

class TraceWriter::LayerTrace final : public RecordSink {
public:
    LayerTrace(TraceWriter& writer, int pid, nsecs_t refreshPeriod)
        : mWriter(writer), mPid(pid), mRefreshPeriod(refreshPeriod) {}

    void onFrame(const FrameRecord& frame) override;
    void onRefresh(const RefreshRecord& refresh) override;
    void onDelayChange(nsecs_t time, nsecs_t delay) override {
        counter("display delay", time, "ms", static_cast<double>(delay) / 1e6);
    }

    void emit(const char* format, ...) __attribute__((format(printf, 2, 3)));
    double us(nsecs_t time) const { return static_cast<double>(time - mWriter.mOrigin) / 1e3; }
    void counter(const char* name, nsecs_t time, const char* unit, double value) {
        emit("{\"ph\":\"C\",\"name\":\"%s\",\"pid\":%d,\"ts\":%.3f,\"args\":{\"%s\":%.3f}}", name,
             mPid, us(time), unit, value);
    }
    void nameThread(int tid, const std::string& name) {
        emit("{\"ph\":\"M\",\"name\":\"thread_name\",\"pid\":%d,\"tid\":%d,\"args\":{\"name\":%s}}",
             mPid, tid, compactJson(name).c_str());
        emit("{\"ph\":\"M\",\"name\":\"thread_sort_index\",\"pid\":%d,\"tid\":%d,\"args\":{"
             "\"sort_index\":%d}}",
             mPid, tid, tid);
    }

    TraceWriter& mWriter;
    const int mPid;
    const nsecs_t mRefreshPeriod;
    uint64_t mNamedSlots = 0;  // bit per slot below 64 already named
    void onWarning(const WarningRecord& warning) override;

    PerSecond mGameFps;
    PerSecond mDisplayedFps;
    PerSecond mRenderRate;
    int32_t mRefreshRate = -1;    // last written
    int32_t mGameRateLimit = -1;  // last written; 0 when not applied
};

void TraceWriter::LayerTrace::emit(const char* format, ...) {
    char text[768];
    va_list args;
    va_start(args, format);
    vsnprintf(text, sizeof(text), format, args);
    va_end(args);
    std::ostream& out = mWriter.mOut;
    out << ",\n" << text;
}

void TraceWriter::LayerTrace::onRefresh(const RefreshRecord& refresh) {
    std::string frames, alphas, weights;
    for (uint8_t i = 0; i < refresh.itemCount; i++) {
        const char* comma = i == 0 ? "" : ",";
        char item[96];
        snprintf(item, sizeof(item), "%s%" PRIu64, comma, refresh.items[i].frameNumber);
        frames += item;
        snprintf(item, sizeof(item), "%s%.4g", comma, refresh.items[i].alpha);
        alphas += item;
        snprintf(item, sizeof(item), "%s%.4g", comma, refresh.items[i].weight);
        weights += item;
    }
    char content[48] = "null";
    if (refresh.contentTime >= 0) {
        snprintf(content, sizeof(content), "%.3f",
                 (refresh.contentTime - static_cast<double>(mWriter.mOrigin)) / 1e6);
    }
    emit("{\"ph\":\"X\",\"name\":\"%s\",\"cat\":\"display\",\"pid\":%d,\"tid\":%d,\"ts\":%.3f,"
         "\"dur\":%.3f,\"args\":{\"refresh\":%" PRIu64
         ",\"frames\":[%s],\"alphas\":[%s],\"weights\":[%s],\"content_ms\":%s}}",
         pictureName(refresh.picture), mPid, DISPLAY_TID, us(refresh.presentTime),
         static_cast<double>(mRefreshPeriod) / 1e3, refresh.index, frames.c_str(), alphas.c_str(),
         weights.c_str(), content);
    counter("queue length", refresh.vsyncTime, "frames", refresh.queueLength);
    if (refresh.contentTime >= 0) {
        counter("content age", refresh.presentTime, "ms",
                (static_cast<double>(refresh.presentTime) - refresh.contentTime) / 1e6);
    }
    if (refresh.refreshRate != mRefreshRate) {
        mRefreshRate = refresh.refreshRate;
        counter("detected refresh rate", refresh.vsyncTime, "Hz", mRefreshRate);
    }
    const int32_t limit = refresh.gameRateLimitApplied ? refresh.gameRateLimit : 0;
    if (limit != mGameRateLimit) {
        mGameRateLimit = limit;
        counter("game-rate limit", refresh.vsyncTime, "fps", limit);
    }
    if (refresh.refused) {
        emit("{\"ph\":\"i\",\"s\":\"t\",\"name\":\"refused presentation\",\"cat\":\"display\","
             "\"pid\":%d,\"tid\":%d,\"ts\":%.3f,\"args\":{\"refresh\":%" PRIu64 "}}",
             mPid, DISPLAY_TID, us(refresh.vsyncTime), refresh.index);
    } else {
        mRenderRate.add(refresh.vsyncTime, mWriter.mOrigin, [this](nsecs_t end, uint64_t n) {
            counter("render rate", end, "fps", static_cast<double>(n));
        });
    }
    if (refresh.picture == Picture::BLEND || refresh.picture == Picture::NEW) {
        mDisplayedFps.add(refresh.presentTime, mWriter.mOrigin, [this](nsecs_t end, uint64_t n) {
            counter("displayed fps", end, "fps", static_cast<double>(n));
        });
    }
}

void TraceWriter::LayerTrace::onWarning(const WarningRecord& warning) {
    emit("{\"ph\":\"i\",\"s\":\"p\",\"name\":\"watchdog warning\",\"cat\":\"watchdog\","
         "\"pid\":%d,\"tid\":%d,\"ts\":%.3f,\"args\":{\"code\":\"%s\",\"value\":%g}}",
         mPid, DISPLAY_TID, us(warning.time), warningCodeName(warning.code).c_str(), warning.value);
}

void TraceWriter::LayerTrace::onFrame(const FrameRecord& frame) {
    if (frame.startTime >= 0 && frame.dequeueTime > frame.startTime) {
        emit("{\"ph\":\"X\",\"name\":\"wait for buffer\",\"cat\":\"game\",\"pid\":%d,\"tid\":%d,"
             "\"ts\":%.3f,\"dur\":%.3f,\"args\":{\"frame\":%" PRIu64 "}}",
             mPid, GAME_TID, us(frame.startTime), us(frame.dequeueTime) - us(frame.startTime),
             frame.number);
    }
    if (frame.queueTime < 0) return;
    if (frame.dequeueTime >= 0) {
        emit("{\"ph\":\"X\",\"name\":\"draw\",\"cat\":\"game\",\"pid\":%d,\"tid\":%d,\"ts\":%.3f,"
             "\"dur\":%.3f,\"args\":{\"frame\":%" PRIu64 "}}",
             mPid, GAME_TID, us(frame.dequeueTime), us(frame.queueTime) - us(frame.dequeueTime),
             frame.number);
    }
    const bool known = frame.slot >= 0 && frame.slot < 64;
    const int tid = known ? FIRST_SLOT_TID + frame.slot : UNKNOWN_SLOT_TID;
    if (!(known ? (mNamedSlots >> frame.slot) & 1 : (mNamedSlots >> 63) & 1)) {
        nameThread(tid, known ? "slot " + std::to_string(frame.slot) : "slot unknown");
        mNamedSlots |= uint64_t{1} << (known ? frame.slot : 63);
    }
    const nsecs_t end = frame.releaseTime >= frame.queueTime ? frame.releaseTime : frame.queueTime;
    char latency[32] = "null";
    if (!frame.dropped()) {
        snprintf(latency, sizeof(latency), "%.3f",
                 static_cast<double>(frame.firstPresentTime - frame.queueTime) / 1e6);
    }
    emit("{\"ph\":\"X\",\"name\":\"frame %" PRIu64
         "\",\"cat\":\"frame\",\"pid\":%d,\"tid\":%d,"
         "\"ts\":%.3f,\"dur\":%.3f,\"args\":{\"frame\":%" PRIu64
         ",\"dropped\":%s,\"latency_ms\":%s}}",
         frame.number, mPid, tid, us(frame.queueTime), us(end) - us(frame.queueTime), frame.number,
         frame.dropped() ? "true" : "false", latency);
    const std::pair<const char*, nsecs_t> steps[] = {{"render done", frame.renderDoneTime},
                                                     {"acquire", frame.acquireTime},
                                                     {"first present", frame.firstPresentTime}};
    for (const auto& [name, time] : steps) {
        if (time < 0) continue;
        emit("{\"ph\":\"i\",\"s\":\"t\",\"name\":\"%s\",\"cat\":\"frame\",\"pid\":%d,\"tid\":%d,"
             "\"ts\":%.3f,\"args\":{\"frame\":%" PRIu64 "}}",
             name, mPid, tid, us(time), frame.number);
    }
    mGameFps.add(frame.queueTime, mWriter.mOrigin, [this](nsecs_t end, uint64_t n) {
        counter("game fps", end, "fps", static_cast<double>(n));
    });
}

TraceWriter::TraceWriter(std::ostream& out, nsecs_t origin, const Json::Value& options)
    : mOut(out), mOrigin(origin) {
    mOut << "{\"displayTimeUnit\":\"ms\",\"metadata\":" << compactJson(options)
         << ",\"traceEvents\":[\n"
         << R"({"ph":"M","name":"process_name","pid":0,"args":{"name":"verolux-sim"}})";
}

TraceWriter::~TraceWriter() {
    finish();
}

RecordSink& TraceWriter::addLayer(int pid, const std::string& title, nsecs_t refreshPeriod) {
    auto& layer = mLayers.emplace_back(std::make_unique<LayerTrace>(*this, pid, refreshPeriod));
    layer->emit("{\"ph\":\"M\",\"name\":\"process_name\",\"pid\":%d,\"args\":{\"name\":%s}}", pid,
                compactJson(title).c_str());
    layer->emit(
            "{\"ph\":\"M\",\"name\":\"process_sort_index\",\"pid\":%d,\"args\":{"
            "\"sort_index\":%d}}",
            pid, pid);
    layer->nameThread(DISPLAY_TID, "display");
    layer->nameThread(GAME_TID, "game");
    return *layer;
}

void TraceWriter::finish() {
    if (mFinished) return;
    mFinished = true;
    mOut << "\n]}\n";
    mOut.flush();
}

}  // namespace verolux::sim
