#include "host/output/WhyAnswer.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "device/values/DeviceRecords.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {
namespace {

using testing::HasSubstr;

ApplicationRecord application(bool isPlaceholder, std::uint64_t installType) {
    ApplicationRecord record;
    record.identifier = "com.a";
    record.version = "2";
    record.isPlaceholder = isPlaceholder;
    record.installType = installType;
    return record;
}

TEST(WhyAnswer, AnInstalledApplicationWaitsForNothing) {
    ApplicationStatus status;
    status.installed = application(false, kInstallTypeSync);
    const WhyAnswer answer = explain("com.a", status, {});
    EXPECT_EQ(answer.state, "installed");
    EXPECT_FALSE(answer.waitsFor);
    EXPECT_EQ(whyText(answer), "com.a is installed 2.\nIt waits for nothing.\n");
}

TEST(WhyAnswer, NamesTheRunningApplicationAndTheNextTry) {
    ApplicationStatus status;
    status.installed = application(false, kInstallTypeSync);
    status.placeholder = application(true, kInstallTypeSync);
    status.isRunning = true;
    status.denial = TerminationDenial{{}, WallTime{std::chrono::seconds{30}}};
    const WhyAnswer answer = explain("com.a", status, {});
    ASSERT_TRUE(answer.waitsFor);
    EXPECT_EQ(answer.waitsFor->what, "termination");
    EXPECT_EQ(answer.waitsFor->who, "com.a");
    EXPECT_EQ(answer.waitsFor->nextTry, WallTime{std::chrono::seconds{30}});
}

TEST(WhyAnswer, APlaceholderOfASyncWaitsForTheHost) {
    ApplicationStatus status;
    status.placeholder = application(true, kInstallTypeSync);
    EXPECT_EQ(explain("com.a", status, {}).waitsFor->what, "sync");
    status.sessionUnderWay = true;
    EXPECT_EQ(explain("com.a", status, {}).waitsFor->what, "transfer");
    status.placeholder->progress = InstallProgress{};
    status.placeholder->progress->phase = kInstallPhaseInstalling;
    EXPECT_EQ(explain("com.a", status, {}).waitsFor->what, "install");
}

TEST(WhyAnswer, AnOffloadedApplicationWaitsForTheHostNotForAStoreThatKnowsNothingOfIt) {
    ApplicationStatus status;
    status.placeholder = application(true, kInstallTypeIntentionalDowngrade);
    DeviceSettings settings;
    EXPECT_EQ(explain("com.a", status, settings).state, "placeholder");
    EXPECT_EQ(explain("com.a", status, settings).waitsFor->what, "transfer");
    EXPECT_EQ(explain("com.a", status, settings).waitsFor->who, "host");
    settings.coordination = true;
    EXPECT_EQ(explain("com.a", status, settings).waitsFor->what, "sync");
    EXPECT_EQ(explain("com.a", status, settings).waitsFor->who, "host");
}

TEST(WhyAnswer, PolicyForbidsTheInstallThatAnyPlaceholderWaitsFor) {
    DeviceSettings settings;
    settings.installation = PolicyAnswer::No;
    for (const std::uint64_t type :
         {kInstallTypeSync, kInstallTypeRestore, kInstallTypeDowngrade}) {
        ApplicationStatus status;
        status.placeholder = application(true, type);
        EXPECT_EQ(explain("com.a", status, settings).waitsFor->what, "policy") << type;
    }
}

TEST(WhyAnswer, ARestoreWaitsForItsData) {
    ApplicationStatus status;
    status.awaitsRestoreData = true;
    EXPECT_EQ(explain("com.a", status, {}).waitsFor->what, "restore data");
}

CoordinatorRecord coordinator(CoordinationClient missing) {
    CoordinatorRecord record;
    record.identifier = "com.a";
    record.kind = "initiating";
    record.client = SyncClientID;
    record.promises = {{"com.a-Asset", false, 0.5, missing, false}};
    record.waitsFor = "client N has yet to deliver the package";
    record.waitsForClient = missing;
    return record;
}

DeviceSettings coordinatedSettings() {
    DeviceSettings settings;
    settings.coordination = true;
    return settings;
}

TEST(WhyAnswer, NamesThePromiseOfTheHostThatIsMissing) {
    ApplicationStatus status;
    status.coordinator = coordinator(SyncClientID);
    EXPECT_EQ(explain("com.a", status, coordinatedSettings()).waitsFor->what, "sync");
    status.sessionUnderWay = true;
    const WhyAnswer answer = explain("com.a", status, coordinatedSettings());
    EXPECT_EQ(answer.waitsFor->what, "transfer");
    EXPECT_EQ(answer.waitsFor->who, "host");
    EXPECT_EQ(answer.waitsFor->promise, "com.a-Asset");
    EXPECT_THAT(whyText(answer), HasSubstr("has yet to deliver the package"));
}

TEST(WhyAnswer, NamesAnotherClientAndTheStore) {
    ApplicationStatus status;
    status.coordinator = coordinator(7);
    EXPECT_EQ(explain("com.a", status, coordinatedSettings()).waitsFor->who, "client 7");
    status.coordinator = coordinator(AppStoreClientID);
    EXPECT_EQ(explain("com.a", status, coordinatedSettings()).waitsFor->who, "store");
}

TEST(WhyAnswer, WhatAnotherClientHasBegunCanBeCancelled) {
    ApplicationStatus status;
    status.coordinator = coordinator(AppStoreClientID);
    status.coordinator->client = AppStoreClientID;  // not what the host has left to the store
    const WhyAnswer answer = explain("com.a", status, coordinatedSettings());
    EXPECT_EQ(answer.waitsFor->what, "promise");
    EXPECT_EQ(answer.waitsFor->who, "client 1");
    EXPECT_THAT(whyText(answer), HasSubstr("appsync coordinator DEVICE cancel com.a --client 1"));
}

TEST(WhyAnswer, WhatNobodyHasPromisedIsItsCreatorsTask) {
    ApplicationStatus status;
    status.coordinator = coordinator(SyncClientID);
    status.coordinator->waitsForClient.reset();
    EXPECT_EQ(explain("com.a", status, coordinatedSettings()).waitsFor->what, "sync");
}

TEST(WhyAnswer, ACoordinatorIsGivenUpWhereInstallsAreNotCoordinatedAnyMore) {
    ApplicationStatus status;
    status.coordinator = coordinator(AppStoreClientID);
    EXPECT_THAT(whyText(explain("com.a", status, {})), HasSubstr("coordination=on"));
    status.placeholder = application(true, kInstallTypeDowngrade);
    EXPECT_EQ(explain("com.a", status, {}).waitsFor->what, "transfer") << "that stays";
    status.sessionUnderWay = true;
    EXPECT_EQ(explain("com.a", status, {}).waitsFor->what, "store") << "the session coordinates";
}

TEST(WhyAnswer, ARestoredApplicationComesFromTheStoreWhereInstallsAreCoordinated) {
    ApplicationStatus status;
    status.placeholder = application(true, kInstallTypeRestore);
    EXPECT_EQ(explain("com.a", status, {}).waitsFor->what, "transfer");
    EXPECT_EQ(explain("com.a", status, coordinatedSettings()).waitsFor->what, "store");
    status.awaitsRestoreData = true;
    EXPECT_EQ(explain("com.a", status, {}).waitsFor->what, "restore data");
    EXPECT_EQ(explain("com.a", status, coordinatedSettings()).waitsFor->what, "store");
}

TEST(WhyAnswer, ACompleteCoordinatorWaitsForASessionOrItsInstall) {
    ApplicationStatus status;
    status.coordinator = coordinator(SyncClientID);
    status.coordinator->isComplete = true;
    EXPECT_EQ(explain("com.a", status, coordinatedSettings()).waitsFor->what, "sync");
    status.sessionUnderWay = true;
    EXPECT_EQ(explain("com.a", status, coordinatedSettings()).waitsFor->what, "install");
    EXPECT_FALSE(explain("com.a", status, coordinatedSettings()).waitsFor->promise);
}

TEST(WhyAnswer, NamesThePolicyThatForbids) {
    DeviceSettings settings;
    settings.installation = PolicyAnswer::No;
    settings.coordination = true;
    ApplicationStatus status;
    EXPECT_EQ(explain("com.a", status, settings).waitsFor->what, "policy");
    status.coordinator = coordinator(SyncClientID);
    EXPECT_EQ(explain("com.a", status, settings).waitsFor->what, "policy");
    status.coordinator->isComplete = true;
    EXPECT_EQ(explain("com.a", status, settings).waitsFor->what, "policy");
    status.sessionUnderWay = true;
    EXPECT_EQ(explain("com.a", status, settings).waitsFor->what, "install");
    status.coordinator.reset();
    status.installed = application(false, kInstallTypeSync);
    EXPECT_FALSE(explain("com.a", status, settings).waitsFor);
    status.awaitsRestoreData = true;
    EXPECT_EQ(explain("com.a", status, settings).waitsFor->what, "policy");
}

TEST(WhyAnswer, NoPolicyKeepsTheStoreFromBringingWhatWasRestored) {
    DeviceSettings settings = coordinatedSettings();
    settings.installation = PolicyAnswer::No;
    ApplicationStatus status;
    status.coordinator = coordinator(AppStoreClientID);
    status.coordinator->kind = "restoring";
    EXPECT_EQ(explain("com.a", status, settings).waitsFor->what, "policy");
    status.coordinator->placeholderStands = true;
    EXPECT_EQ(explain("com.a", status, settings).waitsFor->what, "store");
}

TEST(WhyAnswer, NoPackageIsWantedThatWaitsForItsData) {
    ApplicationStatus status;
    status.placeholder = application(true, kInstallTypeRestore);
    status.awaitsRestoreData = true;
    EXPECT_THAT(explain("com.a", status, {}, false).waitsFor->sentence, HasSubstr("--parts 1"));
    const std::string sentence = explain("com.a", status, {}, true).waitsFor->sentence;
    EXPECT_THAT(sentence, HasSubstr("send it (appsync send DEVICE com.a DATA --restore --parts 2"));
    EXPECT_THAT(sentence, testing::Not(HasSubstr("--parts 1")));
}

TEST(WhyAnswer, TellsTheErrorOfTheCoordinator) {
    ApplicationStatus status;
    status.coordinator = coordinator(SyncClientID);
    status.coordinator->error = ErrorRecord::make(kInstallerErrorDomain, 6, "a file is damaged");
    EXPECT_EQ(explain("com.a", status, {}).lastError, "a file is damaged");
}

TEST(WhyAnswer, TellsTheLastError) {
    ApplicationStatus status;
    status.lastFailure =
        InstallFailure{{}, ErrorRecord::make(kInstallerErrorDomain, 6, "a file is damaged")};
    const WhyAnswer answer = explain("com.a", status, {});
    EXPECT_EQ(answer.state, "absent");
    EXPECT_EQ(answer.lastError, "a file is damaged");
    EXPECT_THAT(whyText(answer), HasSubstr("Its last error: a file is damaged"));
}

}  // namespace
}  // namespace appsync
