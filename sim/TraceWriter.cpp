#include "sim/TraceWriter.h"

#include <json/writer.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fstream>
#include <memory>

#include "EventDispatcher.h"

namespace verolux::sim {

using namespace android::Interpolation;

namespace {

constexpr int RUN_PID = 1;
constexpr int REFERENCE_PID = 2;
constexpr int DISPLAY_TID = 1;
constexpr int COMPOSITION_TID = 2;
constexpr int UNKNOWN_SLOT_TID = 9;
constexpr int FIRST_SLOT_TID = 10;

// Appends the events of one recording to the trace's event array.
class ProcessTrace {
public:
    ProcessTrace(const Recording& recording, int pid, Json::Value& events)
        : mRecording(recording), mPid(pid), mOrigin(timeOrigin(recording)), mEvents(events) {}

    void write(const std::string& title);

private:
    // Times passed here are >= 0, as is the origin, so the difference cannot overflow.
    double us(nsecs_t time) const { return (time - mOrigin) / 1e3; }
    Json::Value& event(const char* ph, const std::string& name, const char* cat, int tid,
                       nsecs_t time);
    void metadata(const char* name, int tid, const Json::Value& args);
    void nameThread(int tid, const std::string& name, int sortIndex);
    void writeRefreshes();
    void writeFrame(const FrameRecord& frame);
    void writeDelays();
    nsecs_t endTime() const;

    const Recording& mRecording;
    const int mPid;
    const nsecs_t mOrigin;
    Json::Value& mEvents;
};

Json::Value& ProcessTrace::event(const char* ph, const std::string& name, const char* cat, int tid,
                                 nsecs_t time) {
    Json::Value e(Json::objectValue);
    e["ph"] = ph;
    e["name"] = name;
    e["cat"] = cat;
    e["pid"] = mPid;
    e["tid"] = tid;
    e["ts"] = us(time);
    return mEvents.append(std::move(e));
}

void ProcessTrace::metadata(const char* name, int tid, const Json::Value& args) {
    Json::Value e(Json::objectValue);
    e["ph"] = "M";
    e["name"] = name;
    e["pid"] = mPid;
    e["tid"] = tid;
    e["args"] = args;
    mEvents.append(std::move(e));
}

void ProcessTrace::nameThread(int tid, const std::string& name, int sortIndex) {
    Json::Value args(Json::objectValue);
    args["name"] = name;
    metadata("thread_name", tid, args);
    Json::Value sort(Json::objectValue);
    sort["sort_index"] = sortIndex;
    metadata("thread_sort_index", tid, sort);
}

nsecs_t ProcessTrace::endTime() const {
    if (mRecording.endTime >= 0) return mRecording.endTime;
    nsecs_t end = mOrigin;
    for (const RefreshRecord& refresh : mRecording.refreshes)
        end = std::max(end, refresh.vsyncTime);
    return end;
}

std::string stateName(const RefreshRecord& refresh) {
    std::string frames;
    for (const ComposedItem& item : refresh.items) {
        if (!frames.empty()) frames += '+';
        frames += std::to_string(item.frameNumber);
    }
    switch (refresh.kind) {
        case eBlendedCompositionEvent:
            return "blend " + frames;
        case eRepeatedCompositionEvent:
            return "repeat " + frames;
        case eNewFrameCompositionEvent:
            return "new " + frames;
        default:
            return frames.empty() ? "no state" : "state " + frames;
    }
}

void ProcessTrace::writeRefreshes() {
    const auto& refreshes = mRecording.refreshes;
    for (size_t i = 0; i < refreshes.size(); i++) {
        const RefreshRecord& refresh = refreshes[i];
        if (refresh.vsyncTime < 0) continue;
        Json::Value& vsync = event("i", "vsync", "display", DISPLAY_TID, refresh.vsyncTime);
        vsync["s"] = "t";
        vsync["args"]["index"] = Json::UInt64(refresh.index);

        // Until the next vsync; the last refresh lasts one period.
        double durationUs = mRecording.refreshPeriod / 1e3;
        if (i + 1 < refreshes.size() && refreshes[i + 1].vsyncTime >= 0) {
            durationUs = us(refreshes[i + 1].vsyncTime) - us(refresh.vsyncTime);
        }
        Json::Value& state =
                event("X", stateName(refresh), "composition", COMPOSITION_TID, refresh.vsyncTime);
        state["dur"] = std::max(0.0, durationUs);
        Json::Value& args = state["args"];
        args["index"] = Json::UInt64(refresh.index);
        args["kind"] = refresh.kind;
        args["frames"] = Json::Value(Json::arrayValue);
        args["alphas"] = Json::Value(Json::arrayValue);
        args["weights"] = Json::Value(Json::arrayValue);
        for (const ComposedItem& item : refresh.items) {
            args["frames"].append(Json::UInt64(item.frameNumber));
            args["alphas"].append(item.alpha);
            args["weights"].append(item.weight);
        }
        if (refresh.contentTime >= 0) args["content_ms"] = (refresh.contentTime - mOrigin) / 1e6;
        if (refresh.displayTime >= 0)
            args["display_time_ms"] = (refresh.displayTime - mOrigin) / 1e6;
    }
}

void ProcessTrace::writeFrame(const FrameRecord& frame) {
    if (frame.queueTime < 0) return;
    const std::string name = "frame " + std::to_string(frame.number);
    const bool released = frame.releaseTime >= 0;
    const nsecs_t end = std::max(frame.queueTime, released ? frame.releaseTime : endTime());
    const bool slotted = frame.slot >= 0;
    const int tid = slotted ? FIRST_SLOT_TID + frame.slot : UNKNOWN_SLOT_TID;

    Json::Value args(Json::objectValue);
    args["frame"] = Json::UInt64(frame.number);
    args["slot"] = frame.slot;
    args["released"] = released;
    if (frame.renderDoneTime >= 0)
        args["render_ms"] = (frame.renderDoneTime - frame.queueTime) / 1e6;
    if (frame.firstDisplayTime >= 0) {
        args["latency_ms"] = (frame.firstDisplayTime - frame.queueTime) / 1e6;
    }

    const Json::UInt64 id = frame.number;
    if (slotted) {
        Json::Value& slice = event("X", name, "frame", tid, frame.queueTime);
        slice["dur"] = us(end) - us(frame.queueTime);
        slice["args"] = args;
    } else {
        Json::Value& begin = event("b", name, "frame", tid, frame.queueTime);
        begin["id"] = id;
        begin["args"] = args;
        event("e", name, "frame", tid, end)["id"] = id;
    }
    const std::pair<const char*, nsecs_t> steps[] = {{"render done", frame.renderDoneTime},
                                                     {"acquire", frame.acquireTime},
                                                     {"first display", frame.firstDisplayTime}};
    for (const auto& [stepName, time] : steps) {
        if (time < 0) continue;
        Json::Value& step = event(slotted ? "i" : "n", stepName, "frame", tid, time);
        if (slotted) {
            step["s"] = "t";
        } else {
            step["id"] = id;
        }
        step["args"]["frame"] = Json::UInt64(frame.number);
    }
}

void ProcessTrace::writeDelays() {
    for (const DelayChange& change : mRecording.delayChanges) {
        if (change.time < 0) continue;
        event("C", "display delay", "delay", DISPLAY_TID, change.time)["args"]["ms"] =
                change.delay / 1e6;
    }
}

void ProcessTrace::write(const std::string& title) {
    Json::Value name(Json::objectValue);
    name["name"] = title;
    metadata("process_name", 0, name);
    Json::Value sort(Json::objectValue);
    sort["sort_index"] = mPid;
    metadata("process_sort_index", 0, sort);

    nameThread(DISPLAY_TID, "display", 0);
    nameThread(COMPOSITION_TID, "composition", 1);
    std::vector<int> slots;
    for (const FrameRecord& frame : mRecording.frames) {
        if (frame.queueTime >= 0) slots.push_back(frame.slot);
    }
    std::sort(slots.begin(), slots.end());
    slots.erase(std::unique(slots.begin(), slots.end()), slots.end());
    for (int slot : slots) {
        if (slot >= 0) {
            nameThread(FIRST_SLOT_TID + slot, "slot " + std::to_string(slot), 2 + slot);
        } else {
            nameThread(UNKNOWN_SLOT_TID, "frames without a slot", 2);
        }
    }

    writeRefreshes();
    for (const FrameRecord& frame : mRecording.frames)
        writeFrame(frame);
    writeDelays();
}

std::string title(const char* role, const Recording& recording) {
    std::string text = std::string(role) + ": mode " + std::to_string(recording.mode);
    if (!recording.layerName.empty()) text += " " + recording.layerName;
    return text;
}

}  // namespace

Json::Value buildTrace(const Recording& run, const Recording* reference) {
    Json::Value trace(Json::objectValue);
    Json::Value& events = trace["traceEvents"] = Json::Value(Json::arrayValue);
    ProcessTrace(run, RUN_PID, events).write(title("run", run));
    if (reference != nullptr) {
        ProcessTrace(*reference, REFERENCE_PID, events).write(title("reference", *reference));
    }
    trace["displayTimeUnit"] = "ms";
    return trace;
}

Status writeTraceFile(const std::string& path, const Recording& run, const Recording* reference) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    if (!out) return {errorLine("cannot write " + path + ": " + strerror(errno))};
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    // Microseconds to the nanosecond.
    builder["precision"] = 3;
    builder["precisionType"] = "decimal";
    const std::unique_ptr<Json::StreamWriter> writer(builder.newStreamWriter());
    writer->write(buildTrace(run, reference), &out);
    out << '\n';
    out.close();
    if (!out) return {errorLine("cannot write " + path)};
    return {};
}

}  // namespace verolux::sim
