#pragma once

#include <algorithm>
#include <string>
#include <vector>

namespace android::test {

struct LogLine {
    int priority;
    std::string tag;  // empty when the line had no tag
    std::string text;
};

// Records the platform log lines printed while it lives, with the library's logLevel set to `level`.
class LogCapture {
public:
    explicit LogCapture(int level = 2);
    ~LogCapture();
    LogCapture(const LogCapture&) = delete;
    LogCapture& operator=(const LogCapture&) = delete;

    std::vector<LogLine> lines() const;
    std::vector<std::string> texts() const {
        std::vector<std::string> texts;
        for (const LogLine& line : lines())
            texts.push_back(line.text);
        return texts;
    }
    // Number of lines whose text is exactly `text`.
    int count(const std::string& text) const {
        const std::vector<std::string> all = texts();
        return static_cast<int>(std::count(all.begin(), all.end(), text));
    }
    bool contains(const std::string& text) const { return count(text) > 0; }
    void clear();

private:
    int mPreviousLevel;
};

}  // namespace android::test
