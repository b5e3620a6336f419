#include "device/values/PackageText.h"

#include <gtest/gtest.h>

#include <string>

namespace appsync {

namespace {

TEST(PackageTextTest, knowsUtf8OfEveryLength) {
    for (const char* text : {"", "a", "\xc3\xa4", "\xe2\x82\xac", "\xf0\x9f\x98\x80",
                             "\xed\x9f\xbf", "\xee\x80\x80", "\xf4\x8f\xbf\xbf"}) {
        EXPECT_TRUE(isValidUtf8(text)) << text;
    }
}

TEST(PackageTextTest, refusesWhatOnlyLooksLikeUtf8) {
    for (const char* text :
         {"\x80", "\xc3", "\xc0\x80", "\xc1\xbf", "\xe0\x80\x80", "\xed\xa0\x80",
          "\xf0\x80\x80\x80", "\xf4\x90\x80\x80", "\xf5\x80\x80\x80", "\xff", "\xe2\x82",
          "\xe2\x82"
          "a"}) {
        EXPECT_FALSE(isValidUtf8(text));
    }
}

TEST(PackageTextTest, aPrefixCutsNoCharacterInTwo) {
    EXPECT_EQ(utf8Prefix("abc", 3), "abc");
    EXPECT_EQ(utf8Prefix("abc", 2), "ab");
    EXPECT_EQ(utf8Prefix("a\xe2\x82\xac", 3), "a");
    EXPECT_EQ(utf8Prefix("\x80\x80\x80", 2), "");
}

TEST(PackageTextTest, quotedNamesCanBeShownOnATerminal) {
    EXPECT_EQ(quotedName("Gr\xc3\xbc\xc3\x9f"
                         "e"),
              "'Gr\xc3\xbc\xc3\x9f"
              "e'");
    EXPECT_EQ(quotedName("a\x1b[2J\n"), "'a\\x1b[2J\\x0a'");
    EXPECT_EQ(quotedName("\xff"), "'\\xff'");
    EXPECT_EQ(quotedName(std::string(1000, 'x')), "'" + std::string(200, 'x') + "...'");
}

}  // namespace

}  // namespace appsync
