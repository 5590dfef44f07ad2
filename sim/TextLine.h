#pragma once

#include <cstddef>
#include <cstdint>
#include <ostream>
#include <string_view>
#include <type_traits>

namespace verolux::sim {

// A line of a long run's output files, built piece by piece in a fixed buffer: no allocation, and
// numbers through std::to_chars rather than printf, which is most of what writing those files
// costs. Numbers read as printf writes them: fixed(x, 3) as "%.3f", general(x, 4) as "%.4g". A
// line longer than the buffer is cut short.
class TextLine {
public:
    static constexpr size_t CAPACITY = 1024;

    TextLine& operator<<(std::string_view text);
    TextLine& operator<<(char c);
    template <typename T, typename = std::enable_if_t<std::is_integral_v<T>>>
    TextLine& operator<<(T value) {
        if constexpr (std::is_signed_v<T>) {
            return signedInteger(static_cast<int64_t>(value));
        } else {
            return unsignedInteger(static_cast<uint64_t>(value));
        }
    }
    TextLine& fixed(double value, int decimals);
    TextLine& general(double value, int precision);
    // The shortest text that reads back as the same float.
    TextLine& shortest(float value);
    // A whole number of thousandths as a decimal with three places: 12345 is "12.345".
    TextLine& thousandths(int64_t value);

    std::string_view view() const { return {mText, mSize}; }
    void clear() { mSize = 0; }
    // Writes the line and starts a new one.
    void writeTo(std::ostream& out);

private:
    TextLine& signedInteger(int64_t value);
    TextLine& unsignedInteger(uint64_t value);
    // Appends std::to_chars(value, format...), or nothing when it does not fit.
    template <typename... Format>
    TextLine& appendChars(Format... format);

    char mText[CAPACITY];
    size_t mSize = 0;
};

}  // namespace verolux::sim
