#include <cerrno>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

const FileAttributes kMobile{"mobile", "mobile"};

class PlaceholderBundles : public AppsClientFixture {};

TEST_F(PlaceholderBundles, StandInTheDirectoryForTemporaryFiles) {
    EXPECT_EQ(client_->placeholderAppPathForBundleIdentifier("x.y"),
              "/tmp/com.korvu.trd.Apps/x.y.app");
    EXPECT_THAT(platform_.files.names("/tmp"), IsEmpty());
}

TEST_F(PlaceholderBundles, HaveADirectoryOfTheMobileAccount) {
    EXPECT_TRUE(client_->createPlaceHolderPath(kBundle, kA, kMobile));
    EXPECT_EQ(platform_.files.ownership(kBundle), "mobile:mobile");
    EXPECT_TRUE(logged(LogLevel::Default, "Created app directory for 'com.example.a' at " +
                                              kBundle + " with err=(null)"));
    EXPECT_TRUE(client_->createPlaceHolderPath(kBundle, kA, kMobile)) << "when it exists";
    EXPECT_THAT(platform_.transactions.records(), IsEmpty());
}

TEST_F(PlaceholderBundles, RecordADirectoryThatCannotBeMade) {
    platform_.files.failNext(FileOperation::CreateDirectory, kBundle, EROFS);
    EXPECT_FALSE(client_->createPlaceHolderPath(kBundle, kA, kMobile));
    EXPECT_THAT(
        platform_.transactions.records(),
        ElementsAre("Vessik App Restore|0|no|com.example.a|Failed to create app directory"));
    EXPECT_THAT(platform_.messages(),
                ElementsAre(testing::StartsWith("Created app directory for 'com.example.a' at " +
                                                kBundle + " with err=Error Domain=POSIX")));
}

TEST_F(PlaceholderBundles, RecordADirectoryThatCannotBeMadeBeforeTheyLogIt) {
    platform_.files.failNext(FileOperation::CreateDirectory, kBundle, EROFS);
    EXPECT_FALSE(client_->createPlaceHolderPath(kBundle, kA, kMobile));
    EXPECT_THAT(platform_.lines(),
                ElementsAre(HasSubstr("FileSystem.createDirectory("),
                            "InstallTransactionLog.logScenario(Vessik App Restore, 0, no, "
                            "com.example.a, Failed to create app directory)",
                            testing::StartsWith("8 default Created app directory for ")));
}

// writeIconData

class IconData : public PlaceholderBundles {
  protected:
    const Bytes data_{1, 2, 3};
    std::uint64_t size_ = 99;
};

TEST_F(IconData, IsWrittenForTheMobileAccount) {
    EXPECT_TRUE(client_->writeIconData(&data_, "/tmp/Icon.png", &size_, kA, kMobile));
    EXPECT_EQ(size_, 3U);
    EXPECT_EQ(platform_.files.contents("/tmp/Icon.png"), data_);
    EXPECT_EQ(platform_.files.ownership("/tmp/Icon.png"), "mobile:mobile");
    EXPECT_TRUE(logged(LogLevel::Default,
                       "icon data for 'com.example.a' was writen to /tmp/Icon.png with status:1 "
                       "fileSize:3"));
}

TEST_F(IconData, NeedsNobodyWhoAsksForItsSize) {
    EXPECT_TRUE(client_->writeIconData(&data_, "/tmp/Icon.png", nullptr, kA, kMobile));
    EXPECT_EQ(platform_.files.contents("/tmp/Icon.png"), data_);
}

TEST_F(IconData, ThatIsMissingWritesNothing) {
    EXPECT_FALSE(client_->writeIconData(nullptr, "/tmp/Icon.png", &size_, kA, kMobile));
    EXPECT_EQ(size_, 99U);
    EXPECT_THAT(platform_.lines(), ElementsAre("8 error no icon data for 'com.example.a'"));
}

TEST_F(IconData, LeavesTheSizeAloneWhenItIsNotWritten) {
    platform_.files.failNext(FileOperation::CreateFile, "/tmp/Icon.png", ENOSPC);
    EXPECT_FALSE(client_->writeIconData(&data_, "/tmp/Icon.png", &size_, kA, kMobile));
    EXPECT_EQ(size_, 99U);
    EXPECT_TRUE(logged(LogLevel::Default,
                       "icon data for 'com.example.a' was writen to /tmp/Icon.png with status:0 "
                       "fileSize:0"));
}

TEST_F(IconData, LeavesTheSizeAloneWhenItIsNotKnown) {
    platform_.files.failNext(FileOperation::Attributes, "/tmp/Icon.png", EIO);
    EXPECT_TRUE(client_->writeIconData(&data_, "/tmp/Icon.png", &size_, kA, kMobile));
    EXPECT_EQ(size_, 99U);
    EXPECT_THAT(platform_.messages(), Contains(HasSubstr("with status:1 fileSize:0")));
}

}  // namespace
}  // namespace appsync
