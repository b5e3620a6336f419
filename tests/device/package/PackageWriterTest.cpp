#include "device/package/PackageWriter.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>

#include "tests/device/package/PackageFixture.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;
using Code = PackageErrorCode;

class PackageWriterTest : public PackageFixture {
  protected:
    /// The folder of Atlas, ready to be packed.
    void makeAtlas() {
        makeDirectory("atlas/Atlas.app/Resources");
        write("atlas/Atlas.app/Info.plist", atlasInfo());
        write("atlas/Atlas.app/Atlas", "#!/bin/sh\n");
        ::chmod(path("atlas/Atlas.app/Atlas").c_str(), 0700);
        write("atlas/Atlas.app/Resources/text", std::string(100'000, 't'));
        write("atlas/VessikMetadata.plist", "meta");
    }

    Result<PackageInfo> pack(std::string_view folder = "atlas") {
        return writePackage(path(folder), path("out.zip"), propertyLists());
    }

    ::testing::AssertionResult refusedToPack(Code code, std::string_view text) {
        const Result<PackageInfo> info = pack();
        if (info) return ::testing::AssertionFailure() << "it was packed";
        if (fs::exists(path("out.zip"))) return ::testing::AssertionFailure() << "it wrote a file";
        return failedAs(Status(info.error()), code, text);
    }
};

TEST_F(PackageWriterTest, whatItPacksCanBeUnpacked) {
    makeAtlas();
    const Result<PackageInfo> info = pack();
    ASSERT_TRUE(info.ok()) << info.error().description();
    EXPECT_EQ(info->identifier, "com.example.atlas");
    EXPECT_LT(info->packedBytes, 5000U);
    Result<PackageReader> package = PackageReader::open(path("out.zip"), propertyLists());
    ASSERT_TRUE(package.ok());
    makeDirectory("target");
    ASSERT_TRUE(package->unpackInto(openDirectory("target").get()).ok());
    EXPECT_EQ(list("target"), list("atlas"));
    EXPECT_EQ(read("target/Atlas.app/Resources/text"), std::string(100'000, 't'));
    EXPECT_EQ(modeOf("target/Atlas.app/Atlas"), 0755U);
    EXPECT_EQ(modeOf("target/VessikMetadata.plist"), 0644U);
}

TEST_F(PackageWriterTest, theSameFilesGiveTheSamePackage) {
    makeAtlas();
    ASSERT_TRUE(pack().ok());
    const std::string first = read("out.zip");
    fs::last_write_time(path("atlas/Atlas.app/Atlas"), fs::file_time_type());
    ASSERT_TRUE(pack().ok());
    EXPECT_EQ(read("out.zip"), first);
}

TEST_F(PackageWriterTest, theBundleItselfCanBePackedWithItsNeighbour) {
    makeAtlas();
    write("atlas/unrelated", "stays here");
    const Result<PackageInfo> info = pack("atlas/Atlas.app");
    ASSERT_TRUE(info.ok()) << info.error().description();
    EXPECT_EQ(info->bundleDirectoryName, "Atlas.app");
    EXPECT_TRUE(info->hasStoreMetadata);
    fs::remove(path("atlas/VessikMetadata.plist"));
    const Result<PackageInfo> alone = pack("atlas/Atlas.app");
    ASSERT_TRUE(alone.ok()) << alone.error().description();
    EXPECT_FALSE(alone->hasStoreMetadata);
}

TEST_F(PackageWriterTest, leavesNothingBesideThePackage) {
    makeAtlas();
    ASSERT_TRUE(pack().ok());
    fs::remove_all(path("atlas"));
    EXPECT_EQ(list(""), std::vector<std::string>{"out.zip"});
}

TEST_F(PackageWriterTest, linksAreRefused) {
    makeAtlas();
    fs::create_symlink("/etc/passwd", path("atlas/Atlas.app/link"));
    EXPECT_TRUE(refusedToPack(Code::NotAFileOrDirectory, "atlas/Atlas.app/link'"));
}

TEST_F(PackageWriterTest, pipesAreRefusedWithoutWaiting) {
    makeAtlas();
    ASSERT_EQ(::mkfifo(path("atlas/Atlas.app/pipe").c_str(), 0600), 0);
    EXPECT_TRUE(refusedToPack(Code::NotAFileOrDirectory, "pipe"));
}

TEST_F(PackageWriterTest, whatDoesNotBelongIsRefused) {
    makeAtlas();
    write("atlas/README", "x");
    EXPECT_TRUE(refusedToPack(Code::UnexpectedTopLevelEntry, "'README'"));
}

TEST_F(PackageWriterTest, twoBundlesAreRefused) {
    makeAtlas();
    makeDirectory("atlas/Beacon.app");
    EXPECT_TRUE(refusedToPack(Code::SeveralBundles, "Beacon.app"));
}

TEST_F(PackageWriterTest, namesThatAreIllegalInPackagesAreRefused) {
    makeAtlas();
    write("atlas/Atlas.app/back\\slash", "x");
    EXPECT_TRUE(refusedToPack(Code::IllegalName, "back\\slash"));
}

TEST_F(PackageWriterTest, aFailureLeavesTheOldPackage) {
    makeAtlas();
    write("out.zip", "old");
    write("atlas/Atlas.app/Info.plist", "damaged");
    const Result<PackageInfo> info = pack();
    ASSERT_FALSE(info.ok());
    EXPECT_TRUE(isPackageError(info.error(), Code::DamagedInfoPropertyList));
    EXPECT_NE(info.error().description().find("out.zip'"), std::string::npos);
    EXPECT_EQ(read("out.zip"), "old");
    fs::remove_all(path("atlas"));
    EXPECT_EQ(list(""), std::vector<std::string>{"out.zip"});
}

TEST_F(PackageWriterTest, whatIsNoFileIsNotReplaced) {
    makeAtlas();
    ASSERT_EQ(::mkfifo(path("pipe").c_str(), 0600), 0);
    fs::create_symlink(path("elsewhere"), path("link"));
    makeDirectory("directory");
    for (const char* name : {"pipe", "link", "directory"}) {
        const Result<PackageInfo> info = writePackage(path("atlas"), path(name), propertyLists());
        ASSERT_FALSE(info.ok()) << name;
        EXPECT_TRUE(isPackageError(info.error(), Code::NotARegularFile)) << name;
    }
    EXPECT_TRUE(fs::is_fifo(path("pipe")));
    EXPECT_TRUE(fs::is_symlink(path("link")));
}

TEST_F(PackageWriterTest, aMissingFolderIsAnErrorOfTheSystem) {
    const Result<PackageInfo> info = pack("none");
    ASSERT_FALSE(info.ok());
    EXPECT_EQ(info.error().domain, kPosixErrorDomain);
    EXPECT_NE(info.error().description().find("none"), std::string::npos);
}

TEST_F(PackageWriterTest, aPlaceWhereNothingCanBeWrittenIsNamed) {
    makeAtlas();
    const Result<PackageInfo> info =
        writePackage(path("atlas"), path("none/out.zip"), propertyLists());
    ASSERT_FALSE(info.ok());
    EXPECT_NE(info.error().description().find("none"), std::string::npos);
}

}  // namespace

}  // namespace appsync
