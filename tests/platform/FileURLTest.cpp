#include "platform/FileURL.h"

#include <gtest/gtest.h>

#include <string_view>

namespace appsync {
namespace {

TEST(FileURL, IsMadeOfAPathOnly) {
    EXPECT_FALSE(FileURL::fromPath("", false));
    EXPECT_FALSE(FileURL::fromPath(std::string_view("/a\0b", 4), false));
    EXPECT_EQ(FileURL::fromPath("/a b", false)->path(), "/a b");
}

TEST(FileURL, KnowsWhetherItNamesADirectory) {
    EXPECT_TRUE(FileURL::fromPath("/a", true)->isDirectory());
    EXPECT_FALSE(FileURL::fromPath("/a", false)->isDirectory());
}

TEST(FileURL, EndsWithOneSlashWhenItNamesADirectory) {
    EXPECT_EQ(FileURL::fromPath("/a", true)->text(), "file:///a/");
    EXPECT_EQ(FileURL::fromPath("/a/", true)->text(), "file:///a/");
    EXPECT_EQ(FileURL::fromPath("/a/", false)->text(), "file:///a/");
    EXPECT_EQ(FileURL::fromPath("/a", false)->text(), "file:///a");
}

TEST(FileURL, KeepsLettersDigitsAndWhatMayStandInAPath) {
    const std::string_view kept = "/AZaz09-._~!$&'()*+,=:@";
    EXPECT_EQ(FileURL::fromPath(kept, false)->text(), "file://" + std::string(kept));
}

TEST(FileURL, EncodesEveryOtherByte) {
    EXPECT_EQ(FileURL::fromPath("/ %?#;", false)->text(), "file:///%20%25%3F%23%3B");
    // The neighbours of the letters and the digits.
    EXPECT_EQ(FileURL::fromPath("[`{^|", false)->text(), "file://%5B%60%7B%5E%7C");
    EXPECT_EQ(FileURL::fromPath("\xC3\xA9\x7F\x01", false)->text(), "file://%C3%A9%7F%01");
}

TEST(FileURL, EqualsOneOfTheSamePathAndKind) {
    EXPECT_EQ(FileURL::fromPath("/a", true), FileURL::fromPath("/a", true));
    EXPECT_NE(FileURL::fromPath("/a", true), FileURL::fromPath("/b", true));
    EXPECT_NE(FileURL::fromPath("/a", true), FileURL::fromPath("/a", false));
}

}  // namespace
}  // namespace appsync
