#include "sim/SpaceTimeWindow.h"

#include <png.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

namespace verolux::sim {

namespace {

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
// trivially destructible locals live in this function.
bool writeRows(FILE* file, const uint8_t* rows, size_t width, size_t height, char* firstRefresh,
               char* rowCount, PngErrors& errors) {
    png_structp png =
            png_create_write_struct(PNG_LIBPNG_VER_STRING, &errors, onPngError, onPngWarning);
    png_infop info = png != nullptr ? png_create_info_struct(png) : nullptr;
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
    png_set_IHDR(png, info, static_cast<png_uint_32>(width), static_cast<png_uint_32>(height), 8,
                 PNG_COLOR_TYPE_RGB, PNG_INTERLACE_NONE, PNG_COMPRESSION_TYPE_DEFAULT,
                 PNG_FILTER_TYPE_DEFAULT);
    png_text text[2] = {};
    text[0].compression = PNG_TEXT_COMPRESSION_NONE;
    text[0].key = const_cast<char*>("first_refresh");
    text[0].text = firstRefresh;
    text[1].compression = PNG_TEXT_COMPRESSION_NONE;
    text[1].key = const_cast<char*>("rows");
    text[1].text = rowCount;
    png_set_text(png, info, text, 2);
    png_write_info(png, info);
    for (size_t y = 0; y < height; y++)
        png_write_row(png, rows + y * width * 3);
    png_write_end(png, nullptr);
    png_destroy_write_struct(&png, &info);
    return true;
}

}  // namespace

SpaceTimeWindow::SpaceTimeWindow(nsecs_t from, nsecs_t to, size_t maxRows)
    : mFrom(from), mTo(to), mMaxRows(maxRows) {}

void SpaceTimeWindow::onRefresh(const RefreshRecord& refresh) {
    if (refresh.presentTime >= mTo || refresh.scanline.empty() || refresh.scanline.size() % 3 != 0) {
        return;
    }
    if (refresh.presentTime >= mFrom && !mInWindow) {
        mInWindow = true;
        mRows.clear();
    }
    if (mInWindow && mRows.size() == mMaxRows) return;
    if (!mRows.empty() && refresh.scanline.size() != mRows.front().scanline.size()) return;
    mRows.push_back({refresh.index, refresh.presentTime, refresh.scanline});
    // Before the window, only the latest stretch of its length is kept.
    while (!mInWindow && (mRows.size() > mMaxRows ||
                          mRows.front().presentTime <= refresh.presentTime - (mTo - mFrom))) {
        mRows.pop_front();
    }
}

Status SpaceTimeWindow::writePng(const std::string& path) const {
    if (mRows.empty()) return {errorLine("cannot draw " + path + ": no refresh showed a picture")};
    const size_t width = mRows.front().scanline.size() / 3;
    std::vector<uint8_t> pixels;
    pixels.reserve(mRows.size() * width * 3);
    for (const Row& row : mRows)
        pixels.insert(pixels.end(), row.scanline.begin(), row.scanline.end());
    FILE* file = fopen(path.c_str(), "wb");
    if (file == nullptr) return {errorLine("cannot write " + path + ": " + strerror(errno))};
    std::string firstRefresh = std::to_string(mRows.front().refresh);
    std::string rowCount = std::to_string(mRows.size());
    PngErrors errors{};
    const bool written = writeRows(file, pixels.data(), width, mRows.size(), firstRefresh.data(),
                                   rowCount.data(), errors);
    const bool closed = fclose(file) == 0;
    if (written && closed) return {};
    return {errorLine("cannot write " + path + ": " +
                      (written ? std::string(strerror(errno)) : std::string(errors.message)))};
}

}  // namespace verolux::sim
