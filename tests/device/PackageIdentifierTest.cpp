#include "device/PackageIdentifier.h"

#include <gtest/gtest.h>

#include <string>

namespace appsync {

namespace {

TEST(PackageIdentifierTest, lettersDigitsDotsDashesAndUnderscoresAreLegal) {
    for (const char* text : {"a", "com.example.atlas", "A-Z_0-9.z", "...", "-", ".hidden", "7"}) {
        EXPECT_TRUE(isLegalIdentifier(text)) << text;
    }
}

TEST(PackageIdentifierTest, namesOfDirectoriesThemselvesAreNot) {
    EXPECT_FALSE(isLegalIdentifier(""));
    EXPECT_FALSE(isLegalIdentifier("."));
    EXPECT_FALSE(isLegalIdentifier(".."));
}

TEST(PackageIdentifierTest, everyOtherByteIsRefused) {
    int legal = 0;
    for (int byte = 0; byte < 256; ++byte) {
        legal += isLegalIdentifier("a" + std::string(1, static_cast<char>(byte))) ? 1 : 0;
    }
    EXPECT_EQ(legal, 26 + 26 + 10 + 3);
}

TEST(PackageIdentifierTest, theLongestHas255Bytes) {
    EXPECT_TRUE(isLegalIdentifier(std::string(255, 'x')));
    EXPECT_FALSE(isLegalIdentifier(std::string(256, 'x')));
}

}  // namespace

}  // namespace appsync
