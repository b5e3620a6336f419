#include "client/SafeIdentifier.h"

#include <gtest/gtest.h>

namespace appsync {
namespace {

TEST(SafeIdentifier, RefusesASlashFollowedByTwoDotsAnywhere) {
    EXPECT_FALSE(isSafeText("/.."));
    EXPECT_FALSE(isSafeText("a/../b"));
    EXPECT_FALSE(isSafeText("a/..b"));
    EXPECT_FALSE(isSafeText("com.example/.."));
}

TEST(SafeIdentifier, AcceptsTwoDotsWithoutASlashBeforeThem) {
    EXPECT_TRUE(isSafeText(".."));
    EXPECT_TRUE(isSafeText("../a"));
    EXPECT_TRUE(isSafeText("a..b"));
    EXPECT_TRUE(isSafeText("a/.b"));
    EXPECT_TRUE(isSafeText(""));
}

TEST(SafeIdentifier, RefusesWhatIsNoString) {
    const PropertyList number = 7;
    const PropertyList text = "com.example.a";
    EXPECT_FALSE(isSafe(&number));
    EXPECT_FALSE(isSafe(static_cast<const PropertyList*>(nullptr)));
    EXPECT_FALSE(isSafe(std::optional<std::string>()));
    EXPECT_TRUE(isSafe(&text));
}

}  // namespace
}  // namespace appsync
