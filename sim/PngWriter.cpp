#include "sim/PngWriter.h"

#include <png.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <vector>

#include "EventDispatcher.h"

namespace verolux::sim {

using namespace android::Interpolation;

namespace {

constexpr uint32_t KIND_MARGIN = 4;
constexpr uint32_t SEPARATOR = 4;
// Far beyond any picture the simulator draws; a wider recording is broken, not big.
constexpr uint32_t MAX_SCANLINE_WIDTH = 16384;

struct Rgb {
    uint8_t r, g, b;
};

constexpr Rgb PAD = {128, 128, 128};
constexpr Rgb SEPARATOR_COLOUR = {255, 255, 255};
constexpr Rgb NEW_COLOUR = {40, 200, 70};
constexpr Rgb BLEND_COLOUR = {40, 110, 255};
constexpr Rgb REPEAT_COLOUR = {230, 40, 40};
constexpr Rgb NO_STATE_COLOUR = {0, 0, 0};

uint8_t* fill(uint8_t* out, Rgb colour, size_t pixels) {
    for (size_t i = 0; i < pixels; i++) {
        *out++ = colour.r;
        *out++ = colour.g;
        *out++ = colour.b;
    }
    return out;
}

Rgb kindColour(uint32_t kind) {
    switch (kind) {
        case eNewFrameCompositionEvent:
            return NEW_COLOUR;
        case eBlendedCompositionEvent:
            return BLEND_COLOUR;
        case eRepeatedCompositionEvent:
            return REPEAT_COLOUR;
        default:
            return NO_STATE_COLOUR;
    }
}

size_t rowCount(const Recording& recording) {
    return std::max(recording.refreshes.size(), recording.scanlines.size());
}

class SpaceTimeLayout {
public:
    SpaceTimeLayout(const Recording& run, const Recording* reference)
        : mRun(run), mReference(reference) {}

    uint32_t width() const {
        uint32_t width = KIND_MARGIN + mRun.scanlineWidth;
        if (mReference != nullptr) width += SEPARATOR + KIND_MARGIN + mReference->scanlineWidth;
        return width;
    }
    size_t height() const {
        return std::max(rowCount(mRun), mReference != nullptr ? rowCount(*mReference) : 0);
    }

    // Writes width() RGB pixels. Allocates nothing and cannot throw: it runs between libpng calls
    // that may long-jump.
    void fillRow(size_t y, uint8_t* row) const {
        row = fillSide(mRun, y, row);
        if (mReference == nullptr) return;
        row = fill(row, SEPARATOR_COLOUR, SEPARATOR);
        fillSide(*mReference, y, row);
    }

private:
    static uint8_t* fillSide(const Recording& recording, size_t y, uint8_t* out) {
        const uint32_t kind = y < recording.refreshes.size() ? recording.refreshes[y].kind : 0;
        out = fill(out, y < rowCount(recording) ? kindColour(kind) : PAD, KIND_MARGIN);
        size_t copied = 0;
        if (y < recording.scanlines.size()) {
            const std::vector<uint8_t>& scanline = recording.scanlines[y];
            copied = std::min<size_t>(scanline.size() / 3, recording.scanlineWidth);
            if (copied > 0) memcpy(out, scanline.data(), copied * 3);
            out += copied * 3;
        }
        return fill(out, PAD, recording.scanlineWidth - copied);
    }

    const Recording& mRun;
    const Recording* mReference;
};

struct PngErrors {
    char message[256];
};

void onPngError(png_structp png, png_const_charp message) {
    auto* errors = static_cast<PngErrors*>(png_get_error_ptr(png));
    snprintf(errors->message, sizeof(errors->message), "%s", message);
    png_longjmp(png, 1);
}

void onPngWarning(png_structp, png_const_charp) {}

// libpng reports errors by long-jumping back to the setjmp below, which skips destructors: only
// trivially destructible locals live in this function, and the row buffer belongs to the caller.
bool writeRows(FILE* file, const SpaceTimeLayout& layout, uint8_t* row, PngErrors& errors) {
    png_structp png =
            png_create_write_struct(PNG_LIBPNG_VER_STRING, &errors, onPngError, onPngWarning);
    if (png == nullptr) {
        snprintf(errors.message, sizeof(errors.message), "out of memory");
        return false;
    }
    png_infop info = png_create_info_struct(png);
    if (info == nullptr) {
        png_destroy_write_struct(&png, nullptr);
        snprintf(errors.message, sizeof(errors.message), "out of memory");
        return false;
    }
    if (setjmp(png_jmpbuf(png))) {
        png_destroy_write_struct(&png, &info);
        return false;
    }
    png_init_io(png, file);
    png_set_IHDR(png, info, layout.width(), static_cast<png_uint_32>(layout.height()), 8,
                 PNG_COLOR_TYPE_RGB, PNG_INTERLACE_NONE, PNG_COMPRESSION_TYPE_DEFAULT,
                 PNG_FILTER_TYPE_DEFAULT);
    png_write_info(png, info);
    for (size_t y = 0; y < layout.height(); y++) {
        layout.fillRow(y, row);
        png_write_row(png, row);
    }
    png_write_end(png, nullptr);
    png_destroy_write_struct(&png, &info);
    return true;
}

}  // namespace

Status writeSpaceTimePng(const std::string& path, const Recording& run, const Recording* reference) {
    for (const Recording* recording : {&run, reference}) {
        if (recording != nullptr && recording->scanlineWidth > MAX_SCANLINE_WIDTH) {
            return {errorLine("cannot draw " + path + ": scanline width " +
                              std::to_string(recording->scanlineWidth) + " is over " +
                              std::to_string(MAX_SCANLINE_WIDTH))};
        }
    }
    const SpaceTimeLayout layout(run, reference);
    if (layout.height() == 0) return {errorLine("cannot draw " + path + ": no refreshes recorded")};
    if (layout.height() > PNG_UINT_31_MAX) {
        return {errorLine("cannot draw " + path + ": too many refreshes for one picture")};
    }

    FILE* file = fopen(path.c_str(), "wb");
    if (file == nullptr) return {errorLine("cannot write " + path + ": " + strerror(errno))};
    std::vector<uint8_t> row(size_t{layout.width()} * 3);
    PngErrors errors{};
    const bool written = writeRows(file, layout, row.data(), errors);
    const bool closed = fclose(file) == 0;
    if (written && closed) return {};
    return {errorLine("cannot write " + path + ": " +
                      (written ? std::string(strerror(errno)) : std::string(errors.message)))};
}

}  // namespace verolux::sim
