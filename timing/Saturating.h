#pragma once

#include <cstdint>
#include <limits>

namespace android::Interpolation {

// Times from the host and from event payloads are not trusted to be sane; arithmetic on them
// saturates instead of overflowing.

inline int64_t saturatingAdd(int64_t a, int64_t b) {
    int64_t sum;
    if (!__builtin_add_overflow(a, b, &sum)) return sum;
    return b > 0 ? std::numeric_limits<int64_t>::max() : std::numeric_limits<int64_t>::min();
}

inline int64_t saturatingSub(int64_t a, int64_t b) {
    int64_t difference;
    if (!__builtin_sub_overflow(a, b, &difference)) return difference;
    return b < 0 ? std::numeric_limits<int64_t>::max() : std::numeric_limits<int64_t>::min();
}

}  // namespace android::Interpolation
