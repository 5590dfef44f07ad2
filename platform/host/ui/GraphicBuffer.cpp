#include <ui/GraphicBuffer.h>

#include <atomic>

namespace android {

namespace {
std::atomic<uint64_t> sNextBufferId{1};
}  // namespace

GraphicBuffer::GraphicBuffer(uint32_t width, uint32_t height, PixelFormat format, uint64_t usage)
    : mWidth(width),
      mHeight(height),
      mFormat(format),
      mUsage(usage),
      mId(sNextBufferId.fetch_add(1)),
      mPixels(size_t{width} * height * bytesPerPixel(format)) {}

status_t GraphicBuffer::lock(uint64_t usage, void** vaddr) {
    if (vaddr == nullptr) return BAD_VALUE;
    if (mPixels.empty()) {
        *vaddr = nullptr;
        return NO_MEMORY;
    }
    *vaddr = mPixels.data();
    return NO_ERROR;
}

status_t GraphicBuffer::unlock() {
    return NO_ERROR;
}

}  // namespace android
