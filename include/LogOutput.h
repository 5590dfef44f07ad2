#pragma once

#include <cstdint>

namespace android {

// The library's version, as the dump and the ring log's header report it.
extern const uint32_t INTERPOLATION_MAJOR_VERSION;
extern const uint32_t INTERPOLATION_MINOR_VERSION;
extern const uint32_t INTERPOLATION_REVISION;
extern const char* INTERPOLATION_BRANCH;
// 64 lowercase hexadecimal digits fixed at build time from the library's sources.
extern const char* INTERPOLATION_CHECKSUM;

}  // namespace android
