#pragma once

#include <string>
#include <string_view>
#include <utility>

namespace verolux::sim {

// The outcome of reading user input or writing an output file: a value, or the one line to print
// before exiting with a non-zero status. Nothing in the simulator throws past its own functions.
template <typename T>
struct Result {
    T value{};
    std::string error;  // empty on success

    bool ok() const { return error.empty(); }

    static Result failure(std::string message) {
        Result result;
        result.error = std::move(message);
        return result;
    }
};

struct Status {
    std::string error;  // empty on success

    bool ok() const { return error.empty(); }
};

// "verolux-sim: " followed by the message: every error line the simulator prints starts so.
std::string errorLine(std::string_view message);

// Text from the input inside an error line: cut to maxChars (then "...") and with control
// characters shown as '?', so that the line stays one short line whatever the input held.
std::string printable(std::string_view text, size_t maxChars);

// User text inside an error line, in double quotes, printable and cut to 40 characters.
std::string quoted(std::string_view text);

}  // namespace verolux::sim
