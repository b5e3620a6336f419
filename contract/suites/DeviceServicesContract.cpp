#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "contract/DeviceContract.h"
#include "contract/suites/Applications.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using Outcome = TerminationAssertionResult;

class HomeScreenContract : public DeviceContract {
  protected:
    HomeScreenContract() : connection_(services_.homeScreen.blockableConnection()) {
        EXPECT_NE(connection_, nullptr);
    }

    bool setLayout(const std::vector<std::string>& identifiers) {
        return connection_->setIconState(device_->iconState(identifiers));
    }
    std::vector<std::string> layout() {
        const std::optional<Bytes> bytes = connection_->flattenedIconState(1);
        if (!bytes) return {"no answer"};
        const auto list = services_.propertyLists.parse(*bytes);
        if (!list || !list->isArray()) return {"not an array"};
        std::vector<std::string> identifiers;
        for (const PropertyList& element : list->elements()) {
            identifiers.push_back(element.asString() != nullptr ? *element.asString() : "no text");
        }
        return identifiers;
    }

    const std::shared_ptr<HomeScreenConnection> connection_;
};

APPSYNC_CONTRACT_SUITE(HomeScreenContract, devicePorts({OptionalService::HomeScreen}));

TEST_P(HomeScreenContract, ALayoutComesBackFlattened) {
    checks("platform/HomeScreenService.h",
           "The icon layout flattened: a property list whose root is an array of bundle "
           "identifiers in home-screen order.");
    EXPECT_TRUE(setLayout({kB, kA}));
    EXPECT_THAT(layout(), ElementsAre(kB, kA));
    EXPECT_TRUE(setLayout({kA}));
    EXPECT_THAT(layout(), ElementsAre(kA));
}

TEST_P(HomeScreenContract, WhatIsNoLayoutIsNotTaken) {
    checks("platform/HomeScreenService.h", "Bytes of another form are not, and change nothing.");
    EXPECT_TRUE(setLayout({kB, kA}));
    const std::string garbage = "no layout";
    EXPECT_FALSE(connection_->setIconState(Bytes(garbage.begin(), garbage.end())));
    EXPECT_FALSE(connection_->setIconState({}));
    EXPECT_THAT(layout(), ElementsAre(kB, kA));
}

TEST_P(HomeScreenContract, WhatIsNotInstalledCannotBeHeld) {
    checks("platform/HomeScreenService.h", "No such application when it is not installed.");
    const auto result = services_.homeScreen.takeTerminationAssertion(kA, 0);
    EXPECT_EQ(result.outcome, Outcome::kNoSuchApplication);
}

TEST_P(HomeScreenContract, AnApplicationThatDoesNotRunIsHeld) {
    checks("platform/HomeScreenService.h",
           "Else granted, with an assertion; several may hold one application.");
    ASSERT_TRUE(installPackage({kA}));
    const auto result = services_.homeScreen.takeTerminationAssertion(kA, 0);
    EXPECT_EQ(result.outcome, Outcome::kGranted);
    EXPECT_NE(result.assertion, nullptr);
}

TEST_P(HomeScreenContract, ARunningApplicationIsNotHeldUntilItEnds) {
    checks("platform/HomeScreenService.h", "Denied while the application goes on running.");
    ASSERT_TRUE(installPackage({kA}));
    ASSERT_TRUE(device_->run(kA));
    EXPECT_EQ(services_.homeScreen.takeTerminationAssertion(kA, 0).outcome, Outcome::kDenied);
    device_->quit(kA);
    EXPECT_EQ(services_.homeScreen.takeTerminationAssertion(kA, 0).outcome, Outcome::kGranted);
}

TEST_P(HomeScreenContract, AReleasedAssertionCanBeTakenAgain) {
    checks("platform/HomeScreenService.h",
           "Else granted, with an assertion; several may hold one application.");
    ASSERT_TRUE(installPackage({kA}));
    for (int round = 0; round < 3; ++round) {
        const auto result = services_.homeScreen.takeTerminationAssertion(kA, 0);
        EXPECT_EQ(result.outcome, Outcome::kGranted);
    }
    ASSERT_TRUE(device_->run(kA));
    EXPECT_EQ(services_.homeScreen.takeTerminationAssertion(kA, 0).outcome, Outcome::kDenied);
}

TEST_P(HomeScreenContract, WhatIsHeldDoesNotRunUntilTheLastAssertionIsReleased) {
    checks("platform/HomeScreenService.h",
           "Keeps a running application from running until the assertion is released, that is "
           "destroyed.");
    ASSERT_TRUE(installPackage({kA}));
    ASSERT_TRUE(installPackage({kB}));
    auto first = services_.homeScreen.takeTerminationAssertion(kA, 0);
    auto second = services_.homeScreen.takeTerminationAssertion(kA, 0);
    EXPECT_EQ(second.outcome, Outcome::kGranted);
    EXPECT_FALSE(device_->run(kA));
    EXPECT_TRUE(device_->run(kB)) << "another application is not held";
    first.assertion.reset();
    EXPECT_FALSE(device_->run(kA));
    second.assertion.reset();
    EXPECT_TRUE(device_->run(kA));
}

class PolicyContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(PolicyContract, devicePorts({OptionalService::Policy}));

TEST_P(PolicyContract, PolicyIsUnsetUntilItIsSet) {
    checks("platform/DevicePolicyService.h", "The effective value at this moment.");
    DevicePolicyService& policy = services_.policy;
    EXPECT_EQ(policy.effectiveValue(PolicyFeature::AppInstallationAllowed), PolicyAnswer::Unset);
    device_->setPolicy(PolicyFeature::AppInstallationAllowed, PolicyAnswer::No);
    EXPECT_EQ(policy.effectiveValue(PolicyFeature::AppInstallationAllowed), PolicyAnswer::No);
    EXPECT_EQ(policy.effectiveValue(PolicyFeature::AppRemovalAllowed), PolicyAnswer::Unset);
    device_->setPolicy(PolicyFeature::AppRemovalAllowed, PolicyAnswer::Yes);
    EXPECT_EQ(policy.effectiveValue(PolicyFeature::AppRemovalAllowed), PolicyAnswer::Yes);
}

class BackupContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(BackupContract, devicePorts({OptionalService::Backup}));

TEST_P(BackupContract, RestoreDataIsThereUntilTheRestoreIsGivenUp) {
    checks("platform/BackupService.h",
           "Whether the service holds data to restore for the application.");
    const auto manager = services_.backup.makeManager();
    EXPECT_FALSE(manager->restoreDataExists(kA));
    manager->cancelApplicationRestore(kA);
    device_->addRestoreData(kA);
    EXPECT_TRUE(manager->restoreDataExists(kA));
    EXPECT_FALSE(manager->restoreDataExists(kB));
    checks("platform/BackupService.h", "Gives the application's restore up.");
    services_.backup.makeManager()->cancelApplicationRestore(kA);
    EXPECT_FALSE(manager->restoreDataExists(kA));
}

class InstallerContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(InstallerContract, devicePorts({OptionalService::UninstalledList}));

TEST_P(InstallerContract, WhatAPersonRemovesIsOnTheListUntilItIsCleared) {
    checks("platform/InstallerService.h", "A map keyed by bundle identifier;");
    InstallerService& installer = services_.installer;
    EXPECT_TRUE(installer.lookupUninstalled()->isMap());
    EXPECT_TRUE(installer.lookupUninstalled()->empty());
    for (const char* identifier : {kA, kB}) {
        ASSERT_TRUE(installPackage({identifier}));
        device_->uninstallAsPerson(identifier);
        EXPECT_FALSE(registry_.isApplicationInstalled(identifier));
    }
    EXPECT_EQ(installer.lookupUninstalled()->size(), 2U);
    checks("platform/InstallerService.h",
           "Takes identifiers off the list; those that are not on it are passed over.");
    const std::vector<std::string> taken{kA, "com.example.unknown"};
    EXPECT_TRUE(installer.clearUninstalled(taken));
    EXPECT_EQ(installer.lookupUninstalled()->size(), 1U);
    EXPECT_NE(installer.lookupUninstalled()->find(kB), nullptr);
}

TEST_P(InstallerContract, WhatTheRegistryUninstallsIsNotOnTheList) {
    checks("platform/InstallerService.h",
           "What the registry uninstalls for the plug-in is not on it.");
    ASSERT_TRUE(installPackage({kA}));
    ASSERT_TRUE(registry_.uninstallApplication(kA, {}));
    EXPECT_TRUE(services_.installer.lookupUninstalled()->empty());
}

class TransactionLogContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(TransactionLogContract, devicePorts({OptionalService::TransactionLog}));

TEST_P(TransactionLogContract, TheTransactionLogKeepsTheOrder) {
    checks("platform/InstallTransactionLog.h",
           "One-time initialisation; a second one changes nothing.");
    InstallTransactionLog& log = services_.transactions;
    log.initialize(*services_.log.makeHandle("com.example", "first"));
    log.initialize(*services_.log.makeHandle("com.example", "second"));
    checks("platform/InstallTransactionLog.h", "Records stand in the order of the calls.");
    log.logScenario("Asset install", 0, true, kA, "assertion succeeded");
    log.logStep(1, 1, 1, true, kA, "");
    log.logScenario("Nimbra restore", 0, false, kB, "install failed recoverably");
    EXPECT_THAT(device_->scenarios(),
                ElementsAre("Asset install|com.example.a|yes|assertion succeeded",
                            "Nimbra restore|com.example.b|no|install failed recoverably"));
}

class IconRendererContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(IconRendererContract, devicePorts({OptionalService::Icons}));

TEST_P(IconRendererContract, OnlyKnownImageTypesAreEncoded) {
    checks("platform/IconRenderer.h",
           "A destination for `imageCount` images of a type (\"public.png\") that writes into "
           "`buffer`. Null for a type that it does not know.");
    Bytes buffer;
    EXPECT_NE(services_.icons.createImageDestination("public.png", 1, buffer), nullptr);
    EXPECT_EQ(services_.icons.createImageDestination("public.no-such-type", 1, buffer), nullptr);
}

TEST_P(IconRendererContract, NothingAddedIsNothingWritten) {
    checks("platform/IconRenderer.h",
           "Writes what was added into the buffer; false when that fails or nothing was added.");
    Bytes buffer;
    const auto destination = services_.icons.createImageDestination("public.png", 1, buffer);
    ASSERT_NE(destination, nullptr);
    EXPECT_FALSE(destination->finalize());
    EXPECT_THAT(buffer, IsEmpty());
}

}  // namespace

void linkDeviceServicesContract() {}

}  // namespace appsync
