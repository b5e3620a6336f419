#include "device/services/DeviceServices.h"

#include <array>

#include "platform/FileSystem.h"
#include "platform/InstallCoordinatorService.h"
#include "tests/device/DevicePlatformFixture.h"

namespace appsync {
namespace {

class DeviceServicesTest : public DevicePlatformFixture {};

TEST_F(DeviceServicesTest, aPolicyIsReadAnewAtEachAsk) {
    DevicePolicyService& policy = platform().policy;
    EXPECT_EQ(policy.effectiveValue(PolicyFeature::AppRemovalAllowed), PolicyAnswer::Unset);
    ASSERT_TRUE(succeeded(look()->change({.removal = PolicyAnswer::No})));
    EXPECT_EQ(policy.effectiveValue(PolicyFeature::AppRemovalAllowed), PolicyAnswer::No);
    EXPECT_EQ(policy.effectiveValue(PolicyFeature::AppInstallationAllowed), PolicyAnswer::Unset);
    ASSERT_TRUE(succeeded(
        look()->change({.installation = PolicyAnswer::Yes, .removal = PolicyAnswer::Unset})));
    EXPECT_EQ(policy.effectiveValue(PolicyFeature::AppRemovalAllowed), PolicyAnswer::Unset);
    EXPECT_EQ(policy.effectiveValue(PolicyFeature::AppInstallationAllowed), PolicyAnswer::Yes);
}

TEST_F(DeviceServicesTest, coordinationIsWhatWasSet) {
    EXPECT_FALSE(platform().coordination.isCoordinationEnabled());
    ASSERT_TRUE(succeeded(device().change({.coordination = true})));
    EXPECT_TRUE(platform().coordination.isCoordinationEnabled());
    EXPECT_TRUE(look()->settings()->coordination);
}

TEST_F(DeviceServicesTest, theInstallerListsWhatAPersonRemoved) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.5")));
    ASSERT_TRUE(succeeded(installPlaceholder(kBrook)));
    EXPECT_EQ(platform().installer.lookupUninstalled(), PropertyList::map());
    ASSERT_TRUE(succeeded(look()->uninstall(kAtlas)));
    ASSERT_TRUE(succeeded(look()->uninstall(kBrook)));
    const std::optional<PropertyList> list = platform().installer.lookupUninstalled();
    ASSERT_TRUE(list);
    ASSERT_EQ(list->size(), 2U);
    EXPECT_EQ(*list->find(kAtlas)->findString(BundleVersionKey), "1.5");
    EXPECT_TRUE(list->find(kAtlas)->find("UninstallDate")->asDate());
    EXPECT_TRUE(list->find(kBrook));
}

TEST_F(DeviceServicesTest, theInstallersListIsInTheOrderOfTheRemovalsWhateverTheClockSaid) {
    for (const char* identifier : {kBrook, kAtlas}) {
        ASSERT_TRUE(succeeded(install(identifier)));
        ASSERT_TRUE(succeeded(device().uninstall(identifier)));
    }
    sql("UPDATE uninstalled SET time = time - 86400000 WHERE identifier = 'com.example.atlas'");
    const std::optional<PropertyList> list = platform().installer.lookupUninstalled();
    ASSERT_EQ(list->size(), 2U);
    EXPECT_EQ(list->entries()[0].key, kBrook);
}

TEST_F(DeviceServicesTest, clearingTakesNamedIdentifiersOffTheList) {
    for (const char* identifier : {kAtlas, kBrook}) {
        ASSERT_TRUE(succeeded(install(identifier)));
        ASSERT_TRUE(succeeded(device().uninstall(identifier)));
    }
    const std::array<std::string, 2> cleared = {kAtlas, "com.example.absent"};
    EXPECT_TRUE(platform().installer.clearUninstalled(cleared));
    const std::optional<PropertyList> list = platform().installer.lookupUninstalled();
    EXPECT_EQ(list->size(), 1U);
    EXPECT_TRUE(list->find(kBrook));
}

TEST_F(DeviceServicesTest, restoreDataIsExpectedUntilTheRestoreIsGivenUp) {
    const std::unique_ptr<BackupManager> manager = platform().backup.makeManager();
    EXPECT_FALSE(manager->restoreDataExists(kAtlas));
    ASSERT_TRUE(succeeded(look()->setRestoreDataExpected(kAtlas, true)));
    ASSERT_TRUE(succeeded(look()->setRestoreDataExpected(kAtlas, true)));
    EXPECT_TRUE(manager->restoreDataExists(kAtlas));
    manager->cancelApplicationRestore(kAtlas);
    manager->cancelApplicationRestore(kAtlas);
    EXPECT_FALSE(manager->restoreDataExists(kAtlas));
}

TEST_F(DeviceServicesTest, theHistoryKeepsStepsAndScenariosInOrder) {
    InstallTransactionLog& log = platform().transactions;
    log.logStep(3, 1, 2, true, kAtlas, "step");
    log.logScenario("Asset install", 0, false, kBrook, "scenario");
    const Result<std::vector<HistoryRecord>> history = device().history();
    ASSERT_EQ(history->size(), 2U);
    const HistoryRecord& step = history->at(0);
    EXPECT_EQ(step.kind, HistoryRecord::Kind::Step);
    EXPECT_EQ(step.step, 3U);
    EXPECT_EQ(step.party, 1U);
    EXPECT_EQ(step.phase, 2U);
    EXPECT_TRUE(step.success);
    const HistoryRecord& scenario = history->at(1);
    EXPECT_EQ(scenario.scenario, "Asset install");
    EXPECT_EQ(scenario.identifier, kBrook);
    EXPECT_EQ(scenario.description, "scenario");
    EXPECT_FALSE(scenario.success);
}

TEST_F(DeviceServicesTest, theHistoryOutlivesTheSessionAndGivesItsEnd) {
    for (int number = 0; number < 20; ++number) {
        platform().transactions.logScenario("s", 0, true, kAtlas, std::to_string(number));
    }
    endSession();
    const Result<std::vector<HistoryRecord>> end = look()->history(3);
    ASSERT_EQ(end->size(), 3U);
    EXPECT_EQ(end->at(0).description, "17");
    EXPECT_EQ(end->at(2).description, "19");
}

TEST_F(DeviceServicesTest, theStatusOfWhatIsNotThereIsEmpty) {
    const Result<ApplicationStatus> status = look()->status(kAtlas);
    ASSERT_TRUE(status.ok());
    EXPECT_FALSE(status->installed);
    EXPECT_FALSE(status->placeholder);
    EXPECT_FALSE(status->sessionUnderWay);
}

TEST_F(DeviceServicesTest, theStatusOfAnUpdateHoldsBothRecordsAndTheProgress) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    progressOf(kAtlas)->setCompletedUnitCount(250);
    const Result<ApplicationStatus> status = device().status(kAtlas);
    EXPECT_EQ(status->installed->version, "1.0");
    EXPECT_EQ(status->placeholder->progress->completedUnits, 250);
    EXPECT_TRUE(status->sessionUnderWay);
}

TEST_F(DeviceServicesTest, mobileIsWhoeverOwnsTheDevice) {
    const FileAttributes mobile{"mobile", "mobile"};
    EXPECT_TRUE(
        succeeded(platform().files.createDirectory("/var/mobile/Library/Made", false, &mobile)));
    const FileAttributes stranger{"nobody-here", std::nullopt};
    EXPECT_FALSE(platform().files.createDirectory("/var/mobile/Library/Other", false, &stranger));
}

TEST_F(DeviceServicesTest, temporaryFilesHaveAPlaceOfTheirOwn) {
    EXPECT_EQ(platform().files.temporaryDirectory(), "/var/mobile/tmp");
    EXPECT_TRUE(platform().files.itemExists("/var/mobile/tmp"));
}

}  // namespace
}  // namespace appsync
