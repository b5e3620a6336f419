#include <functional>
#include <ostream>

#include "platform/absent/AbsentServices.h"
#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

/// Sessions on a device in memory that lacks some of its services.
class AbsentServicesTest : public AppsClientFixture {
  protected:
    AbsentServicesTest() = default;
    ~AbsentServicesTest() override { client_.reset(); }  // before what it was made with
    AbsentServicesTest(const AbsentServicesTest&) = delete;
    AbsentServicesTest& operator=(const AbsentServicesTest&) = delete;

    /// The platform with those that the device lacks in the place of its own.
    Platform lacking() {
        const Platform full = platform_.services();
        return {
            .host = full.host,
            .log = lacks("log") ? absent_.log : full.log,
            .registry = full.registry,
            .installer = lacks("installer") ? absent_.uninstalled : full.installer,
            .coordination = lacks("coordination") ? absent_.coordination : full.coordination,
            .policy = lacks("policy") ? absent_.policy : full.policy,
            .backup = lacks("backup") ? absent_.backup : full.backup,
            .homeScreen = lacks("homeScreen") ? absent_.homeScreen : full.homeScreen,
            .icons = lacks("icons") ? absent_.icons : full.icons,
            .transactions = lacks("transactions") ? absent_.transactions : full.transactions,
            .queues = full.queues,
            .files = full.files,
            .propertyLists = full.propertyLists,
            .notifications = lacks("notifications") ? absent_.notifications : full.notifications,
            .notificationCenter =
                lacks("notificationCenter") ? absent_.notificationCenter : full.notificationCenter};
    }
    void makeClientLacking(std::set<std::string> names) {
        lacking_ = std::move(names);
        client_ = AppsClient::create(lacking());
        platform_.runUntilIdle();
        platform_.clearRecording();
    }

    /// A whole session: one application is removed, one updated, one comes.
    void sync() {
        platform_.registry.addApplication(kA);
        platform_.registry.addApplication(kB);
        stage(PropertyList::array({todoEntry(kA, kTodoRemove), todoEntry(kB, kTodoInstall),
                                   todoEntry(kC, kTodoInstall)}));
        EXPECT_TRUE(client_->reconcileSync(PropertyList::map(), "1", {}, nullptr));
        deleted_ = client_->installedAssets();
        for (const SyncAssetPointer& asset : client_->outstandingAssetTransfers()) {
            assets_.push_back(asset);
            asset->path = packagePath(asset->identifier);
            platform_.files.addFile(*asset->path, "package");
            client_->assetTransferSucceeded(asset, true, nullptr);
        }
        client_->assetTransferEndedWithSuccess(true);
        client_->syncEndedWithSuccess(true);
    }
    void expectSynced() {
        EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kB, kC));
        EXPECT_THAT(platform_.registry.placeholderIdentifiers(), IsEmpty());
        EXPECT_EQ(operationOf(kB), kTodoInstalled);
        EXPECT_EQ(operationOf(kC), kTodoInstalled);
    }

    AbsentServices absent_;
    std::set<std::string> lacking_;
    std::vector<SyncAssetPointer> assets_;
    PropertyList deleted_;

  private:
    [[nodiscard]] bool lacks(const std::string& name) const { return lacking_.contains(name); }
};

class EachAbsentService : public AbsentServicesTest,
                          public testing::WithParamInterface<std::string> {};

INSTANTIATE_TEST_SUITE_P(, EachAbsentService,
                         testing::Values("backup", "coordination", "homeScreen", "icons", "log",
                                         "notificationCenter", "notifications", "policy",
                                         "transactions", "installer"),
                         [](const auto& tested) { return tested.param; });

TEST_P(EachAbsentService, IsNoHindranceToASync) {
    makeClientLacking({GetParam()});
    sync();
    expectSynced();
}

TEST_F(AbsentServicesTest, ASyncNeedsNoneOfThem) {
    const Platform full = platform_.services();
    client_ = AppsClient::create(
        absent_.completed(full.host, full.registry, full.queues, full.files, full.propertyLists));
    platform_.clearRecording();
    sync();
    expectSynced();
    EXPECT_THAT(platform_.messages(), IsEmpty());
}

TEST_F(AbsentServicesTest, WithoutCoordinationInstallsAreDirectAlsoWhenTheDaemonHasStarted) {
    platform_.coordination.setEnabled(true);
    makeClientLacking({"coordination"});
    platform_.notificationCenter.post(kStartupCompleteNotification);
    platform_.runUntilIdle();
    sync();
    expectSynced();
    EXPECT_EQ(platform_.callsTo({"AppRegistry.installPackage"}).size(), 2U);
}

TEST_F(AbsentServicesTest, WithoutCoordinationWhoeverAsksGetsNothing) {
    NoCoordination& coordination = absent_.coordination;
    using Creation = InstallCoordinatorService::Creation;
    const auto found = coordination.coordinator(CoordinatorKind::Initiating, kA, SyncClientID,
                                                Creation::CreateIfNotExisting);
    EXPECT_EQ(found.coordinator, nullptr);
    EXPECT_FALSE(found.wasCreated);
    ASSERT_TRUE(found.error);
    EXPECT_THAT(found.error->description(), HasSubstr("does not coordinate"));
    EXPECT_EQ(coordination.existingCoordinator(kA, SyncClientID), nullptr);
    EXPECT_EQ(coordination.makePathTransferPromise("p", SyncClientID, {}, 1), nullptr);
    EXPECT_EQ(coordination.makeOutOfBandPromise("p", SyncClientID, 1), nullptr);
    EXPECT_EQ(coordination.makeAppPlaceholder("p", kA, kInstallTypeSync, SyncClientID), nullptr);
    int completions = 0;
    coordination.uninstallApp(kA, [&](const ErrorRecord* error) {
        ++completions;
        EXPECT_NE(error, nullptr);
    });
    EXPECT_EQ(completions, 1);
    const ErrorRecord cause = ErrorRecord::make(kRegistryErrorDomain, 7, "cause");
    EXPECT_EQ(coordination.userPresentableError(1, cause), cause);
    EXPECT_EQ(coordination.userPresentableError(1, {}).code, 1);
}

TEST_F(AbsentServicesTest, WithoutIconsTheHostsArtworkIsTheIcon) {
    makeClientLacking({"icons"});
    sync();
    ASSERT_EQ(assets_.size(), 2U);
    ASSERT_TRUE(assets_.front()->icon);
    EXPECT_THAT(assets_.front()->icon->path(), HasSubstr("/VessikArtwork"));
}

TEST_F(AbsentServicesTest, WithoutAHomeScreenNoInstallWaitsAndNoLayoutIsSet) {
    makeClientLacking({"homeScreen"});
    platform_.files.addFile(std::string(kStagingArea) + "/DeskoraIconState.plist", "layout");
    platform_.registry.addApplication(kB);
    platform_.homeScreen.setRunning(kB, true);
    sync();
    expectSynced();
    EXPECT_THAT(platform_.callsTo({"HomeScreenService", "HomeScreenConnection"}), IsEmpty());
    EXPECT_EQ(platform_.now(), SimulatedTime(0)) << "nothing was tried again later";
}

TEST_F(AbsentServicesTest, WithoutAListNothingWasUninstalled) {
    platform_.installer.addUninstalled("com.example.gone");
    makeClientLacking({"installer"});
    sync();
    const PropertyList* deleted = deleted_.find("_Deleted");
    ASSERT_NE(deleted, nullptr);
    EXPECT_EQ(deleted->size(), 0U);
    EXPECT_THAT(platform_.callsTo({"InstallerService"}), IsEmpty());
}

TEST_F(AbsentServicesTest, WithoutAPolicyBothAreAllowed) {
    platform_.policy.set(PolicyFeature::AppInstallationAllowed, PolicyAnswer::No);
    platform_.policy.set(PolicyFeature::AppRemovalAllowed, PolicyAnswer::No);
    makeClientLacking({"policy"});
    EXPECT_EQ(client_->disabledAssetTypes(), std::nullopt);
    sync();
    expectSynced();
}

TEST_F(AbsentServicesTest, WithoutABackupServiceARestoreDoesNotWaitForData) {
    platform_.backup.addRestoreData(kA);
    makeClientLacking({"backup"});
    const SyncAssetPointer asset = receivedAsset(kA);
    asset->isRestore = true;
    client_->assetTransferSucceeded(asset, true, nullptr);
    client_->assetTransferEndedWithSuccess(true);
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kA));
}

TEST_F(AbsentServicesTest, WithoutNotificationsThePostsAreTakenAndNobodyHears) {
    makeClientLacking({"notifications"});
    sync();
    EXPECT_THAT(platform_.messages(), Not(Contains(HasSubstr("can't send notification"))));
    EXPECT_THAT(platform_.callsTo({"NamedNotifications"}), IsEmpty());
}

}  // namespace
}  // namespace appsync
