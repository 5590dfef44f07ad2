#include "sim/TraceWriter.h"

#include <json/writer.h>

#include <cinttypes>
#include <cstdarg>
#include <cstdio>

#include "sim/TextLine.h"
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
    void onWarning(const WarningRecord& warning) override;

    // Metadata, written seldom: printf-style.
    void emit(const char* format, ...) __attribute__((format(printf, 2, 3)));
    void nameThread(int tid, const std::string& name) {
        emit("{\"ph\":\"M\",\"name\":\"thread_name\",\"pid\":%d,\"tid\":%d,\"args\":{\"name\":%s}}",
             mPid, tid, compactJson(name).c_str());
        emit("{\"ph\":\"M\",\"name\":\"thread_sort_index\",\"pid\":%d,\"tid\":%d,\"args\":{"
             "\"sort_index\":%d}}",
             mPid, tid, tid);
    }

private:
    // The start of an event: {"ph":"X","name":"<name>" and the category, process and thread.
    TextLine& begin(char phase, std::string_view name, const char* category, int tid) {
        mLine << "{\"ph\":\"" << phase << "\",\"name\":\"" << name << '"';
        if (category != nullptr) mLine << ",\"cat\":\"" << category << '"';
        mLine << ",\"pid\":" << mPid;
        if (tid >= 0) mLine << ",\"tid\":" << tid;
        return mLine;
    }
    // A time in microseconds from the start of the run, and a duration in microseconds, with
    // three places.
    TextLine& ts(nsecs_t time) {
        return mLine << ",\"ts\":" << ThousandthsOf{time - mWriter.mOrigin};
    }
    TextLine& dur(nsecs_t duration) { return mLine << ",\"dur\":" << ThousandthsOf{duration}; }
    void end() {
        mLine << '}';
        mWriter.mOut << ",\n";
        mLine.writeTo(mWriter.mOut);
    }
    void counter(const char* name, nsecs_t time, const char* unit, double value) {
        begin('C', name, nullptr, -1);
        ts(time);
        mLine << ",\"args\":{\"" << unit << "\":";
        mLine.fixed(value, 3);
        mLine << '}';
        end();
    }
    void frameInstant(const char* name, int tid, nsecs_t time, uint64_t frame) {
        begin('i', name, "frame", tid) << ",\"s\":\"t\"";
        ts(time) << ",\"args\":{\"frame\":" << frame << '}';
        end();
    }

    struct ThousandthsOf {
        int64_t value;
    };
    friend TextLine& operator<<(TextLine& line, ThousandthsOf t) {
        return line.thousandths(t.value);
    }

    TraceWriter& mWriter;
    const int mPid;
    const nsecs_t mRefreshPeriod;
    uint64_t mNamedSlots = 0;  // bit per slot below 64 already named
    TextLine mLine;

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
    begin('X', pictureName(refresh.picture), "display", DISPLAY_TID);
    ts(refresh.presentTime);
    dur(mRefreshPeriod) << ",\"args\":{\"refresh\":" << refresh.index << ",\"frames\":[";
    for (uint8_t i = 0; i < refresh.itemCount; i++)
        (i == 0 ? mLine : mLine << ',') << refresh.items[i].frameNumber;
    mLine << "],\"alphas\":[";
    for (uint8_t i = 0; i < refresh.itemCount; i++)
        (i == 0 ? mLine : mLine << ',').general(refresh.items[i].alpha, 4);
    mLine << "],\"weights\":[";
    for (uint8_t i = 0; i < refresh.itemCount; i++)
        (i == 0 ? mLine : mLine << ',').general(refresh.items[i].weight, 4);
    mLine << "],\"content_ms\":";
    if (refresh.contentTime >= 0) {
        mLine.fixed((refresh.contentTime - static_cast<double>(mWriter.mOrigin)) / 1e6, 3);
    } else {
        mLine << "null";
    }
    mLine << '}';
    end();
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
        begin('i', "refused presentation", "display", DISPLAY_TID) << ",\"s\":\"t\"";
        ts(refresh.vsyncTime) << ",\"args\":{\"refresh\":" << refresh.index << '}';
        end();
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
    begin('i', "watchdog warning", "watchdog", DISPLAY_TID) << ",\"s\":\"p\"";
    ts(warning.time) << ",\"args\":{\"code\":\"" << warningCodeName(warning.code) << "\",\"value\":";
    mLine.general(warning.value, 6) << '}';
    end();
}

void TraceWriter::LayerTrace::onFrame(const FrameRecord& frame) {
    if (frame.startTime >= 0 && frame.dequeueTime > frame.startTime) {
        begin('X', "wait for buffer", "game", GAME_TID);
        ts(frame.startTime);
        dur(frame.dequeueTime - frame.startTime) << ",\"args\":{\"frame\":" << frame.number << '}';
        end();
    }
    if (frame.queueTime < 0) return;
    if (frame.dequeueTime >= 0) {
        begin('X', "draw", "game", GAME_TID);
        ts(frame.dequeueTime);
        dur(frame.queueTime - frame.dequeueTime) << ",\"args\":{\"frame\":" << frame.number << '}';
        end();
    }
    const bool known = frame.slot >= 0 && frame.slot < 64;
    const int tid = known ? FIRST_SLOT_TID + frame.slot : UNKNOWN_SLOT_TID;
    if (!(known ? (mNamedSlots >> frame.slot) & 1 : (mNamedSlots >> 63) & 1)) {
        nameThread(tid, known ? "slot " + std::to_string(frame.slot) : "slot unknown");
        mNamedSlots |= uint64_t{1} << (known ? frame.slot : 63);
    }
    const nsecs_t end = frame.releaseTime >= frame.queueTime ? frame.releaseTime : frame.queueTime;
    mLine << "{\"ph\":\"X\",\"name\":\"frame " << frame.number
          << "\",\"cat\":\"frame\",\"pid\":" << mPid << ",\"tid\":" << tid;
    ts(frame.queueTime);
    dur(end - frame.queueTime) << ",\"args\":{\"frame\":" << frame.number
                               << ",\"dropped\":" << (frame.dropped() ? "true" : "false")
                               << ",\"latency_ms\":";
    if (frame.dropped()) {
        mLine << "null";
    } else {
        mLine.fixed(static_cast<double>(frame.firstPresentTime - frame.queueTime) / 1e6, 3);
    }
    mLine << '}';
    this->end();
    if (frame.renderDoneTime >= 0)
        frameInstant("render done", tid, frame.renderDoneTime, frame.number);
    if (frame.acquireTime >= 0) frameInstant("acquire", tid, frame.acquireTime, frame.number);
    if (frame.firstPresentTime >= 0) {
        frameInstant("first present", tid, frame.firstPresentTime, frame.number);
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
