#include "sim/Capture.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <optional>

#include "sim/TextNumbers.h"

namespace verolux::sim {

namespace {

constexpr nsecs_t MAX_CAPTURE_NS = 24LL * 3600 * 1000000000;
// Real rows are a few dozen characters; a longer line is not a capture row.
constexpr size_t MAX_LINE_CHARS = 4096;

std::vector<std::string_view> splitCells(std::string_view line) {
    std::vector<std::string_view> cells;
    size_t start = 0;
    while (true) {
        const size_t comma = line.find(',', start);
        cells.push_back(trim(line.substr(start, comma - start)));
        if (comma == std::string_view::npos) return cells;
        start = comma + 1;
    }
}

class CaptureParser {
public:
    CaptureParser(const std::string& name, size_t maxFrames) : mName(name), mMaxFrames(maxFrames) {}

    // Each returns the error line, or an empty string.
    std::string header(std::string_view line);
    std::string row(std::string_view line);

    std::string at(std::string_view message) const {
        return errorLine(mName + ":" + std::to_string(mLine) + ": " + std::string(message));
    }
    void nextLine() { mLine++; }
    Capture& capture() { return mCapture; }

private:
    std::string time(std::string_view column, std::string_view cell, nsecs_t& out) const;

    const std::string& mName;
    const size_t mMaxFrames;
    size_t mLine = 0;
    size_t mColumns = 0;
    std::optional<size_t> mQueueColumn;
    std::optional<size_t> mRenderDoneColumn;
    Capture mCapture;
};

std::string CaptureParser::header(std::string_view line) {
    const auto cells = splitCells(line);
    mColumns = cells.size();
    for (size_t i = 0; i < cells.size(); i++) {
        for (size_t j = 0; j < i; j++) {
            if (cells[j] == cells[i]) return at("column " + quoted(cells[i]) + " appears twice");
        }
        if (cells[i] == "queue_ns") mQueueColumn = i;
        if (cells[i] == "render_done_ns") mRenderDoneColumn = i;
    }
    if (!mQueueColumn) return at("the header names no queue_ns column");
    return {};
}

std::string CaptureParser::time(std::string_view column, std::string_view cell, nsecs_t& out) const {
    const auto value = parseInteger(cell);
    if (!value) return at(std::string(column) + " is not a number");
    if (*value < 0 || *value > MAX_CAPTURE_NS) {
        return at(std::string(column) + " is out of range (0 to 24 hours in nanoseconds)");
    }
    out = *value;
    return {};
}

std::string CaptureParser::row(std::string_view line) {
    const auto cells = splitCells(line);
    if (cells.size() != mColumns) {
        return at("expected " + std::to_string(mColumns) + " cells, found " +
                  std::to_string(cells.size()));
    }
    if (mCapture.frames.size() == mMaxFrames) {
        return at("more than " + std::to_string(mMaxFrames) + " frames");
    }
    CaptureFrame frame;
    if (cells[*mQueueColumn].empty()) return at("queue_ns is empty");
    if (std::string error = time("queue_ns", cells[*mQueueColumn], frame.queueTime);
        !error.empty()) {
        return error;
    }
    if (!mCapture.frames.empty() && frame.queueTime < mCapture.frames.back().queueTime) {
        return at("queue_ns is earlier than the previous frame's");
    }
    if (mRenderDoneColumn && !cells[*mRenderDoneColumn].empty()) {
        if (std::string error =
                    time("render_done_ns", cells[*mRenderDoneColumn], frame.renderDoneTime);
            !error.empty()) {
            return error;
        }
        if (frame.renderDoneTime < frame.queueTime) {
            return at("render_done_ns is earlier than queue_ns");
        }
    }
    mCapture.frames.push_back(frame);
    return {};
}

}  // namespace

Result<Capture> parseCapture(std::istream& in, const std::string& name, size_t maxFrames) {
    using R = Result<Capture>;
    CaptureParser parser(name, maxFrames);
    std::string line;
    bool haveHeader = false;
    while (std::getline(in, line)) {
        parser.nextLine();
        if (line.size() > MAX_LINE_CHARS) {
            return R::failure(parser.at("line is longer than " + std::to_string(MAX_LINE_CHARS) +
                                        " characters"));
        }
        std::string_view text = line;
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
    result.value = std::move(parser.capture());
    if (result.value.frames.empty()) {
        return R::failure(errorLine(name + ": no frames after the header"));
    }
    const nsecs_t first = result.value.frames.front().queueTime;
    for (CaptureFrame& frame : result.value.frames) {
        frame.queueTime -= first;
        if (frame.renderDoneTime >= 0) frame.renderDoneTime -= first;
    }
    return result;
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
