#include "sim/Capture.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <fstream>
#include <map>
#include <sstream>

#include "sim/TextNumbers.h"

namespace verolux::sim {

namespace {

constexpr nsecs_t MAX_CAPTURE_NS = 24LL * 3600 * 1000000000;
constexpr double NS_PER_MS = 1e6;
// Blank lines are skipped, but not without end (a pipe of newlines is not a capture).
constexpr size_t MAX_LINES_PER_FRAME = 2;

// Reads one line without keeping more than `limit` + 1 characters of it: a longer line comes back
// that long, so that the caller can refuse it without the rest being read. False at the end.
bool readLine(std::istream& in, std::string& line, size_t limit) {
    line.clear();
    std::streambuf* buffer = in.rdbuf();
    if (buffer == nullptr) return false;
    for (int c = buffer->sbumpc(); c != std::char_traits<char>::eof(); c = buffer->sbumpc()) {
        if (c == '\n') return true;
        line.push_back(static_cast<char>(c));
        if (line.size() > limit) return true;
    }
    in.setstate(std::ios::eofbit);
    return !line.empty();
}

class CaptureParser {
public:
    CaptureParser(const std::string& name, size_t maxFrames) : mName(name), mMaxFrames(maxFrames) {}

    // Each returns the error line, or an empty string.
    std::string header(std::string_view line);
    std::string row(std::string_view line);
    std::string finish(Capture& capture);

    std::string at(size_t line, std::string_view message) const {
        return errorLine(mName + ":" + std::to_string(line) + ": " + std::string(message));
    }
    void nextLine() { mLine++; }
    size_t line() const { return mLine; }

private:
    struct Row {
        size_t line;
        size_t swapChain;
        CaptureFrame frame;
    };

    std::optional<size_t> column(std::string_view name) const;
    std::string nanoseconds(std::string_view column, std::string_view cell, nsecs_t& out) const;
    std::string milliseconds(std::string_view column, std::string_view cell,
                             std::optional<double>& out) const;
    std::string presentMonRow(const std::vector<std::string_view>& cells, Row& row);

    const std::string& mName;
    const size_t mMaxFrames;
    size_t mLine = 0;
    bool mPresentMon = false;
    std::vector<std::string> mColumns;
    std::optional<size_t> mQueueColumn;       // queue_ns or TimeInSeconds
    std::optional<size_t> mRenderDoneColumn;  // render_done_ns or MsUntilRenderComplete
    std::optional<size_t> mBetweenColumn;     // MsBetweenPresents
    std::vector<size_t> mSwapChainColumns;
    std::map<std::string, size_t> mSwapChains;  // key to index
    double mPresentSum = 0;                     // seconds, when only MsBetweenPresents is given
    std::vector<Row> mRows;
};

std::optional<size_t> CaptureParser::column(std::string_view name) const {
    for (size_t i = 0; i < mColumns.size(); i++) {
        if (mColumns[i] == name) return i;
    }
    return std::nullopt;
}

std::string CaptureParser::header(std::string_view line) {
    const auto cells = splitAtCommas(line);
    for (size_t i = 0; i < cells.size(); i++) {
        for (size_t j = 0; j < i; j++) {
            if (cells[j] == cells[i])
                return at(mLine, "column " + quoted(cells[i]) + " appears twice");
        }
        mColumns.emplace_back(cells[i]);
    }
    mBetweenColumn = column("MsBetweenPresents");
    mPresentMon = mBetweenColumn.has_value();
    if (!mPresentMon) {
        mQueueColumn = column("queue_ns");
        mRenderDoneColumn = column("render_done_ns");
        if (!mQueueColumn) {
            return at(mLine,
                      "the header names neither queue_ns nor PresentMon's MsBetweenPresents");
        }
        return {};
    }
    mQueueColumn = column("TimeInSeconds");
    mRenderDoneColumn = column("MsUntilRenderComplete");
    for (const char* key : {"Application", "ProcessID", "SwapChainAddress"}) {
        if (const auto index = column(key)) mSwapChainColumns.push_back(*index);
    }
    return {};
}

std::string CaptureParser::nanoseconds(std::string_view column, std::string_view cell,
                                       nsecs_t& out) const {
    const auto value = parseInteger(cell);
    if (!value) return at(mLine, std::string(column) + " is not a number");
    if (*value < 0 || *value > MAX_CAPTURE_NS) {
        return at(mLine, std::string(column) + " is out of range (0 to 24 hours in nanoseconds)");
    }
    out = *value;
    return {};
}

std::string CaptureParser::milliseconds(std::string_view column, std::string_view cell,
                                        std::optional<double>& out) const {
    out.reset();
    if (cell.empty() || cell == "NA") return {};
    const auto value = parseNumber(cell);
    if (!value) return at(mLine, std::string(column) + " is not a number");
    if (*value < 0 || *value > MAX_CAPTURE_NS / NS_PER_MS) {
        return at(mLine, std::string(column) + " is out of range (0 to 24 hours)");
    }
    out = *value;
    return {};
}

std::string CaptureParser::presentMonRow(const std::vector<std::string_view>& cells, Row& row) {
    std::optional<double> between;
    if (std::string error = milliseconds("MsBetweenPresents", cells[*mBetweenColumn], between);
        !error.empty()) {
        return error;
    }
    double seconds = 0;
    if (mQueueColumn) {
        std::optional<double> ms;
        if (std::string error = milliseconds("TimeInSeconds", cells[*mQueueColumn], ms);
            !error.empty()) {
            return error;
        }
        if (!ms) return at(mLine, "TimeInSeconds is empty");
        seconds = *ms;  // same range check, in seconds
    } else {
        mPresentSum += between.value_or(0) / 1e3;
        seconds = mPresentSum;
    }
    if (seconds * 1e9 > static_cast<double>(MAX_CAPTURE_NS)) {
        return at(mLine, "TimeInSeconds is out of range (0 to 24 hours)");
    }
    row.frame.queueTime = std::llround(seconds * 1e9);
    if (mRenderDoneColumn) {
        std::optional<double> render;
        if (std::string error =
                    milliseconds("MsUntilRenderComplete", cells[*mRenderDoneColumn], render);
            !error.empty()) {
            return error;
        }
        if (render)
            row.frame.renderDoneTime = row.frame.queueTime + std::llround(*render * NS_PER_MS);
    }
    std::string key;
    for (size_t index : mSwapChainColumns)
        key.append(cells[index]).push_back(',');
    row.swapChain = mSwapChains.emplace(key, mSwapChains.size()).first->second;
    return {};
}

std::string CaptureParser::row(std::string_view line) {
    const auto cells = splitAtCommas(line);
    if (cells.size() != mColumns.size()) {
        return at(mLine, "expected " + std::to_string(mColumns.size()) + " cells, found " +
                                 std::to_string(cells.size()));
    }
    if (mRows.size() == mMaxFrames)
        return at(mLine, "more than " + std::to_string(mMaxFrames) + " frames");
    Row row{mLine, 0, {}};
    if (mPresentMon) {
        if (std::string error = presentMonRow(cells, row); !error.empty()) return error;
        mRows.push_back(row);
        return {};
    }
    if (cells[*mQueueColumn].empty()) return at(mLine, "queue_ns is empty");
    if (std::string error = nanoseconds("queue_ns", cells[*mQueueColumn], row.frame.queueTime);
        !error.empty()) {
        return error;
    }
    if (mRenderDoneColumn && !cells[*mRenderDoneColumn].empty()) {
        if (std::string error = nanoseconds("render_done_ns", cells[*mRenderDoneColumn],
                                            row.frame.renderDoneTime);
            !error.empty()) {
            return error;
        }
        if (row.frame.renderDoneTime < row.frame.queueTime) {
            return at(mLine, "render_done_ns is earlier than queue_ns");
        }
    }
    mRows.push_back(row);
    return {};
}

std::string CaptureParser::finish(Capture& capture) {
    capture.format = mPresentMon ? "PresentMon" : "frames";
    // The game's swap chain is the one that presented most.
    std::vector<size_t> presents(std::max<size_t>(1, mSwapChains.size()), 0);
    for (const Row& row : mRows)
        presents[row.swapChain]++;
    const size_t game = std::max_element(presents.begin(), presents.end()) - presents.begin();
    const char* queueName = mPresentMon ? "TimeInSeconds" : "queue_ns";
    for (const Row& row : mRows) {
        if (row.swapChain != game) continue;
        if (!capture.frames.empty() && row.frame.queueTime < capture.frames.back().queueTime) {
            return at(row.line, std::string(queueName) + " is earlier than the previous frame's");
        }
        capture.frames.push_back(row.frame);
    }
    if (capture.frames.empty()) return errorLine(mName + ": no frames after the header");
    const nsecs_t first = capture.frames.front().queueTime;
    for (CaptureFrame& frame : capture.frames) {
        frame.queueTime -= first;
        if (frame.renderDoneTime >= 0) frame.renderDoneTime -= first;
    }
    return {};
}

}  // namespace

nsecs_t Capture::meanInterval() const {
    if (frames.size() < 2 || span() <= 0) return 1'000'000'000;
    // Frames closer than a nanosecond apart on average still give a finite rate.
    return std::max<nsecs_t>(1, span() / static_cast<nsecs_t>(frames.size() - 1));
}

double Capture::fpsOverFirst(size_t count) const {
    if (count < 2 || count >= frames.size()) return fps();
    const nsecs_t span = frames[count - 1].queueTime - frames.front().queueTime;
    return span > 0 ? 1e9 * static_cast<double>(count - 1) / static_cast<double>(span) : fps();
}

Result<Capture> parseCapture(std::istream& in, const std::string& name, size_t maxFrames) {
    using R = Result<Capture>;
    CaptureParser parser(name, maxFrames);
    std::string line;
    bool haveHeader = false;
    while (readLine(in, line, MAX_LINE_CHARS)) {
        parser.nextLine();
        if (line.size() > MAX_LINE_CHARS) {
            return R::failure(parser.at(
                    parser.line(),
                    "line is longer than " + std::to_string(MAX_LINE_CHARS) + " characters"));
        }
        if (parser.line() > MAX_LINES_PER_FRAME * maxFrames + 1) {
            return R::failure(parser.at(parser.line(), "too many lines for a capture"));
        }
        std::string_view text = line;
        if (!text.empty() && text.back() == '\r') text.remove_suffix(1);
        if (!haveHeader) {
            constexpr std::string_view BOM = "\xEF\xBB\xBF";
            if (text.substr(0, BOM.size()) == BOM) text.remove_prefix(BOM.size());
            if (std::string error = parser.header(text); !error.empty()) return R::failure(error);
            haveHeader = true;
            continue;
        }
        if (trim(text).empty()) continue;
        if (std::string error = parser.row(text); !error.empty()) return R::failure(error);
    }
    if (in.bad())
        return R::failure(errorLine("cannot read capture " + name + ": " + strerror(errno)));
    if (!haveHeader) {
        return R::failure(errorLine(name + ": empty, expected a header line naming queue_ns"));
    }
    R result;
    if (std::string error = parser.finish(result.value); !error.empty()) return R::failure(error);
    return result;
}

Result<Capture> parseCapture(std::string_view text, const std::string& name, size_t maxFrames) {
    std::istringstream in{std::string(text)};
    return parseCapture(in, name, maxFrames);
}

Result<Capture> readCapture(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    if (!in) {
        return Result<Capture>::failure(
                errorLine("cannot read capture " + path + ": " + strerror(errno)));
    }
    return parseCapture(in, path);
}

}  // namespace verolux::sim
