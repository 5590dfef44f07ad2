#include <gtest/gtest.h>
#include <png.h>

#include <array>
#include <filesystem>

#include "sim/PngWriter.h"

namespace verolux::sim {
namespace {

using Pixel = std::array<int, 3>;

// Row y of width 16: pixel x is (10 * y, x, base).
Recording recording(std::vector<uint32_t> kinds, uint8_t base) {
    Recording r;
    r.scanlineWidth = 16;
    for (size_t y = 0; y < kinds.size(); y++) {
        RefreshRecord refresh;
        refresh.kind = kinds[y];
        r.refreshes.push_back(refresh);
        std::vector<uint8_t> line;
        for (uint8_t x = 0; x < 16; x++)
            line.insert(line.end(), {static_cast<uint8_t>(10 * y), x, base});
        r.scanlines.push_back(line);
    }
    return r;
}

class PngWriterTest : public testing::Test {
protected:
    void SetUp() override { std::filesystem::create_directories(mDir); }
    void TearDown() override { std::filesystem::remove_all(mDir); }

    // Decodes the file with libpng into mWidth x mHeight RGB pixels.
    void decode() {
        png_image image{};
        image.version = PNG_IMAGE_VERSION;
        ASSERT_TRUE(png_image_begin_read_from_file(&image, mPath.c_str())) << image.message;
        image.format = PNG_FORMAT_RGB;
        mWidth = image.width;
        mHeight = image.height;
        mPixels.resize(PNG_IMAGE_SIZE(image));
        ASSERT_TRUE(png_image_finish_read(&image, nullptr, mPixels.data(), 0, nullptr));
    }
    Pixel at(uint32_t x, uint32_t y) const {
        const uint8_t* p = &mPixels[(y * mWidth + x) * 3];
        return {p[0], p[1], p[2]};
    }

    const std::filesystem::path mDir = std::filesystem::temp_directory_path() / "verolux-png-test";
    const std::string mPath = (mDir / "space-time.png").string();
    uint32_t mWidth = 0;
    uint32_t mHeight = 0;
    std::vector<uint8_t> mPixels;
};

TEST_F(PngWriterTest, putsTheRunAndTheReferenceSideBySideWithKindMargins) {
    const Recording run = recording({64, 8, 16}, 200);
    const Recording reference = recording({64, 0}, 100);
    ASSERT_TRUE(writeSpaceTimePng(mPath, run, &reference).ok());
    decode();

    // 4 margin + 16 run + 4 separator + 4 margin + 16 reference; rows up to the longer run.
    EXPECT_EQ(44u, mWidth);
    EXPECT_EQ(3u, mHeight);
    EXPECT_EQ((Pixel{40, 200, 70}), at(0, 0));     // new picture
    EXPECT_EQ((Pixel{40, 110, 255}), at(3, 1));    // blend
    EXPECT_EQ((Pixel{230, 40, 40}), at(0, 2));     // repeat
    EXPECT_EQ((Pixel{10, 5, 200}), at(4 + 5, 1));  // the run's scanline
    EXPECT_EQ((Pixel{255, 255, 255}), at(20, 0));  // separator
    EXPECT_EQ((Pixel{0, 0, 0}), at(24, 1));        // no state
    EXPECT_EQ((Pixel{10, 15, 100}), at(28 + 15, 1));
    EXPECT_EQ((Pixel{128, 128, 128}), at(24, 2));  // the reference has ended
    EXPECT_EQ((Pixel{128, 128, 128}), at(43, 2));
}

TEST_F(PngWriterTest, drawsTheRunAloneAndPadsShortScanlines) {
    Recording run = recording({64, 64}, 50);
    run.scanlines[1].resize(3 * 10);
    ASSERT_TRUE(writeSpaceTimePng(mPath, run).ok());
    decode();
    EXPECT_EQ(20u, mWidth);
    EXPECT_EQ(2u, mHeight);
    EXPECT_EQ((Pixel{10, 9, 50}), at(4 + 9, 1));
    EXPECT_EQ((Pixel{128, 128, 128}), at(4 + 10, 1));

    EXPECT_EQ("verolux-sim: cannot draw " + mPath + ": no refreshes recorded",
              writeSpaceTimePng(mPath, Recording()).error);
    EXPECT_EQ("verolux-sim: cannot write /nonexistent/p.png: No such file or directory",
              writeSpaceTimePng("/nonexistent/p.png", run).error);
}

}  // namespace
}  // namespace verolux::sim
