#include <sys/stat.h>

#include <atomic>
#include <cerrno>
#include <filesystem>
#include <thread>

#include "device/archive/PackageError.h"
#include "tests/device/DeviceFixture.h"
#include "tests/device/package/PackageZip.h"

namespace appsync {
namespace {

using DeviceInstallTest = DeviceFixture;

TEST_F(DeviceInstallTest, aPackageBecomesAnApplication) {
    ASSERT_TRUE(succeeded(install(kAtlas, "2.1")));
    const std::optional<AppProxy> proxy = application(kAtlas);
    ASSERT_TRUE(proxy);
    EXPECT_EQ(proxy->bundleVersion, "2.1");
    EXPECT_EQ(proxy->displayName, "Name of com.example.atlas");
    EXPECT_EQ(proxy->applicationType, kApplicationTypeUser);
    EXPECT_TRUE(proxy->state.installed);
    EXPECT_FALSE(proxy->state.placeholder);
    EXPECT_GT(proxy->staticDiskUsage, 0U);
    EXPECT_EQ(proxy->bundlePath, proxy->bundleContainerPath + "/App.app");
}

TEST_F(DeviceInstallTest, theContainerHoldsTheBundleAndTheStoreMetadata) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    const std::optional<AppProxy> proxy = application(kAtlas);
    EXPECT_EQ(read(proxy->bundlePath + "/main"), "program 1.0");
    EXPECT_EQ(read(proxy->bundleContainerPath + "/VessikMetadata.plist"),
              "metadata of com.example.atlas");
}

TEST_F(DeviceInstallTest, thePackageIsOnlyRead) {
    const std::string package = stagePackage(kAtlas);
    ASSERT_TRUE(succeeded(installFrom(package, kAtlas)));
    EXPECT_EQ(read(package), packageOf(kAtlas, "1.0"));
}

TEST_F(DeviceInstallTest, anUpdateSwapsContainers) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    const std::string old = application(kAtlas)->bundleContainerPath;
    ASSERT_TRUE(succeeded(install(kAtlas, "2.0")));
    EXPECT_EQ(read(application(kAtlas)->bundlePath + "/main"), "program 2.0");
    EXPECT_FALSE(exists(old));
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DeviceInstallTest, theInstalledApplicationOutlivesTheSession) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    close();
    EXPECT_EQ(read(application(kAtlas)->bundlePath + "/main"), "program 1.0");
}

TEST_F(DeviceInstallTest, theInstallTakesThePlaceholderAwayAndHasItsType) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas, kInstallTypeRestore)));
    ASSERT_TRUE(succeeded(install(kAtlas)));
    EXPECT_EQ(application(kAtlas)->installType, kInstallTypeRestore);
    EXPECT_FALSE(either(kAtlas)->state.placeholder);
    EXPECT_EQ(containers().size(), 1U);
    EXPECT_EQ(progressOf(kAtlas), nullptr);
}

TEST_F(DeviceInstallTest, anotherIdentifierIsRefusedAndEverythingStays) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    const auto before = containers();
    const Status status = installFrom(stagePackage("com.example.other"), kAtlas);
    ASSERT_FALSE(status);
    EXPECT_TRUE(isPackageError(status.error(), PackageErrorCode::IdentifierMismatch));
    EXPECT_EQ(containers(), before);
    EXPECT_EQ(application(kAtlas)->bundleVersion, "1.0");
    EXPECT_TRUE(either(kAtlas)->state.placeholder);
}

TEST_F(DeviceInstallTest, aWrongChecksumLeavesTheOldVersionAndNoFiles) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    const auto before = containers();
    ZipEntry damaged = zipFile("App.app/data", "some bytes");
    damaged.crc = 12345;
    const std::string package = "/var/mobile/Media/PublicStaging/damaged.zip";
    write(
        package,
        ZipBuilder().add({zipFile("App.app/Info.plist", infoOf(kAtlas, "2.0")), damaged}).bytes());
    const Status status = installFrom(package, kAtlas);
    ASSERT_FALSE(status);
    EXPECT_EQ(status.error().domain, kInstallerErrorDomain);
    EXPECT_EQ(containers(), before);
    EXPECT_EQ(application(kAtlas)->bundleVersion, "1.0");
}

TEST_F(DeviceInstallTest, aFailureIsRememberedUntilTheNextSuccess) {
    ASSERT_FALSE(installFrom(stagePackage("com.example.other"), kAtlas));
    const std::optional<InstallFailure> failure = device().status(kAtlas)->lastFailure;
    ASSERT_TRUE(failure);
    EXPECT_EQ(failure->error.domain, kInstallerErrorDomain);
    ASSERT_TRUE(succeeded(install(kAtlas)));
    EXPECT_FALSE(device().status(kAtlas)->lastFailure);
}

TEST_F(DeviceInstallTest, aFailureMarksTheProgressAsFailed) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    const auto record = progressOf(kAtlas);
    ASSERT_FALSE(installFrom(stagePackage("com.example.other"), kAtlas));
    EXPECT_EQ(record->installState(), kInstallStateFailed);
}

TEST_F(DeviceInstallTest, illegalIdentifiersAreRefused) {
    const std::string package = stagePackage(kAtlas);
    const std::string identifiers[] = {
        "", ".", "..", "a/b", "a b", std::string(256, 'a'), "a\n", std::string("a\0b", 3)};
    for (const std::string& identifier : identifiers) {
        EXPECT_TRUE(
            refusedBy(installFrom(package, identifier), RegistryErrorCode::IllegalIdentifier));
    }
    EXPECT_TRUE(containers().empty());
}

TEST_F(DeviceInstallTest, optionsOfAnotherKindAreRefused) {
    const FileURL package = *FileURL::fromPath(stagePackage(kAtlas), false);
    AppRegistry& registry = device().registry();
    const PropertyList noType = PropertyList::map({{BundleIdentifierKey, kAtlas}});
    const PropertyList noName = PropertyList::map({{PackageTypeKey, PackageTypeCustomer}});
    for (const PropertyList& options : {PropertyList(), PropertyList(1), noType, noName}) {
        EXPECT_TRUE(refusedBy(registry.installPackage(package, options),
                              RegistryErrorCode::IllegalOptions));
    }
}

TEST_F(DeviceInstallTest, aPackageThatIsAbsentOrAPipeIsRefusedWithoutWaiting) {
    const std::string pipe = "/var/mobile/Media/PublicStaging/pipe.zip";
    static_cast<void>(device());
    ASSERT_EQ(::mkfifo(rootPath(pipe).c_str(), 0600), 0);
    const Status absent = installFrom("/var/mobile/absent.zip", kAtlas);
    const Status waiting = installFrom(pipe, kAtlas);
    ASSERT_FALSE(absent);
    EXPECT_EQ(absent.error().code, ENOENT);
    ASSERT_FALSE(waiting);
    EXPECT_EQ(waiting.error().domain, kPosixErrorDomain);
}

TEST_F(DeviceInstallTest, aPackageLinkThatPointsOutsideLeadsNowhere) {
    std::filesystem::create_symlink(path("outside.zip"),
                                    rootPath("/var/mobile/Media/PublicStaging/link.zip"));
    write("/../../outside.zip", packageOf(kAtlas, "1.0"));
    ASSERT_TRUE(std::filesystem::exists(path("outside.zip")));
    const Status status = installFrom("/var/mobile/Media/PublicStaging/link.zip", kAtlas);
    ASSERT_FALSE(status);
    EXPECT_EQ(status.error().code, ENOENT);
}

TEST_F(DeviceInstallTest, installingTakesTheApplicationOffTheUninstalledList) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(device().uninstall(kAtlas)));
    ASSERT_TRUE(device().status(kAtlas)->uninstalled);
    close();  // in the same session the uninstall would win
    ASSERT_TRUE(succeeded(install(kAtlas)));
    EXPECT_FALSE(device().status(kAtlas)->uninstalled);
}

TEST_F(DeviceInstallTest, installingEndsTheWaitForRestoreData) {
    ASSERT_TRUE(succeeded(device().setRestoreDataExpected(kAtlas, true)));
    ASSERT_TRUE(device().status(kAtlas)->awaitsRestoreData);
    ASSERT_TRUE(succeeded(install(kAtlas)));
    EXPECT_FALSE(device().status(kAtlas)->awaitsRestoreData);
}

TEST_F(DeviceInstallTest, aCancelledInstallStops) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    progressOf(kAtlas)->cancel();
    const auto before = containers();
    const Status status = install(kAtlas);
    ASSERT_FALSE(status);
    EXPECT_TRUE(isPackageError(status.error(), PackageErrorCode::Cancelled));
    EXPECT_EQ(containers(), before);
    EXPECT_EQ(progressOf(kAtlas)->installState(), kInstallStateCanceled);
}

TEST_F(DeviceInstallTest, aSystemApplicationStaysOneWhenItIsUpdated) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    sql("UPDATE applications SET type = 'System'");
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    EXPECT_EQ(either(kAtlas)->applicationType, kApplicationTypeSystem);
    ASSERT_TRUE(succeeded(install(kAtlas, "2.0")));
    EXPECT_EQ(application(kAtlas)->applicationType, kApplicationTypeSystem);
}

TEST_F(DeviceInstallTest, tenAtOnceAllArrive) {
    constexpr int kThreads = 10;
    constexpr int kEach = 4;
    static_cast<void>(device());
    std::atomic<int> failures{0};
    std::vector<std::thread> threads;
    for (int thread = 0; thread < kThreads; ++thread) {
        threads.emplace_back([this, thread, &failures] {
            for (int number = 0; number < kEach; ++number) {
                const std::string name =
                    "com.example.app" + std::to_string(thread * kEach + number);
                if (!installPlaceholder(name) || !install(name)) ++failures;
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(failures, 0);
    EXPECT_EQ(device().applications()->size(), std::size_t{kThreads * kEach});
    EXPECT_EQ(containers().size(), std::size_t{kThreads * kEach});
}

TEST_F(DeviceInstallTest, tenInstallsOfTheSameApplicationLeaveOne) {
    const std::string package = stagePackage(kAtlas);
    std::vector<std::thread> threads;
    for (int thread = 0; thread < 10; ++thread) {
        threads.emplace_back([&] { EXPECT_TRUE(succeeded(installFrom(package, kAtlas))); });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(containers().size(), 1U);
    EXPECT_EQ(read(application(kAtlas)->bundlePath + "/main"), "program 1.0");
}

}  // namespace
}  // namespace appsync
