#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "contract/DeviceContract.h"
#include "contract/suites/Applications.h"
#include "platform/InstallCoordinator.h"
#include "platform/InstallPromises.h"

namespace appsync {
namespace {

/// What the next process finds of what this one has done.
class LastingContract : public DeviceContract {
  protected:
    /// False where that is not offered. From then on the fixture's own services are none.
    bool reopen() { return device_->reopen(); }

    std::optional<AppProxy> found(const std::string& identifier) {
        return device_->services().registry.proxyForIdentifier(identifier,
                                                               AppRegistry::Placeholders::Included);
    }
};

#define APPSYNC_REOPEN_OR_SKIP() \
    if (!reopen()) GTEST_SKIP() << "the port does not reopen its device"

APPSYNC_CONTRACT_SUITE(LastingContract, devicePorts());

TEST_P(LastingContract, ApplicationsAndPlaceholdersLast) {
    checks("platform/AppRegistry.h",
           "The device's book of installed applications and placeholders.");
    ASSERT_TRUE(installPackage({kA, "2.5", "Atlas"}));
    ASSERT_TRUE(installPlaceholder({kB, "1.5", "Beacon"}, kInstallTypeRestore));
    APPSYNC_REOPEN_OR_SKIP();
    const std::optional<AppProxy> application = found(kA);
    ASSERT_TRUE(application);
    EXPECT_TRUE(application->state.installed);
    EXPECT_EQ(application->bundleVersion, "2.5");
    EXPECT_EQ(application->displayName, "Atlas");
    const std::optional<AppProxy> placeholder = found(kB);
    ASSERT_TRUE(placeholder);
    EXPECT_TRUE(placeholder->state.placeholder);
    EXPECT_EQ(placeholder->bundleVersion, "1.5");
    EXPECT_EQ(placeholder->installType, std::uint64_t{kInstallTypeRestore});
}

TEST_P(LastingContract, ARemovalLasts) {
    checks("platform/AppRegistry.h",
           "after a crash each application is there as before the call or as after it.");
    ASSERT_TRUE(installPackage({kA}));
    ASSERT_TRUE(registry_.uninstallApplication(kA, {}));
    APPSYNC_REOPEN_OR_SKIP();
    EXPECT_FALSE(found(kA));
}

TEST_P(LastingContract, FilesLast) {
    checks("platform/FileSystem.h",
           "The end of the process, however it comes, undoes nothing that a call has done.");
    const std::string path = "/var/mobile/Library/ApplicationSync/Kept.plist";
    FileSystem& files = services_.files;
    ASSERT_TRUE(files.createDirectory("/var/mobile/Library/ApplicationSync", true, nullptr));
    ASSERT_TRUE(files.writeFileAtomically(path, Bytes{1, 2, 3}));
    APPSYNC_REOPEN_OR_SKIP();
    const Result<Bytes> contents = device_->services().files.readFile(path);
    ASSERT_TRUE(contents);
    EXPECT_EQ(*contents, (Bytes{1, 2, 3}));
}

TEST_P(LastingContract, TemporaryFilesDoNot) {
    checks(
        "platform/FileSystem.h",
        "what is in it goes with the process: the device empties it before the next one begins.");
    const std::string name = "/left";
    ASSERT_TRUE(services_.files.createFile(services_.files.temporaryDirectory() + name, {}, {}));
    APPSYNC_REOPEN_OR_SKIP();
    FileSystem& files = device_->services().files;
    EXPECT_TRUE(files.itemExists(files.temporaryDirectory()));
    EXPECT_FALSE(files.itemExists(files.temporaryDirectory() + name));
}

class LastingListContract : public LastingContract {};

APPSYNC_CONTRACT_SUITE(LastingListContract, devicePorts({OptionalService::UninstalledList}));

TEST_P(LastingListContract, TheListOfWhatWasUninstalledLasts) {
    checks("platform/InstallerService.h", "The list outlives the process.");
    for (const char* identifier : {kA, kB}) {
        ASSERT_TRUE(installPackage({identifier}));
        device_->uninstallAsPerson(identifier);
    }
    const std::vector<std::string> taken{kA};
    ASSERT_TRUE(services_.installer.clearUninstalled(taken));
    APPSYNC_REOPEN_OR_SKIP();
    const std::optional<PropertyList> list = device_->services().installer.lookupUninstalled();
    ASSERT_TRUE(list);
    EXPECT_EQ(list->find(kA), nullptr);
    EXPECT_NE(list->find(kB), nullptr);
}

class LastingCoordinatorsContract : public LastingContract {};

APPSYNC_CONTRACT_SUITE(LastingCoordinatorsContract, devicePorts({OptionalService::Coordination}));

TEST_P(LastingCoordinatorsContract, ACoordinatorOutlivesTheProcess) {
    checks("platform/InstallCoordinator.h",
           "An object is a handle on the service's record, which outlives it, and on a device the "
           "process too.");
    device_->turnCoordinationOn();
    {
        const auto made = services_.coordination.coordinator(
            CoordinatorKind::Initiating, kA, SyncClientID,
            InstallCoordinatorService::Creation::CreateIfNotExisting);
        ASSERT_NE(made.coordinator, nullptr);
        ASSERT_TRUE(made.coordinator->setInstallOptions({StoreMetadata{}, kInstallTypeSync, 1}));
    }
    APPSYNC_REOPEN_OR_SKIP();
    const auto found = device_->services().coordination.existingCoordinator(kA, SyncClientID);
    ASSERT_NE(found, nullptr);
    EXPECT_EQ(found->creatorIdentifier(), SyncClientID);
    EXPECT_TRUE(found->hasInstallOptions());
}

}  // namespace

void linkLastingContract() {}

}  // namespace appsync
