#include "host/plan/Library.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace appsync {
namespace {

LibraryPackage package(const char* identifier, const char* version, const char* file) {
    return {identifier, version, "", file, 0, 0};
}

TEST(Library, KeepsTheHighestOfSeveralVersionsAndNamesTheOthers) {
    std::vector<std::string> notes;
    const auto kept =
        keepHighestVersions({package("com.a", "1.9", "a-1.9.zip"), package("com.b", "1", "b.zip"),
                             package("com.a", "1.10", "a-1.10.zip")},
                            notes);
    ASSERT_EQ(kept.size(), 2U);
    EXPECT_EQ(kept[0].file, "a-1.10.zip");
    EXPECT_EQ(kept[1].file, "b.zip");
    EXPECT_THAT(notes, testing::ElementsAre("a-1.9.zip is left out: it holds com.a 1.9, and "
                                            "a-1.10.zip 1.10"));
}

TEST(Library, KeepsTheFirstFileOfEqualVersions) {
    std::vector<std::string> notes;
    const auto kept = keepHighestVersions(
        {package("com.a", "2.0", "z.zip"), package("com.a", "2", "b.zip")}, notes);
    ASSERT_EQ(kept.size(), 1U);
    EXPECT_EQ(kept[0].file, "b.zip");
}

TEST(Library, FindsAPackageByItsWholeIdentifier) {
    Library library;
    library.packages = {package("com.a", "1", "a"), package("com.b", "1", "b")};
    ASSERT_NE(library.find("com.b"), nullptr);
    EXPECT_EQ(library.find("com.b")->file, "b");
    EXPECT_EQ(library.find("com"), nullptr);
    EXPECT_EQ(library.find("com.c"), nullptr);
}

}  // namespace
}  // namespace appsync
