#include <gtest/gtest.h>
#include <png.h>

#include <array>
#include <filesystem>

#include "sim/PngWriter.h"

namespace verolux::sim {
namespace {

using Pixel = std::array<int, 3>;

// 16 pixels wide; row y, pixel x is (10 * y, x, base).
Recording recording(std::vector<uint32_t> kinds, uint8_t base) {
    Recording r;
    r.scanlineWidth = 16;
    for (size_t y = 0; y < kinds.size(); y++) {
        r.refreshes.emplace_back().kind = kinds[y];
        auto& line = r.scanlines.emplace_back();
        for (uint8_t x = 0; x < 16; x++)
            line.insert(line.end(), {static_cast<uint8_t>(10 * y), x, base});
    }
    return r;
}

// The file decoded by libpng: width, height and RGB pixels.
struct Decoded {
    uint32_t width = 0;
    uint32_t height = 0;
    std::vector<uint8_t> rgb;

    Pixel at(uint32_t x, uint32_t y) const {
        const uint8_t* p = &rgb[(y * width + x) * 3];
        return {p[0], p[1], p[2]};
    }
};

Decoded decode(const std::string& path) {
    png_image image{};
    image.version = PNG_IMAGE_VERSION;
    Decoded decoded;
    if (!png_image_begin_read_from_file(&image, path.c_str())) return decoded;
    image.format = PNG_FORMAT_RGB;
    decoded.rgb.resize(PNG_IMAGE_SIZE(image));
    if (png_image_finish_read(&image, nullptr, decoded.rgb.data(), 0, nullptr)) {
        decoded.width = image.width;
        decoded.height = image.height;
    }
    return decoded;
}

TEST(PngWriterTest, putsTheRunAndTheReferenceSideBySideWithKindMarginsAndPadding) {
    const auto dir = std::filesystem::temp_directory_path() / "verolux-png-test";
    std::filesystem::create_directories(dir);
    const std::string both = (dir / "both.png").string();
    const std::string alone = (dir / "alone.png").string();
    const Recording run = recording({64, 8, 16}, 200);
    Recording reference = recording({64, 0}, 100);
    reference.scanlines[1].resize(3 * 10);
    ASSERT_TRUE(writeSpaceTimePng(both, run, &reference).ok());
    ASSERT_TRUE(writeSpaceTimePng(alone, run).ok());
    const Decoded image = decode(both);
    const Decoded runOnly = decode(alone);
    std::filesystem::remove_all(dir);

    // 4 margin + 16 run + 4 separator + 4 margin + 16 reference; rows up to the longer run.
    ASSERT_EQ(44u, image.width);
    ASSERT_EQ(3u, image.height);
    EXPECT_EQ((Pixel{40, 200, 70}), image.at(0, 0));     // new picture
    EXPECT_EQ((Pixel{40, 110, 255}), image.at(3, 1));    // blend
    EXPECT_EQ((Pixel{230, 40, 40}), image.at(0, 2));     // repeat
    EXPECT_EQ((Pixel{10, 5, 200}), image.at(4 + 5, 1));  // the run's scanline
    EXPECT_EQ((Pixel{255, 255, 255}), image.at(20, 0));  // separator
    EXPECT_EQ((Pixel{0, 0, 0}), image.at(24, 1));        // no state
    EXPECT_EQ((Pixel{10, 9, 100}), image.at(28 + 9, 1));
    EXPECT_EQ((Pixel{128, 128, 128}), image.at(28 + 10, 1));  // past a short scanline
    EXPECT_EQ((Pixel{128, 128, 128}), image.at(24, 2));       // past the reference's end

    EXPECT_EQ(20u, runOnly.width);
    EXPECT_EQ(3u, runOnly.height);
    EXPECT_EQ("verolux-sim: cannot draw x.png: no refreshes recorded",
              writeSpaceTimePng("x.png", Recording()).error);
}

}  // namespace
}  // namespace verolux::sim
