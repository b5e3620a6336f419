#include "simulation/DeviceImage.h"

#include <algorithm>
#include <set>

#include "platform/InstallProgressRecord.h"
#include "tests/simulation/SimulationFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::StartsWith;
using testing::UnorderedElementsAre;

constexpr std::uint64_t kSeeds = 200;
constexpr std::uint64_t kProcessEnds = 0;
constexpr std::uint64_t kPowerIsLost = 2;
constexpr const char* kFile = "/var/mobile/Library/a";
constexpr const char* kOther = "/var/mobile/Library/b";
constexpr const char* kPackage = "/var/mobile/Media/PublicStaging/com.example.a.zip";

Bytes bytesOf(std::string_view text) { return {text.begin(), text.end()}; }

class DeviceImageTest : public SimulationFixture {
  protected:
    /// A platform that has taken over what a crash has left.
    struct Reopened {
        Reopened(PropertyListSerialization& codec, const DeviceImage& image) : platform(codec) {
            platform.reopen(image);
        }
        SimulatedPlatform platform;
    };

    [[nodiscard]] std::unique_ptr<Reopened> crash(const CrashRecorder& crashes,
                                                  std::uint64_t seed) {
        return std::make_unique<Reopened>(codec_, crashes.imageOf(seed));
    }

    /// What is found in the file after each of many crashes.
    [[nodiscard]] std::set<std::string> contentsAfter(const CrashRecorder& crashes) {
        std::set<std::string> found;
        for (std::uint64_t seed = 0; seed < kSeeds; ++seed) {
            found.insert(crash(crashes, seed)->platform.files.text(kFile).value_or("(none)"));
        }
        return found;
    }

    SimulatedFileSystem& files_ = platform_.files;
};

TEST_F(DeviceImageTest, AnAtomicWriteLeavesTheOldFileOrTheNewOne) {
    files_.addFile(kFile, "old");
    const CrashRecorder crashes(platform_);
    ASSERT_TRUE(files_.writeFileAtomically(kFile, bytesOf("new and longer")));
    EXPECT_THAT(contentsAfter(crashes), UnorderedElementsAre("old", "new and longer"));
}

TEST_F(DeviceImageTest, AnyOtherWriteMayBeTorn) {
    const CrashRecorder crashes(platform_);
    ASSERT_TRUE(files_.createFile(kFile, bytesOf("whole"), {}));
    const std::set<std::string> found = contentsAfter(crashes);
    EXPECT_TRUE(found.contains("(none)"));
    EXPECT_TRUE(found.contains("whole"));
    EXPECT_TRUE(found.contains(""));
    EXPECT_TRUE(found.contains("who"));
    EXPECT_TRUE(found.contains(std::string("wh\0\0\0", 5)));
}

TEST_F(DeviceImageTest, TheEndOfTheProcessLosesNothing) {
    const CrashRecorder crashes(platform_);
    ASSERT_TRUE(files_.createFile(kFile, bytesOf("whole"), {}));
    ASSERT_TRUE(files_.removeItem("/var/mobile/Media/PublicStaging"));
    const auto after = crash(crashes, kProcessEnds);
    EXPECT_EQ(after->platform.files.text(kFile), "whole");
    EXPECT_FALSE(after->platform.files.exists("/var/mobile/Media/PublicStaging"));
}

TEST_F(DeviceImageTest, WhatWasSyncedStays) {
    const CrashRecorder crashes(platform_);
    ASSERT_TRUE(files_.createFile(kFile, bytesOf("whole"), {}));
    files_.sync();
    EXPECT_THAT(contentsAfter(crashes), ElementsAre("whole"));
}

TEST_F(DeviceImageTest, WhatCameLaterMayStayAlone) {
    const CrashRecorder crashes(platform_);
    ASSERT_TRUE(files_.writeFileAtomically(kFile, bytesOf("1")));
    ASSERT_TRUE(files_.writeFileAtomically(kOther, bytesOf("2")));
    std::size_t alone = 0;
    for (std::uint64_t seed = 0; seed < kSeeds; ++seed) {
        const auto after = crash(crashes, seed);
        if (after->platform.files.exists(kOther) && !after->platform.files.exists(kFile)) ++alone;
    }
    EXPECT_GT(alone, 0U);
}

TEST_F(DeviceImageTest, WhatIsMovedIsInOneOfTheTwoPlaces) {
    files_.addFile(kFile, "moved");
    const CrashRecorder crashes(platform_);
    ASSERT_TRUE(files_.moveItem(kFile, kOther));
    ASSERT_TRUE(files_.moveItem(kOther, "/var/mobile/Library/c"));
    for (std::uint64_t seed = 0; seed < kSeeds; ++seed) {
        const auto after = crash(crashes, seed);
        const int places = int{after->platform.files.exists(kFile)} +
                           int{after->platform.files.exists(kOther)} +
                           int{after->platform.files.exists("/var/mobile/Library/c")};
        EXPECT_EQ(places, 1) << seed;
    }
}

TEST_F(DeviceImageTest, OfARemovedDirectoryAPartMayStay) {
    files_.addFile("/var/mobile/Library/d/one", "1");
    files_.addFile("/var/mobile/Library/d/two", "2");
    const CrashRecorder crashes(platform_);
    ASSERT_TRUE(files_.removeItem("/var/mobile/Library/d"));
    std::set<std::size_t> left;
    for (std::uint64_t seed = 0; seed < kSeeds; ++seed) {
        left.insert(crash(crashes, seed)->platform.files.paths("/var/mobile/Library/d").size());
    }
    EXPECT_THAT(left, ElementsAre(0, 1, 2));
}

TEST_F(DeviceImageTest, ATemporaryFileMayStayAndIsClearedWhereThePlugInWrites) {
    const std::string workArea = "/var/mobile/Library/ApplicationSync";
    files_.addDirectory(workArea);
    const CrashRecorder crashes(platform_);
    ASSERT_TRUE(files_.writeFileAtomically(workArea + "/list", bytesOf("1")));
    ASSERT_TRUE(files_.writeFileAtomically(kFile, bytesOf("1")));
    bool stays = false;
    for (std::uint64_t seed = 0; seed < kSeeds; ++seed) {
        const auto after = crash(crashes, seed);
        for (const std::string& name : after->platform.files.names("/var/mobile/Library")) {
            stays = stays || name.starts_with(".a.appsync-");
        }
        EXPECT_THAT(after->platform.files.names(workArea),
                    testing::Not(Contains(StartsWith(".list"))));
    }
    EXPECT_TRUE(stays);
}

TEST_F(DeviceImageTest, ACrashIsTheSameForTheSameSeed) {
    const CrashRecorder crashes(platform_);
    for (const char* name : {"a", "b", "c", "d"}) {
        ASSERT_TRUE(
            files_.createFile(std::string("/var/mobile/Library/") + name, bytesOf("contents"), {}));
    }
    for (std::uint64_t seed = 0; seed < 20; ++seed) {
        const auto one = crash(crashes, seed);
        const auto other = crash(crashes, seed);
        ASSERT_EQ(one->platform.files.paths(), other->platform.files.paths());
        for (const std::string& path : one->platform.files.paths()) {
            EXPECT_EQ(one->platform.files.text(path), other->platform.files.text(path));
        }
    }
}

TEST_F(DeviceImageTest, TheRunGoesOnAndTheImageStays) {
    const CrashRecorder crashes(platform_);
    ASSERT_TRUE(files_.writeFileAtomically(kFile, bytesOf("1")));
    const DeviceImage image = crashes.imageOf(kProcessEnds);
    ASSERT_TRUE(files_.writeFileAtomically(kFile, bytesOf("2")));
    const Reopened after(codec_, image);
    EXPECT_EQ(after.platform.files.text(kFile), "1");
    EXPECT_EQ(files_.text(kFile), "2");
}

TEST_F(DeviceImageTest, AnInstallIsOnDiskWithEverythingThatWasThere) {
    const CrashRecorder crashes(platform_);
    ASSERT_TRUE(files_.createFile(kFile, bytesOf("whole"), {}));
    ASSERT_TRUE(files_.createFile(kPackage, bytesOf("package"), {}));
    const auto package = FileURL::fromPath(kPackage, false);
    ASSERT_TRUE(platform_.registry.installPackage(
        *package,
        PropertyList::map({{PackageTypeKey, PackageTypeCustomer}, {BundleIdentifierKey, kA}})));
    for (std::uint64_t seed = 0; seed < kSeeds; ++seed) {
        const auto after = crash(crashes, seed);
        EXPECT_TRUE(after->platform.registry.installed(kA)) << seed;
        EXPECT_EQ(after->platform.files.text(kFile), "whole") << seed;
    }
}

TEST_F(DeviceImageTest, ARemovalIsOnDiskAndItsFilesAreNot) {
    platform_.registry.addApplication(kA);
    const CrashRecorder crashes(platform_);
    ASSERT_TRUE(platform_.registry.uninstallApplication(kA, {}));
    for (std::uint64_t seed = 0; seed < kSeeds; ++seed) {
        const auto after = crash(crashes, seed);
        EXPECT_FALSE(after->platform.registry.installed(kA));
        EXPECT_THAT(after->platform.files.paths("/var/containers/Bundle/Application"), IsEmpty());
    }
}

TEST_F(DeviceImageTest, PowerTakesThePlaceholderOfASyncAndTheProcessDoesNot) {
    platform_.coordination.setEnabled(true);
    const CrashRecorder crashes(platform_);
    auto found = platform_.coordination.coordinator(
        CoordinatorKind::Initiating, kA, SyncClientID,
        InstallCoordinatorService::Creation::CreateIfNotExisting);
    const auto placeholder =
        platform_.coordination.makeAppPlaceholder("A", kA, kInstallTypeSync, SyncClientID);
    ASSERT_TRUE(placeholder->setConfigurationComplete());
    ASSERT_TRUE(found.coordinator->setPlaceholderPromise(placeholder));
    const auto before = crash(crashes, kProcessEnds);
    EXPECT_FALSE(before->platform.coordination.state(kA)->placeholder);
    platform_.runUntilIdle();

    const auto killed = crash(crashes, kProcessEnds);
    EXPECT_TRUE(killed->platform.registry.placeholder(kA));
    EXPECT_TRUE(killed->platform.coordination.state(kA)->placeholderShown);
    const auto dark = crash(crashes, kPowerIsLost);
    EXPECT_FALSE(dark->platform.registry.placeholder(kA));
    EXPECT_EQ(dark->platform.coordination.state(kA), nullptr);
}

TEST_F(DeviceImageTest, TheEndOfTheProcessMayTakeWhatNoServiceHasCommitted) {
    platform_.coordination.setEnabled(true);
    const CrashRecorder crashes(platform_);
    auto found = platform_.coordination.coordinator(
        CoordinatorKind::Initiating, kA, SyncClientID,
        InstallCoordinatorService::Creation::CreateIfNotExisting);
    ASSERT_TRUE(found.coordinator->setInitialODRAssetPromises({}));
    const auto whole = crash(crashes, 0);
    EXPECT_TRUE(whole->platform.coordination.state(kA)->initialODRAssets);
    const auto cut = crash(crashes, 1);
    ASSERT_NE(cut->platform.coordination.state(kA), nullptr);
    EXPECT_FALSE(cut->platform.coordination.state(kA)->initialODRAssets);
}

}  // namespace
}  // namespace appsync
