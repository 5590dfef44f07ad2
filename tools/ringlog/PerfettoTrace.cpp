#include "tools/ringlog/PerfettoTrace.h"

#include <json/writer.h>

#include <array>
#include <string>

#include "tools/ringlog/RecordKinds.h"
#include "tools/ringlog/RinglogReport.h"

namespace verolux::ringlog {

namespace {

using android::Interpolation::SerializableEvent;

constexpr int64_t NS_PER_US = 1000;
constexpr int TRACK_COUNT = static_cast<int>(Track::eOther) + 1;

// The trace-event array, written one event at a time.
class TraceStream {
public:
    explicit TraceStream(std::ostream& out) : mOut(out) {
        mOut << "{\"displayTimeUnit\":\"ms\",\"traceEvents\":[";
    }

    // Starts an event with the fields every event has; the caller adds the rest and closes it.
    std::ostream& begin(const char* ph, const std::string& name, int pid, int tid) {
        mOut << (mEvents++ == 0 ? "\n" : ",\n") << "{\"ph\":\"" << ph
             << "\",\"name\":" << Json::valueToQuotedString(name.c_str()) << ",\"pid\":" << pid
             << ",\"tid\":" << tid;
        return mOut;
    }

    size_t finish() {
        mOut << "\n]}\n";
        return mEvents;
    }

private:
    std::ostream& mOut;
    size_t mEvents = 0;
};

void writeMetadata(TraceStream& trace, const char* name, int pid, int tid,
                   const std::string& value) {
    trace.begin("M", name, pid, tid)
            << ",\"args\":{\"name\":" << Json::valueToQuotedString(value.c_str()) << "}}";
}

void writeRecord(TraceStream& trace, const SerializableEvent& record, int pid) {
    const RecordKind& kind = recordKind(record.type);
    const std::string ts = formatFixed(record.time, NS_PER_US, 3);
    if (kind.track == Track::eCounter) {
        trace.begin("C", kind.traceName, pid, 0)
                << ",\"ts\":" << ts << ",\"args\":{" << Json::valueToQuotedString(kind.valueName)
                << ":" << record.value << "}}";
        return;
    }
    std::ostream& out = trace.begin("i", kind.traceName, pid, static_cast<int>(kind.track));
    out << ",\"s\":\"t\",\"cat\":\"ringlog\",\"ts\":" << ts << ",\"args\":{";
    if (kind.track == Track::eOther)
        out << "\"type\":" << static_cast<uint32_t>(record.type) << ",";
    out << Json::valueToQuotedString(kind.valueName) << ":" << record.value << "}}";
}

void writeLayer(TraceStream& trace, const RinglogDump& dump, int pid) {
    writeMetadata(
            trace, "process_name", pid, 0,
            printable(dump.header.layerName) + " (uid " + std::to_string(dump.header.uid) + ")");
    // Threads only for the tracks this layer uses, so that the UI shows no empty rows.
    std::array<bool, TRACK_COUNT> used{};
    for (const SerializableEvent& record : dump.records)
        used[static_cast<size_t>(recordKind(record.type).track)] = true;
    for (int track = 1; track < TRACK_COUNT; track++) {
        if (used[track]) {
            writeMetadata(trace, "thread_name", pid, track, trackName(static_cast<Track>(track)));
        }
    }
    for (const SerializableEvent& record : dump.records)
        writeRecord(trace, record, pid);
}

}  // namespace

size_t writePerfettoTrace(const std::vector<RinglogDump>& dumps, std::ostream& out) {
    TraceStream trace(out);
    for (size_t i = 0; i < dumps.size(); i++)
        writeLayer(trace, dumps[i], static_cast<int>(i) + 1);
    return trace.finish();
}

}  // namespace verolux::ringlog
