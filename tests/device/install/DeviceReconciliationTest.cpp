#include <sys/resource.h>

#include <cerrno>
#include <filesystem>
#include <fstream>

#include "device/values/DevicePaths.h"
#include "device/values/PackageIdentifier.h"
#include "tests/device/DevicePlatformFixture.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

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
        fs::create_directories(rootPath(containerPath("HALF-UNPACKED/App.app/deep")));
        write(containerPath("HALF-UNPACKED/App.app/part"), "bytes");
    });
    EXPECT_EQ(containers().size(), 1U);
    EXPECT_EQ(read(application(kAtlas)->bundlePath + "/main"), "program 1.0");
    EXPECT_TRUE(device().repairs().empty());
}

TEST_F(DeviceReconciliationTest, aLookRemovesNothing) {
    endSession();
    fs::create_directory(rootPath(containerPath("STRAY")));
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

TEST_F(DeviceReconciliationTest, aBundleThatIsGoneIsNotOnDisk) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(install(kBrook)));
    fs::remove_all(rootPath(application(kAtlas)->bundleContainerPath));
    const auto present = device().applicationsOnDisk();
    ASSERT_TRUE(present);
    ASSERT_EQ(present->size(), 1U);
    EXPECT_EQ(present->front().identifier, kBrook);
}

TEST_F(DeviceReconciliationTest, whereNoBundleCanBeThereIsNone) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    for (const char* container : {"'a' || char(0) || 'b'", "printf('%.*c', 300, 'a')"}) {
        sql("UPDATE applications SET container = " + std::string(container));
        const auto present = device().applicationsOnDisk();
        ASSERT_TRUE(present) << present.error().description();
        EXPECT_TRUE(present->empty()) << container;
    }
}

TEST_F(DeviceReconciliationTest, aBundleThatCannotBeLookedAtIsNotTakenForGone) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(device().applicationsOnDisk());
    rlimit before{};
    ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &before), 0);
    const rlimit none{0, before.rlim_max};
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &none), 0);
    const auto present = device().applicationsOnDisk();
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &before), 0);
    ASSERT_FALSE(present);
    EXPECT_EQ(present.error().code, EMFILE);
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
        fs::copy(rootPath(current), rootPath(containerPath("OLD-VERSION")),
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

TEST_F(DeviceReconciliationTest, temporaryFilesOfAnInterruptedRestoreAreCleared) {
    const std::vector<std::string> directories{std::string(kPreferencesDirectory),
                                               std::string(kRestoreDirectory),
                                               std::string(kRestoreLogDirectory)};
    reopenAfter([&] {
        for (const std::string& directory : directories) {
            fs::create_directories(rootPath(directory));
            write(directory + "/.DemotedApps.plist.appsync-abc123", "half a list");
            write(directory + "/DemotedApps.plist", "a list");
        }
    });
    for (const std::string& directory : directories) {
        EXPECT_FALSE(exists(directory + "/.DemotedApps.plist.appsync-abc123")) << directory;
        EXPECT_TRUE(exists(directory + "/DemotedApps.plist")) << directory;
    }
}

TEST_F(DeviceReconciliationTest, aLinkInThePlaceOfADirectoryThatIsClearedTakesNothingAway) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    const std::string data = std::string(kDataDirectory) + "/" + std::string(kAtlas);
    for (const std::string_view directory : {kTemporaryDirectory, kRestoreDataDirectory}) {
        for (const std::string target :
             {"..", "/var/containers/Bundle/Application", "/var/mobile/Containers/Data"}) {
            reopenAfter([&] {
                fs::create_directories(rootPath(data));
                write(data + "/notes", "to be kept");
                fs::remove_all(rootPath(directory));
                fs::create_directories(fs::path(rootPath(directory)).parent_path());
                fs::create_symlink(target, rootPath(directory));
            });
            EXPECT_TRUE(exists(data + "/notes")) << directory << " -> " << target;
            EXPECT_EQ(containers().size(), 1U) << directory << " -> " << target;
        }
    }
}

TEST_F(DeviceReconciliationTest, aPackageThatWaitsForItsDataStays) {
    const std::string package = stagePackage(kAtlas);
    const std::string other = stagePackage(kBrook);
    ASSERT_TRUE(succeeded(device().setRestoreDataExpected(kAtlas, true)));
    reopenAfter([] {});
    EXPECT_TRUE(exists(package));
    EXPECT_FALSE(exists(other));
}

TEST_F(DeviceReconciliationTest, packagesOfTheLongestIdentifiersAreTreatedLikeAllOthers) {
    const std::string waiting(255, 'w');
    const std::string other(255, 'o');
    const auto packageAt = [](const std::string& identifier) {
        return std::string(kPublicStagingDirectory) + "/" + archiveNameOf(identifier);
    };
    ASSERT_TRUE(succeeded(device().setRestoreDataExpected(waiting, true)));
    reopenAfter([&] {
        write(packageAt(waiting), "a package");
        write(packageAt(other), "a package");
    });
    EXPECT_TRUE(exists(packageAt(waiting)));
    EXPECT_FALSE(exists(packageAt(other)));
}

TEST_F(DeviceReconciliationTest, theEndOfASessionClearsPackagesThatNobodyWaitsForAnyMore) {
    const std::string waiting = stagePackage(kAtlas);
    const std::string other = stagePackage(kBrook);
    ASSERT_TRUE(succeeded(device().setRestoreDataExpected(kAtlas, true)));
    endSession();
    EXPECT_TRUE(exists(waiting));
    EXPECT_FALSE(exists(other));
}

TEST_F(DeviceReconciliationTest, directoriesThatADeviceAlwaysHasAreRemade) {
    for (const std::string_view directory : kStandingDirectories)
        EXPECT_TRUE(exists(std::string(directory)));
    reopenAfter([&] { fs::remove_all(rootPath("/var/mobile")); });
    for (const std::string_view directory : kStandingDirectories) {
        EXPECT_TRUE(exists(std::string(directory))) << directory;
    }
    EXPECT_TRUE(exists("/var/mobile/Library/Logs/MediaServices"));
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

TEST_F(DeviceReconciliationTest, aSessionThatWasCutOffLeavesNoTemporaryFileInABundle) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    const std::string container = application(kAtlas)->bundleContainerPath;
    const std::string temporary = container + "/.VessikMetadata.plist.appsync-a1b2c3";
    reopenAfter([&] {
        sql("INSERT INTO session (id, process, started, last_uninstall) VALUES (1, 1, 1, 0)");
        write(temporary, "half of it");
        write(container + "/.hidden", "the application's own");
    });
    EXPECT_FALSE(fs::exists(rootPath(temporary)));
    EXPECT_EQ(read(container + "/.hidden"), "the application's own");
    EXPECT_EQ(read(application(kAtlas)->bundlePath + "/main"), "program 1.0");
}

TEST_F(DeviceReconciliationTest, whoeverRunsGoesOnRunning) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(device().run(kAtlas)));
    reopenAfter([] {});
    EXPECT_TRUE(device().status(kAtlas)->isRunning);
}

}  // namespace
}  // namespace appsync
