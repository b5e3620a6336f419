#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <filesystem>

#include "platform/Error.h"
#include "tests/device/package/PackageFixture.h"

namespace appsync {

namespace {

using Code = PackageErrorCode;
using PackageUnpackTest = PackageFixture;

std::string noise(std::size_t size) {
    std::string bytes(size, '\0');
    std::uint32_t state = 1;
    for (char& byte : bytes) {
        state = state * 1664525U + 1013904223U;
        byte = static_cast<char>(state >> 24U);
    }
    return bytes;
}

TEST_F(PackageUnpackTest, unpacksEverything) {
    ASSERT_TRUE(
        unpack(atlasWith({zipFile("VessikMetadata.plist", "meta"),
                          zipFile("Atlas.app/Resources/deep/er/x", "deep"),
                          zipFile("Atlas.app/Resources/y", "y"), zipDirectory("Atlas.app/Empty/")}))
            .ok());
    EXPECT_EQ(
        list("target"),
        (std::vector<std::string>{
            "Atlas.app/", "Atlas.app/Atlas", "Atlas.app/Empty/", "Atlas.app/Info.plist",
            "Atlas.app/Resources/", "Atlas.app/Resources/deep/", "Atlas.app/Resources/deep/er/",
            "Atlas.app/Resources/deep/er/x", "Atlas.app/Resources/y", "VessikMetadata.plist"}));
    EXPECT_EQ(read("target/Atlas.app/Resources/deep/er/x"), "deep");
    EXPECT_EQ(read("target/Atlas.app/Info.plist"), atlasInfo());
}

TEST_F(PackageUnpackTest, namesThatBeginAlikeStayApart) {
    ASSERT_TRUE(unpack(atlasWith({zipFile("Atlas.app/a.b/x", "1"), zipFile("Atlas.app/a/x", "2"),
                                  zipFile("Atlas.app/ab/x", "3"), zipFile("Atlas.app/a!", "4")}))
                    .ok());
    EXPECT_EQ(read("target/Atlas.app/a.b/x"), "1");
    EXPECT_EQ(read("target/Atlas.app/a/x"), "2");
    EXPECT_EQ(read("target/Atlas.app/ab/x"), "3");
    EXPECT_EQ(read("target/Atlas.app/a!"), "4");
}

TEST_F(PackageUnpackTest, unpacksWhatIsDeflated) {
    ASSERT_TRUE(unpack(atlasWith({zipZeros("Atlas.app/zeros", 2'000'000)})).ok());
    EXPECT_EQ(read("target/Atlas.app/zeros"), std::string(2'000'000, '\0'));
}

TEST_F(PackageUnpackTest, namesMayHoldAnyLetter) {
    ASSERT_TRUE(unpack(atlasWith({zipFile("Atlas.app/Gr\xc3\xbc\xc3\x9f"
                                          "e",
                                          "x")}))
                    .ok());
    EXPECT_EQ(read("target/Atlas.app/Gr\xc3\xbc\xc3\x9f"
                   "e"),
              "x");
}

TEST_F(PackageUnpackTest, dropsDangerousModeBits) {
    ASSERT_TRUE(
        unpack(atlasWith({zipOfMode("Atlas.app/setuid", S_IFREG | 06777),
                          zipOfMode("Atlas.app/readonly", S_IFREG | 0444),
                          zipOfMode("Atlas.app/nothing", S_IFREG), zipOfMode("Atlas.app/unsaid", 0),
                          zipOfMode("Atlas.app/open/", S_IFDIR | 03777),
                          zipOfMode("Atlas.app/shut/", S_IFDIR | 0055)}))
            .ok());
    EXPECT_EQ(modeOf("target/Atlas.app/Atlas"), 0755U);
    EXPECT_EQ(modeOf("target/Atlas.app/setuid"), 0755U);
    EXPECT_EQ(modeOf("target/Atlas.app/readonly"), 0444U);
    EXPECT_EQ(modeOf("target/Atlas.app/nothing"), 0400U);
    EXPECT_EQ(modeOf("target/Atlas.app/unsaid"), 0644U);
    EXPECT_EQ(modeOf("target/Atlas.app/open"), 0755U);
    EXPECT_EQ(modeOf("target/Atlas.app/shut"), 0755U);
}

TEST_F(PackageUnpackTest, modesDoNotDependOnTheUmask) {
    const mode_t before = ::umask(077);
    const Status status = unpack(atlasWith({zipFile("Atlas.app/x/y", "x")}));
    ::umask(before);
    ASSERT_TRUE(status.ok());
    EXPECT_EQ(modeOf("target/Atlas.app/x"), 0755U);
    EXPECT_EQ(modeOf("target/Atlas.app/x/y"), 0644U);
}

TEST_F(PackageUnpackTest, aWrongCrcIsAFailure) {
    ZipEntry entry = zipFile("Atlas.app/x", "contents");
    entry.crc = 7;
    EXPECT_TRUE(failedAs(unpack(atlasWith({entry})), Code::DamagedEntry, "'Atlas.app/x'"));
}

TEST_F(PackageUnpackTest, whatCannotBeUnpackedIsFoundByReadingItToo) {
    EXPECT_TRUE(open(atlasWith({zipFile("Atlas.app/x", "contents")}))->verify().ok());
    ZipEntry entry = zipFile("Atlas.app/x", "contents");
    entry.crc = 7;
    Result<PackageReader> package = open(atlasWith({entry}));
    ASSERT_TRUE(package.ok());
    const Status verified = package->verify();
    EXPECT_TRUE(failedAs(verified, Code::DamagedEntry, "'Atlas.app/x'"));
    EXPECT_EQ(verified.error().description(), unpack(atlasWith({entry})).error().description());
}

TEST_F(PackageUnpackTest, aWrongCrcOfAnEmptyFileIsRefusedWhenOpening) {
    ZipEntry entry = zipFile("Atlas.app/x", "");
    entry.crc = 7;
    EXPECT_TRUE(refused(open(atlasWith({entry})), Code::DamagedEntry, "'Atlas.app/x'"));
}

TEST_F(PackageUnpackTest, aWrongCrcOfTheInfoIsRefusedWhenOpening) {
    ZipEntry info = zipFile("Atlas.app/Info.plist", atlasInfo());
    info.crc = 7;
    EXPECT_TRUE(refused(open(ZipBuilder().add(info)), Code::DamagedEntry, "Info.plist"));
}

TEST_F(PackageUnpackTest, damagedCompressionIsAFailure) {
    ZipEntry entry = zipZeros("Atlas.app/x", 1000);
    entry.packed = noise(entry.packed->size());
    EXPECT_TRUE(failedAs(unpack(atlasWith({entry})), Code::DamagedEntry, "'Atlas.app/x'"));
}

TEST_F(PackageUnpackTest, moreContentsThanClaimedAreNotWritten) {
    ZipEntry entry = zipZeros("Atlas.app/x", 3'000'000);
    entry.size = 1000;
    EXPECT_TRUE(failedAs(unpack(atlasWith({entry})), Code::DamagedEntry, "more bytes"));
    EXPECT_LE(read("target/Atlas.app/x").size(), 1000U);
}

TEST_F(PackageUnpackTest, fewerContentsThanClaimedAreAFailure) {
    ZipEntry entry = zipZeros("Atlas.app/x", 1000);
    entry.size = 2000;
    EXPECT_TRUE(failedAs(unpack(atlasWith({entry})), Code::DamagedEntry, "'Atlas.app/x'"));
}

TEST_F(PackageUnpackTest, aPackageThatShrinksMeanwhileIsAFailure) {
    Result<PackageReader> package = open(atlasWith({zipFile("Atlas.app/x", noise(1'000'000))}));
    ASSERT_TRUE(package.ok());
    std::filesystem::resize_file(path("app.zip"), 1000);
    makeDirectory("target");
    EXPECT_FALSE(package->unpackInto(openDirectory("target").get()).ok());
}

TEST_F(PackageUnpackTest, whatStandsThereIsNotReplaced) {
    makeDirectory("target/Atlas.app");
    const Status status = unpack(atlasWith({}));
    ASSERT_FALSE(status.ok());
    EXPECT_EQ(status.error().domain, kPosixErrorDomain);
    EXPECT_EQ(status.error().code, EEXIST);
    EXPECT_TRUE(list("target/Atlas.app").empty());
}

TEST_F(PackageUnpackTest, linksThatStandThereAreNotFollowed) {
    makeDirectory("target");
    makeDirectory("elsewhere");
    std::filesystem::create_symlink(path("elsewhere"), path("target/Atlas.app"));
    EXPECT_FALSE(unpack(atlasWith({})).ok());
    EXPECT_TRUE(list("elsewhere").empty());
}

TEST_F(PackageUnpackTest, progressComesInPiecesAndEndsAtTheTotal) {
    std::vector<std::uint64_t> seen;
    PackageUnpackOptions options;
    options.progress = [&seen](std::uint64_t done, std::uint64_t total) {
        EXPECT_LE(done, total);
        seen.push_back(done);
        return true;
    };
    ASSERT_TRUE(unpack(atlasWith({zipFile("Atlas.app/x", noise(1'000'000))}), options).ok());
    EXPECT_TRUE(std::is_sorted(seen.begin(), seen.end()));
    EXPECT_GE(seen.size(), 4U);
    EXPECT_EQ(seen.back(), 1'000'000U + atlasInfo().size() + 10);
}

TEST_F(PackageUnpackTest, canBeCancelled) {
    PackageUnpackOptions options;
    options.progress = [](std::uint64_t done, std::uint64_t /*total*/) { return done < 300'000; };
    const Status status = unpack(atlasWith({zipFile("Atlas.app/x", noise(1'000'000))}), options);
    EXPECT_TRUE(failedAs(status, Code::Cancelled));
}

TEST_F(PackageUnpackTest, everyFileIsHandedOverWholeAndWithItsMode) {
    std::vector<off_t> sizes;
    PackageUnpackOptions options;
    options.fileWritten = [&sizes](int descriptor) {
        struct stat status = {};
        EXPECT_EQ(::fstat(descriptor, &status), 0);
        EXPECT_NE(status.st_mode & 0444U, 0U);
        sizes.push_back(status.st_size);
        return Status();
    };
    ASSERT_TRUE(unpack(atlasWith({zipFile("Atlas.app/x", noise(700'000))}), options).ok());
    EXPECT_EQ(sizes, (std::vector<off_t>{10, static_cast<off_t>(atlasInfo().size()), 700'000}));
}

TEST_F(PackageUnpackTest, aFileThatIsNotTakenStopsIt) {
    PackageUnpackOptions options;
    options.fileWritten = [](int) {
        return Status(ErrorRecord::make(kPosixErrorDomain, EIO, "cannot sync"));
    };
    const Status status = unpack(atlasWith({}), options);
    ASSERT_FALSE(status.ok());
    EXPECT_EQ(status.error().code, EIO);
    EXPECT_EQ(status.error().description(), "cannot sync");
}

std::string nested(int depth) {
    std::string name;
    for (int i = 0; i < depth; ++i) name += "d/";
    return name;
}

/// The deepest name that there is room for, of 1,024 bytes, and others on the way to it.
std::vector<ZipEntry> deepEntries() {
    return {zipFile("Atlas.app/" + nested(506) + "xx", "deepest"),
            zipFile("Atlas.app/" + nested(480) + "e/x", "deep"),
            zipFile("Atlas.app/" + nested(40) + "f/g/x", "40"),
            zipFile("Atlas.app/" + nested(40) + "h", "beside")};
}

class PackageDepthTest : public PackageFixture {
  protected:
    void expectAllUnpacked() {
        for (const ZipEntry& entry : deepEntries()) {
            EXPECT_EQ(read("target/" + entry.name), entry.contents) << entry.name.size();
        }
    }

    /// In a process of its own, as the limit stays.
    [[noreturn]] void unpackWithFewFilesOpen() {
        Result<PackageReader> package = open(atlasWith(deepEntries()));
        makeDirectory("target");
        const rlimit limit = {.rlim_cur = 64, .rlim_max = 64};
        ::setrlimit(RLIMIT_NOFILE, &limit);
        ::_exit(package->unpackInto(openDirectory("target").get()).ok() ? 0 : 1);
    }
};

TEST_F(PackageDepthTest, isBoundedByTheLengthOfNamesAlone) {
    ASSERT_EQ(deepEntries().front().name.size(), 1024U);
    const Status status = unpack(atlasWith(deepEntries()));
    ASSERT_TRUE(status.ok()) << status.error().description();
    expectAllUnpacked();
}

TEST_F(PackageDepthTest, needsFewOpenFiles) {
    EXPECT_EXIT(unpackWithFewFilesOpen(), ::testing::ExitedWithCode(0), "");
    expectAllUnpacked();
}

TEST_F(PackageDepthTest, aLinkThatStandsThereDeepDownIsNotFollowed) {
    const std::string middle = "Atlas.app/" + nested(200);
    makeDirectory("elsewhere");
    Result<PackageReader> package = open(atlasWith(deepEntries()));
    makeDirectory("target");
    PackageUnpackOptions options;
    // After the deepest file the way back up has been closed; somebody puts a link into it.
    options.fileWritten = [&](int) {
        const std::string place = path("target/" + middle);
        if (!std::filesystem::exists(place)) return Status();
        const std::string link = place.substr(0, place.size() - 1);
        if (std::filesystem::is_symlink(link)) return Status();
        std::filesystem::rename(link, path("moved"));
        std::filesystem::create_symlink(path("elsewhere"), link);
        return Status();
    };
    EXPECT_FALSE(package->unpackInto(openDirectory("target").get(), options).ok());
    EXPECT_TRUE(list("elsewhere").empty());
}

class PackageFailingWriteTest : public PackageFixture {
  protected:
    /// In a process of its own, as the limit stays: whether unpacking fails as it should.
    [[noreturn]] void unpackUnderFileSizeLimit() {
        ::signal(SIGXFSZ, SIG_IGN);
        Result<PackageReader> package = open(atlasWith({zipFile("Atlas.app/x", noise(1'000'000))}));
        makeDirectory("target");
        const rlimit limit = {.rlim_cur = 300'000, .rlim_max = 300'000};
        ::setrlimit(RLIMIT_FSIZE, &limit);
        const Status status = package->unpackInto(openDirectory("target").get());
        const bool right = !status && status.error().domain == kPosixErrorDomain &&
                           status.error().code == EFBIG &&
                           status.error().description().find("Atlas.app/x") != std::string::npos;
        ::_exit(right ? 0 : 1);
    }
};

TEST_F(PackageFailingWriteTest, isAnErrorOfTheSystemThatNamesTheFile) {
    EXPECT_EXIT(unpackUnderFileSizeLimit(), ::testing::ExitedWithCode(0), "");
}

TEST_F(PackageUnpackTest, aDirectoryDeepInTheTreeIsLeftAndEnteredAgain) {
    std::vector<ZipEntry> entries;
    for (const char* name : {"b/b/1", "a/b/c/2", "a/3", "b/4", "a/b/c/d/e/5", "a/b/6", "7"}) {
        entries.push_back(zipFile("Atlas.app/" + std::string(name), name));
    }
    ASSERT_TRUE(unpack(atlasWith(entries)).ok());
    for (const char* name : {"b/b/1", "a/b/c/2", "a/3", "b/4", "a/b/c/d/e/5", "a/b/6", "7"}) {
        EXPECT_EQ(read("target/Atlas.app/" + std::string(name)), name);
    }
}

}  // namespace

}  // namespace appsync
