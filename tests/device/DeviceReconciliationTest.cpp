#include <filesystem>
#include <fstream>

#include "device/Containers.h"
#include "device/DevicePaths.h"
#include "tests/device/DevicePlatformFixture.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr const char* kAtlas = "com.example.atlas";
constexpr const char* kBrook = "com.example.brook";

class DeviceReconciliationTest : public DevicePlatformFixture {
  protected:
    /// Ends the session, and begins another one after `between` has changed the device.
    template <typename Between>
    void reopenAfter(Between between) {
        endSession();
        between();
        static_cast<void>(device());
    }
};

TEST_F(DeviceReconciliationTest, aContainerThatNoRecordNamesIsRemoved) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    reopenAfter([&] {
        fs::create_directories(rootPath(Containers::pathOf("HALF-UNPACKED/App.app/deep")));
        write(Containers::pathOf("HALF-UNPACKED/App.app/part"), "bytes");
    });
    EXPECT_EQ(containers().size(), 1U);
    EXPECT_EQ(read(application(kAtlas)->bundlePath + "/main"), "program 1.0");
    EXPECT_TRUE(device().repairs().empty());
}

TEST_F(DeviceReconciliationTest, aLookRemovesNothing) {
    endSession();
    fs::create_directory(rootPath(Containers::pathOf("STRAY")));
    static_cast<void>(look());
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DeviceReconciliationTest, anApplicationWhoseBundleIsGoneIsReportedAndForgotten) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(install(kBrook)));
    const std::string container = application(kAtlas)->bundleContainerPath;
    reopenAfter([&] { fs::remove_all(rootPath(container)); });
    EXPECT_FALSE(application(kAtlas));
    EXPECT_TRUE(application(kBrook));
    ASSERT_EQ(device().repairs().size(), 1U);
    EXPECT_NE(device().repairs()[0].find(kAtlas), std::string::npos);
    EXPECT_EQ(device().history()->back().identifier, kAtlas);
    EXPECT_FALSE(device().history()->back().success);
}

TEST_F(DeviceReconciliationTest, aPlaceholderWhoseBundleIsGoneIsForgotten) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    const std::string container = either(kAtlas)->bundleContainerPath;
    reopenAfter([&] { fs::remove_all(rootPath(container)); });
    EXPECT_FALSE(either(kAtlas));
    EXPECT_EQ(number("SELECT count(*) FROM progress"), 0);
    EXPECT_TRUE(device().repairs().empty());
}

TEST_F(DeviceReconciliationTest, theOldContainerOfAnInterruptedUpdateIsRemoved) {
    ASSERT_TRUE(succeeded(install(kAtlas, "2.0")));
    const std::string current = application(kAtlas)->bundleContainerPath;
    reopenAfter([&] {
        fs::copy(rootPath(current), rootPath(Containers::pathOf("OLD-VERSION")),
                 fs::copy_options::recursive);
    });
    EXPECT_EQ(application(kAtlas)->bundleContainerPath, current);
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DeviceReconciliationTest, packagesAndTemporaryFilesOfAnInterruptedSessionAreCleared) {
    const std::string staging(kPublicStagingDirectory);
    const std::string work(kWorkAreaDirectory);
    reopenAfter([&] {
        fs::create_directories(rootPath(staging + "/ApplicationSync"));
        fs::create_directories(rootPath(work));
        fs::create_directories(rootPath(std::string(kTemporaryDirectory) + "/left/over"));
        write(staging + "/com.example.atlas.zip", "half a package");
        write(work + "/.RestoreState.plist.appsync-abc123", "half a list");
        write(work + "/RestoreState.plist", "a list");
    });
    EXPECT_FALSE(exists(staging + "/com.example.atlas.zip"));
    EXPECT_TRUE(exists(staging + "/ApplicationSync"));
    EXPECT_FALSE(exists(work + "/.RestoreState.plist.appsync-abc123"));
    EXPECT_TRUE(exists(work + "/RestoreState.plist"));
    EXPECT_TRUE(fs::is_empty(rootPath(kTemporaryDirectory)));
}

TEST_F(DeviceReconciliationTest, aPackageThatWaitsForItsDataStays) {
    const std::string package = stagePackage(kAtlas);
    const std::string other = stagePackage(kBrook);
    ASSERT_TRUE(succeeded(device().setRestoreDataExpected(kAtlas, true)));
    reopenAfter([] {});
    EXPECT_TRUE(exists(package));
    EXPECT_FALSE(exists(other));
}

TEST_F(DeviceReconciliationTest, whatWasAtWorkWaitsAgain) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas, kInstallTypeRestore)));
    ASSERT_TRUE(succeeded(installPlaceholder(kBrook, kInstallTypeRestore)));
    progressOf(kAtlas)->setInstallState(kInstallStateActive);
    progressOf(kAtlas)->setInstallPhase(kInstallPhaseInstalling);
    progressOf(kBrook)->setInstallState(kInstallStateFailed);
    progressOf(kBrook)->setInstallPhase(kInstallPhaseRestoringData);
    reopenAfter([] {});
    EXPECT_EQ(progressOf(kAtlas)->installState(), kInstallStateWaiting);
    EXPECT_EQ(progressOf(kAtlas)->installPhase(), kInstallPhaseLoading);
    EXPECT_EQ(progressOf(kBrook)->installState(), kInstallStateFailed);
    EXPECT_EQ(progressOf(kBrook)->installPhase(), kInstallPhaseRestoringData);
}

TEST_F(DeviceReconciliationTest, aPlaceholderThatTheLastBootDidNotSyncIsNotTrusted) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    ASSERT_TRUE(succeeded(installPlaceholder(kBrook)));
    reopenAfter([&] {
        sql("UPDATE placeholders SET unsynced_boot = 'another boot'"
            " WHERE identifier = 'com.example.atlas'");
    });
    EXPECT_FALSE(either(kAtlas));
    EXPECT_TRUE(either(kBrook));
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DeviceReconciliationTest, anEndedSessionLeavesNothingUnsynced) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas, kInstallTypeSync)));
    EXPECT_EQ(number("SELECT count(*) FROM placeholders WHERE unsynced_boot IS NOT NULL"), 1);
    endSession();
    EXPECT_EQ(number("SELECT count(*) FROM placeholders WHERE unsynced_boot IS NOT NULL"), 0);
    EXPECT_EQ(number("SELECT count(*) FROM session"), 0);
}

TEST_F(DeviceReconciliationTest, whoeverRunsGoesOnRunning) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(device().run(kAtlas)));
    reopenAfter([] {});
    EXPECT_TRUE(device().status(kAtlas)->isRunning);
}

}  // namespace
}  // namespace appsync
