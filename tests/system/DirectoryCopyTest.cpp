#include <gmock/gmock.h>

#include <cerrno>
#include <filesystem>
#include <string>

#include "tests/system/DeviceFilesTest.h"

namespace appsync {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

/// Whole directories of a device: what is in them, and copies of them.
class DirectoryCopyTest : public device_files::DeviceFilesTest {
  protected:
    DirectoryCopyTest() {
        put("/from/Info.plist", "info");
        put("/from/deep/er/icon", "icon");
        put("/from/deep/text", "text");
    }
};

TEST_F(DirectoryCopyTest, NamesAreSorted) {
    const auto found = files_->names("/from");
    ASSERT_TRUE(found);
    EXPECT_THAT(*found, ElementsAre("Info.plist", "deep"));
}

TEST_F(DirectoryCopyTest, OnlyADirectoryHasNames) {
    EXPECT_EQ(files_->names("/absent").error().code, ENOENT);
    EXPECT_EQ(files_->names("/from/Info.plist").error().code, ENOTDIR);
    EXPECT_EQ(files_->names("").error().code, EINVAL);
}

TEST_F(DirectoryCopyTest, ACopyHoldsEverything) {
    ASSERT_TRUE(files_->copyDirectory("/from", "/to"));
    EXPECT_EQ(contents("/to/Info.plist"), "info");
    EXPECT_EQ(contents("/to/deep/er/icon"), "icon");
    EXPECT_EQ(contents("/to/deep/text"), "text");
    EXPECT_EQ(contents("/from/deep/er/icon"), "icon");
}

TEST_F(DirectoryCopyTest, NothingIsReplaced) {
    put("/to/other", "other");
    EXPECT_EQ(files_->copyDirectory("/from", "/to").error().code, EEXIST);
    EXPECT_THAT(names("/to"), ElementsAre("other"));
}

TEST_F(DirectoryCopyTest, WithoutASourceNothingIsMade) {
    EXPECT_EQ(files_->copyDirectory("/absent", "/to").error().code, ENOENT);
    EXPECT_EQ(files_->copyDirectory("/from/Info.plist", "/to").error().code, ENOTDIR);
    EXPECT_THAT(names("/"), ElementsAre("from", "tmp"));
}

TEST_F(DirectoryCopyTest, ALinkIsRefusedAndNothingIsLeft) {
    link("/from/deep/link", outside() / "file");
    const Status copied = files_->copyDirectory("/from", "/to");
    ASSERT_FALSE(copied);
    EXPECT_EQ(copied.error().code, EINVAL);
    EXPECT_THAT(copied.error().description(), HasSubstr("/from/deep/link"));
    EXPECT_THAT(names("/"), ElementsAre("from", "tmp"));
}

TEST_F(DirectoryCopyTest, APipeIsRefusedWithoutWaiting) {
    pipe("/from/pipe");
    EXPECT_EQ(files_->copyDirectory("/from", "/to").error().code, EINVAL);
}

TEST_F(DirectoryCopyTest, ADirectoryIsNotCopiedIntoItself) {
    EXPECT_EQ(files_->copyDirectory("/from", "/from/deep/copy").error().code, EINVAL);
    EXPECT_EQ(files_->copyDirectory("/from/", "/from/copy").error().code, EINVAL);
    EXPECT_THAT(names("/from"), ElementsAre("Info.plist", "deep"));
    EXPECT_TRUE(files_->copyDirectory("/from", "/from2")) << "a name that only begins so";
}

TEST_F(DirectoryCopyTest, NothingLeadsOutsideTheRoot) {
    EXPECT_TRUE(files_->copyDirectory("/../from", "/../to"));
    EXPECT_EQ(contents("/to/deep/text"), "text");
    EXPECT_EQ(files_->copyDirectory("/from", "/tmp/../elsewhere").error().code, EACCES);
    EXPECT_TRUE(outsideIsUntouched());
}

}  // namespace
}  // namespace appsync
