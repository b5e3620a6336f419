#include "device/values/PackageIdentifier.h"

#include <gtest/gtest.h>

#include <optional>
#include <set>
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

TEST(PackageIdentifierTest, anArchiveIsNamedByItsIdentifier) {
    EXPECT_EQ(archiveNameOf("com.example.atlas"), "com.example.atlas.zip");
    EXPECT_EQ(identifierOfArchive("com.example.atlas.zip"), "com.example.atlas");
    EXPECT_EQ(identifierOfArchive("a.zip.zip"), "a.zip");
}

TEST(PackageIdentifierTest, theArchiveOfALongIdentifierHasANameThatAFileCanHave) {
    std::set<std::string> names;
    for (const std::size_t length : {247U, 248U, 250U, 251U, 252U, 254U, 255U}) {
        const std::string plain(length, 'x');
        const std::string ending = std::string(length - 4, 'x') + ".zip";
        for (const std::string& identifier : {plain, ending}) {
            const std::string name = archiveNameOf(identifier);
            EXPECT_LE(name.size(), 255U);
            EXPECT_EQ(identifierOfArchive(name), identifier);
            EXPECT_TRUE(names.insert(name).second) << "two share the name " << name;
        }
    }
    EXPECT_EQ(archiveNameOf(std::string(251, 'x')), std::string(251, 'x') + ".zip");
    EXPECT_EQ(archiveNameOf(std::string(252, 'x')), std::string(252, 'x'));
}

TEST(PackageIdentifierTest, noIdentifiersArchiveIsNamedOtherwise) {
    for (const char* name : {"", ".zip", "..zip", "...zip", "a", "a~zip", "~zip", "a b.zip",
                             "a/b.zip", "ApplicationSync", "a.part"}) {
        EXPECT_EQ(identifierOfArchive(name), std::nullopt) << name;
    }
    EXPECT_EQ(identifierOfArchive(std::string(252, 'x') + ".zip"), std::nullopt);
    EXPECT_EQ(identifierOfArchive(std::string(256, 'x')), std::nullopt);
}

}  // namespace

}  // namespace appsync
