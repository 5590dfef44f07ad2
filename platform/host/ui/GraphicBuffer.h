#pragma once

#include <ui/PixelFormat.h>
#include <utils/Errors.h>
#include <utils/RefBase.h>

#include <cstdint>
#include <vector>

namespace android {

// A buffer whose pixels live in ordinary memory, so that host programs can draw into it and
// read back what was composed.
class GraphicBuffer : public RefBase {
public:
    enum : uint64_t {
        USAGE_SW_READ_OFTEN = 0x3,
        USAGE_SW_WRITE_OFTEN = 0x30,
    };

    GraphicBuffer(uint32_t width, uint32_t height, PixelFormat format, uint64_t usage = 0);

    status_t initCheck() const { return mPixels.empty() ? NO_MEMORY : NO_ERROR; }
    uint32_t getWidth() const { return mWidth; }
    uint32_t getHeight() const { return mHeight; }
    uint32_t getStride() const { return mWidth; }  // in pixels
    PixelFormat getPixelFormat() const { return mFormat; }
    uint64_t getUsage() const { return mUsage; }
    uint64_t getId() const { return mId; }

    // CPU access to the pixels, rows of getStride() pixels.
    status_t lock(uint64_t usage, void** vaddr);
    status_t unlock();

private:
    const uint32_t mWidth;
    const uint32_t mHeight;
    const PixelFormat mFormat;
    const uint64_t mUsage;
    const uint64_t mId;
    std::vector<uint8_t> mPixels;
};

}  // namespace android
