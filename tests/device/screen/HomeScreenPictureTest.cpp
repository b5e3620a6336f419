#include "device/screen/HomeScreenPicture.h"

#include <gtest/gtest.h>

#include <limits>

#include "tests/device/screen/IconPng.h"

namespace appsync {

namespace {

// A place inside the first icon, away from its middle, and the same in the one to its right.
constexpr int kFirstX = 60;
constexpr int kSecondX = kFirstX + 152;
constexpr int kFirstY = 110;

HomeScreenItem item(const std::string& name) {
    return {.identifier = "com.example." + name, .name = name, .icon = pngOf(120, 120, kRed)};
}

Bytes draw(const std::vector<HomeScreenItem>& items) {
    Result<Bytes> picture = drawHomeScreen(items, "Device");
    EXPECT_TRUE(picture.ok());
    return picture ? *std::move(picture) : Bytes();
}

unsigned int redOf(std::uint32_t pixel) { return pixel >> 16U & 0xffU; }

TEST(HomeScreenPictureTest, anEmptyScreenIsAPicture) { EXPECT_EQ(sizeOf(draw({})), "660x1136"); }

TEST(HomeScreenPictureTest, iconsStandInOrder) {
    HomeScreenItem blue = item("b");
    blue.icon = pngOf(120, 120, {0, 0, 1});
    const Bytes picture = draw({item("a"), blue});
    EXPECT_EQ(pixelOf(picture, kFirstX, kFirstY), kOpaqueRed);
    EXPECT_EQ(pixelOf(picture, kSecondX, kFirstY), 0xff0000ffU);
}

TEST(HomeScreenPictureTest, placeholdersAreDimmed) {
    HomeScreenItem placeholder = item("b");
    placeholder.isPlaceholder = true;
    const Bytes picture = draw({item("a"), placeholder});
    EXPECT_EQ(redOf(pixelOf(picture, kFirstX, kFirstY)), 255U);
    EXPECT_LT(redOf(pixelOf(picture, kSecondX, kFirstY)), 150U);
}

TEST(HomeScreenPictureTest, progressIsDrawn) {
    HomeScreenItem placeholder = item("a");
    placeholder.isPlaceholder = true;
    const Bytes without = draw({placeholder});
    placeholder.progress = 0.25;
    const Bytes quarter = draw({placeholder});
    placeholder.progress = 0.75;
    EXPECT_NE(quarter, without);
    EXPECT_NE(quarter, draw({placeholder}));
}

TEST(HomeScreenPictureTest, progressStaysBetweenNothingAndAll) {
    HomeScreenItem over = item("a");
    HomeScreenItem all = item("a");
    over.progress = 7.0;
    all.progress = 1.0;
    EXPECT_EQ(draw({over}), draw({all}));
    over.progress = std::numeric_limits<double>::quiet_NaN();
    all.progress = 0.0;
    EXPECT_EQ(draw({over}), draw({all}));
}

TEST(HomeScreenPictureTest, namesAndTitlesAreDrawn) {
    const std::vector<HomeScreenItem> items = {item("a")};
    HomeScreenItem renamed = item("a");
    renamed.name = "Another";
    EXPECT_NE(draw(items), draw({renamed}));
    EXPECT_NE(draw(items), *drawHomeScreen(items, "Another"));
}

TEST(HomeScreenPictureTest, anItemWithoutANameShowsItsIdentifier) {
    HomeScreenItem unnamed = item("a");
    unnamed.name = "";
    HomeScreenItem named = item("a");
    named.name = named.identifier;
    EXPECT_EQ(draw({unnamed}), draw({named}));
}

TEST(HomeScreenPictureTest, anIconThatCannotBeReadCountsAsNone) {
    HomeScreenItem damaged = item("a");
    damaged.icon = {1, 2, 3};
    HomeScreenItem none = item("a");
    none.icon.clear();
    EXPECT_EQ(draw({damaged}), draw({none}));
}

TEST(HomeScreenPictureTest, growsWithItsIcons) {
    EXPECT_EQ(sizeOf(draw(std::vector<HomeScreenItem>(28, item("a")))), "660x1390");
    EXPECT_EQ(sizeOf(draw(std::vector<HomeScreenItem>(29, item("a")))), "812x1212");
}

TEST(HomeScreenPictureTest, manyIconsAreDrawnSmaller) {
    HomeScreenItem small = item("a");
    small.icon = pngOf(1, 1, kRed);
    const Bytes picture = draw(std::vector<HomeScreenItem>(2000, small));
    EXPECT_EQ(sizeOf(picture), "1980x4039");
    // A third of the usual size, more or less.
    EXPECT_EQ(pixelOf(picture, kFirstX * 3 / 8, kFirstY * 3 / 8), kOpaqueRed);
}

TEST(HomeScreenPictureTest, takesNamesOfAnyBytes) {
    HomeScreenItem odd = item("a");
    for (const std::string& name :
         {std::string("\xff\xfe"), std::string("a\nb\tc"), std::string("x\0y", 3),
          std::string(100'000, 'W'), std::string("\xf0\x9f\x98\x80\xf0\x9f\x98\x80")}) {
        odd.name = name;
        EXPECT_EQ(sizeOf(draw({odd})), "660x1136");
    }
}

}  // namespace

}  // namespace appsync
