#pragma once

#include <string>
#include <vector>

namespace android::test {

struct LogLine {
    int priority;
    std::string tag;  // empty when the line had no tag
    std::string text;
};

// Records every platform log line printed while it lives, and sets the library's logLevel for that
// time.
class LogCapture {
public:
    explicit LogCapture(int level = 2);
    ~LogCapture();
    LogCapture(const LogCapture&) = delete;
    LogCapture& operator=(const LogCapture&) = delete;

    std::vector<LogLine> lines() const;
    std::vector<std::string> texts() const;
    // Number of lines whose text is exactly `text`.
    int count(const std::string& text) const;
    bool contains(const std::string& text) const { return count(text) > 0; }
    void clear();

private:
    int mPreviousLevel;
};

}  // namespace android::test
