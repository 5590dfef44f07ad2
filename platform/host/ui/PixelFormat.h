#pragma once

#include <cstdint>

namespace android {

using PixelFormat = int32_t;

enum : PixelFormat {
    PIXEL_FORMAT_UNKNOWN = 0,
    PIXEL_FORMAT_RGBA_8888 = 1,
    PIXEL_FORMAT_RGBX_8888 = 2,
};

// Bytes per pixel, 0 for formats the host does not allocate.
inline uint32_t bytesPerPixel(PixelFormat format) {
    return format == PIXEL_FORMAT_RGBA_8888 || format == PIXEL_FORMAT_RGBX_8888 ? 4 : 0;
}

}  // namespace android
