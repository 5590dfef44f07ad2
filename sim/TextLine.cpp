#include "sim/TextLine.h"

#include <charconv>
#include <cstdlib>
#include <cstring>

namespace verolux::sim {

TextLine& TextLine::operator<<(std::string_view text) {
    const size_t n = std::min(text.size(), CAPACITY - mSize);
    memcpy(mText + mSize, text.data(), n);
    mSize += n;
    return *this;
}

template <typename... Format>
TextLine& TextLine::appendChars(Format... format) {
    const auto [end, ec] = std::to_chars(mText + mSize, mText + CAPACITY, format...);
    if (ec == std::errc()) mSize = end - mText;
    return *this;
}

TextLine& TextLine::operator<<(char c) {
    if (mSize < CAPACITY) mText[mSize++] = c;
    return *this;
}

TextLine& TextLine::signedInteger(int64_t value) {
    return appendChars(value);
}

TextLine& TextLine::unsignedInteger(uint64_t value) {
    return appendChars(value);
}

TextLine& TextLine::fixed(double value, int decimals) {
    return appendChars(value, std::chars_format::fixed, decimals);
}

TextLine& TextLine::general(double value, int precision) {
    return appendChars(value, std::chars_format::general, precision);
}

TextLine& TextLine::shortest(float value) {
    return appendChars(value);
}

TextLine& TextLine::thousandths(int64_t value) {
    // As "%.3f" prints value / 1000.0, negative values with their sign ("-0.001").
    if (value < 0) *this << '-';
    const uint64_t magnitude = value < 0 ? 0 - static_cast<uint64_t>(value) : value;
    const uint64_t fraction = magnitude % 1000;
    *this << magnitude / 1000 << '.';
    *this << static_cast<char>('0' + fraction / 100) << static_cast<char>('0' + fraction / 10 % 10)
          << static_cast<char>('0' + fraction % 10);
    return *this;
}

void TextLine::writeTo(std::ostream& out) {
    out.write(mText, static_cast<std::streamsize>(mSize));
    mSize = 0;
}

}  // namespace verolux::sim
