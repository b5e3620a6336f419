#include "device/screen/IconDrawing.h"

#include <cairo.h>
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <cstring>
#include <utility>

#include "tests/device/screen/IconPng.h"

namespace appsync {

namespace {

TEST(IconDrawingTest, iconsGetTheirSizeAndRoundCorners) {
    for (const int side : {1, 57, 120, 1024}) {
        const Result<Bytes> icon = renderIcon(pngOf(side, side, kRed));
        ASSERT_TRUE(icon.ok()) << icon.error().description();
        EXPECT_EQ(sizeOf(*icon), "120x120");
        EXPECT_EQ(pixelOf(*icon, 60, 60), kOpaqueRed);
        EXPECT_EQ(pixelOf(*icon, 60, 0), kOpaqueRed);
        EXPECT_EQ(pixelOf(*icon, 0, 0), 0U);
        EXPECT_EQ(pixelOf(*icon, 119, 119), 0U);
    }
}

/// Every opacity beside every share of a colour that goes with it.
Surface manyPixels() {
    Result<Surface> surface = makeSurface(256, 256);
    unsigned char* pixels = ::cairo_image_surface_get_data(surface->get());
    for (std::uint32_t alpha = 0; alpha < 256; ++alpha) {
        for (std::uint32_t part = 0; part < 256; ++part) {
            const std::uint32_t red = part * alpha / 255;
            const std::uint32_t pixel = alpha << 24U | red << 16U | (alpha - red) << 8U | red / 2;
            std::memcpy(pixels + (alpha * 256 + part) * 4, &pixel, sizeof pixel);
        }
    }
    ::cairo_surface_mark_dirty(surface->get());
    return std::move(*surface);
}

TEST(IconDrawingTest, picturesComeBackPixelForPixel) {
    const Surface written = manyPixels();
    const Result<Bytes> png = encodePng(written.get());
    ASSERT_TRUE(png.ok());
    const Result<Surface> read = decodePng(*png);
    ASSERT_TRUE(read.ok()) << read.error().description();
    ASSERT_EQ(::cairo_image_surface_get_stride(read->get()), 256 * 4);
    EXPECT_EQ(std::memcmp(::cairo_image_surface_get_data(read->get()),
                          ::cairo_image_surface_get_data(written.get()), 256 * 256 * 4),
              0);
}

TEST(IconDrawingTest, anImageThatIsNotSquareFillsTheIcon) {
    const Result<Bytes> icon = renderIcon(pngOf(300, 100, kRed));
    ASSERT_TRUE(icon.ok());
    EXPECT_EQ(sizeOf(*icon), "120x120");
    EXPECT_EQ(pixelOf(*icon, 0, 60), kOpaqueRed);
    EXPECT_EQ(pixelOf(*icon, 60, 119), kOpaqueRed);
}

TEST(IconDrawingTest, whatIsNoPngIsRefused) {
    const std::string jpeg = "\xff\xd8\xff\xe0" + std::string(1000, 'j');
    EXPECT_FALSE(renderIcon({}).ok());
    EXPECT_FALSE(renderIcon(Bytes(jpeg.begin(), jpeg.end())).ok());
    EXPECT_FALSE(renderIcon(Bytes(100, 0)).ok());
}

TEST(IconDrawingTest, wherePngsAreCutOffTheyAreRefused) {
    const Bytes whole = pngOf(8, 8, kRed);
    for (std::size_t length = 0; length < whole.size(); ++length) {
        EXPECT_FALSE(renderIcon(ByteView(whole).first(length)).ok()) << length;
    }
}

TEST(IconDrawingTest, hugeClaimsAreRefusedByWhatTheySay) {
    const Bytes png = pngOf(8, 8, kRed);
    for (const std::uint32_t side : {4097U, 65536U, 0x7fffffffU, 0x80000000U, 0xffffffffU}) {
        const Result<Bytes> wide = renderIcon(claimingSize(png, side, 1));
        ASSERT_FALSE(wide.ok());
        EXPECT_NE(wide.error().description().find(std::to_string(side)), std::string::npos);
        EXPECT_FALSE(renderIcon(claimingSize(png, 1, side)).ok());
    }
}

TEST(IconDrawingTest, imageThatWouldTake64MebibytesIsRefusedByWhatItClaims) {
    const Result<Bytes> icon = renderIcon(pngOf(4096, 4096, kRed));
    ASSERT_FALSE(icon.ok());
    EXPECT_NE(icon.error().description().find("4096 x 4096"), std::string::npos);
    EXPECT_FALSE(renderIcon(pngOf(2048, 2049, kRed)).ok());
    EXPECT_TRUE(renderIcon(pngOf(2048, 2048, kRed)).ok());
    EXPECT_TRUE(renderIcon(pngOf(4096, 1024, kRed)).ok());
}

TEST(IconDrawingTest, chunkThatClaimsMoreThanThereIsIsRefusedBeforeMemoryIsTakenForIt) {
    Bytes png = pngOf(8, 8, kRed);
    const Bytes text{0x7f, 0xff, 0xff, 0xff, 't', 'E', 'X', 't', 'a', 0, 'b'};
    png.insert(png.begin() + 33, text.begin(), text.end());
    rusage before = {};
    ::getrusage(RUSAGE_SELF, &before);
    EXPECT_FALSE(renderIcon(png).ok());
    rusage after = {};
    ::getrusage(RUSAGE_SELF, &after);
    EXPECT_LT(after.ru_maxrss - before.ru_maxrss, 64 * 1024);
}

TEST(IconDrawingTest, noPixelsAreRefused) {
    const Bytes png = pngOf(8, 8, kRed);
    EXPECT_FALSE(renderIcon(claimingSize(png, 0, 8)).ok());
    EXPECT_FALSE(renderIcon(claimingSize(png, 8, 0)).ok());
}

TEST(IconDrawingTest, fewerPixelsThanClaimedAreRefused) {
    EXPECT_FALSE(renderIcon(claimingSize(pngOf(8, 8, kRed), 4096, 4096)).ok());
}

TEST(IconDrawingTest, damagedPixelsAreRefused) {
    Bytes png = pngOf(64, 64, kRed);
    png[png.size() / 2] ^= 0xffU;
    EXPECT_FALSE(renderIcon(png).ok());
}

TEST(IconDrawingTest, aFileThatIsTooLargeIsRefused) {
    Bytes png = pngOf(8, 8, kRed);
    png.resize(kMaximumIconFileBytes + 1);
    EXPECT_FALSE(renderIcon(png).ok());
}

TEST(IconDrawingTest, defaultIconsDifferByIdentifier) {
    const Result<Bytes> atlas = renderDefaultIcon("com.example.atlas", "Atlas");
    ASSERT_TRUE(atlas.ok());
    EXPECT_EQ(sizeOf(*atlas), "120x120");
    EXPECT_EQ(pixelOf(*atlas, 0, 0), 0U);
    EXPECT_EQ(*atlas, *renderDefaultIcon("com.example.atlas", "Atlas"));
    EXPECT_NE(*atlas, *renderDefaultIcon("com.example.beacon", "Atlas"));
    EXPECT_NE(*atlas, *renderDefaultIcon("com.example.atlas", "Beacon"));
}

TEST(IconDrawingTest, defaultIconsTakeAnyName) {
    for (const char* name : {"", "\xff", "\n", "\xf0\x9f\x98\x80", "\xc3", "1"}) {
        EXPECT_TRUE(renderDefaultIcon("", name).ok());
    }
}

}  // namespace

}  // namespace appsync
