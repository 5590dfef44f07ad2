#include "sim/CsvWriter.h"

#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstring>
#include <fstream>

namespace verolux::sim {

namespace {

constexpr size_t ITEM_COLUMNS = 2;

std::string decimal(double value) {
    char text[32];
    snprintf(text, sizeof(text), "%.3f", value);
    return text;
}

// The shortest text that reads back as the same float: alphas stay exact.
std::string shortest(float value) {
    char text[32];
    const auto [end, ec] = std::to_chars(text, text + sizeof(text), value);
    return ec == std::errc() ? std::string(text, end) : decimal(value);
}

std::string time(nsecs_t time, nsecs_t origin) {
    return time >= 0 ? std::to_string(time - origin) : "";
}

}  // namespace

void writeRefreshCsv(const Recording& recording, std::ostream& out) {
    const nsecs_t origin = timeOrigin(recording);
    out << "index,vsync_ns,display_time_ns,kind,frame0,alpha0,frame1,alpha1,content_ms,delay_ms,"
           "cpu_us\n";
    for (const RefreshRecord& refresh : recording.refreshes) {
        out << refresh.index << ',' << time(refresh.vsyncTime, origin) << ','
            << time(refresh.displayTime, origin) << ','
            << (refresh.kind != 0 ? std::to_string(refresh.kind) : "");
        for (size_t i = 0; i < ITEM_COLUMNS; i++) {
            if (i < refresh.items.size()) {
                out << ',' << refresh.items[i].frameNumber << ','
                    << shortest(refresh.items[i].alpha);
            } else {
                out << ",,";
            }
        }
        out << ','
            << (refresh.contentTime >= 0 ? decimal((refresh.contentTime - origin) / 1e6) : "")
            << ',' << (refresh.delay >= 0 ? decimal(refresh.delay / 1e6) : "") << ','
            << decimal(refresh.cpuTime / 1e3) << '\n';
    }
}

Status writeRefreshCsvFile(const Recording& recording, const std::string& path) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    if (!out) return {errorLine("cannot write " + path + ": " + strerror(errno))};
    writeRefreshCsv(recording, out);
    out.close();
    if (!out) return {errorLine("cannot write " + path)};
    return {};
}

}  // namespace verolux::sim
