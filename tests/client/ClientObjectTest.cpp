#include <algorithm>
#include <cstdint>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using Access = AppsClientTestAccess;

constexpr std::string_view kStartup = "com.korvu.trd.TRStartupCompleteNotification";

class ClientObject : public AppsClientFixture {};

TEST_F(ClientObject, IsMadeInOrder) {
    client_.reset();
    platform_.clearRecording();
    client_ = AppsClient::create(platform_.services());
    EXPECT_THAT(
        platform_.lines(),
        ElementsAre("WorkQueues.makeWaitGroup() -> WaitGroup#3",
                    "WorkQueues.makeWaitGroup() -> WaitGroup#4",
                    "WorkQueues.makeOperationQueue() -> OperationQueue#2",
                    "OperationQueue#2.setMaximumConcurrentOperations(10)",
                    "BackupService.makeManager() -> a manager",
                    "WorkQueues.makeSerialQueue(com.korvu.qmx.Travend.AppSync) -> SerialQueue#3",
                    "WorkQueues.makeSerialQueue(com.korvu.qmx.Travend.AppRestore) -> "
                    "SerialQueue#4",
                    "WorkQueues.makeLock() -> Lock#3", "WorkQueues.makeLock() -> Lock#4",
                    "AppRegistry.addObserver()",
                    "LogFacility.makeHandle(com.korvu.appinstallation, trd.appsync) -> a handle",
                    "InstallTransactionLog.initialize(com.korvu.appinstallation/trd.appsync)",
                    "InstallCoordinatorService.isCoordinationEnabled() -> no",
                    "SyncHost.mainBundleIdentifier() -> com.korvu.trd",
                    "NotificationCenter.addObserver(com.korvu.trd.TRStartupCompleteNotification, "
                    "Drop)"));
}

TEST_F(ClientObject, OutsideTheDaemonDoesNotListenForItsStart) {
    client_.reset();
    platform_.host.setMainBundleIdentifier("com.example.other");
    makeClient();
    EXPECT_EQ(platform_.notificationCenter.observers(kStartup), 0U);
    EXPECT_FALSE(Access::finishedWaitingForPlaceHolderInstalls(*client_));
    platform_.clearRecording();
    client_.reset();
    EXPECT_THAT(platform_.calls(),
                ElementsAre("AppRegistry.removeObserver()",
                            "SyncHost.mainBundleIdentifier() -> com.example.other"));
}

TEST_F(ClientObject, InsideTheDaemonListensForItsStart) {
    EXPECT_EQ(platform_.notificationCenter.observers(kStartup), 1U);
    EXPECT_TRUE(Access::finishedWaitingForPlaceHolderInstalls(*client_));
    platform_.notificationCenter.post(kStartup);
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.lines(),
                ElementsAre("NotificationCenterObserver.callback(" + std::string(kStartup) + ")",
                            "InstallCoordinatorService.makeAppInstallObserver(com.korvu.trd.rlink."
                            "tsappobserverdelegate, {3}) -> an observer"));
}

TEST_F(ClientObject, ObservesItsCoordinatorsOnceHoweverOftenTheDaemonStarts) {
    platform_.notificationCenter.post(kStartup);
    platform_.notificationCenter.post(kStartup);
    platform_.runUntilIdle();
    EXPECT_TRUE(Access::hasAppInstallObserver(*client_));
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService"}), testing::SizeIs(1));
    client_.reset();
    EXPECT_THAT(platform_.coordination.appInstallObservers(), testing::IsEmpty());
}

TEST_F(ClientObject, StopsListeningWhenItIsDestroyed) {
    client_.reset();
    EXPECT_THAT(platform_.lines(),
                ElementsAre("AppRegistry.removeObserver()",
                            "SyncHost.mainBundleIdentifier() -> com.korvu.trd",
                            "NotificationCenter.removeObserver(" + std::string(kStartup) + ")"));
    EXPECT_EQ(platform_.registry.observers(), 0U);
    EXPECT_EQ(platform_.notificationCenter.observers(kStartup), 0U);
}

TEST_F(ClientObject, WarnsOfOutstandingTransfersWhenItIsDestroyed) {
    client_->assetTransferUpdatedProgress(receivedAsset(kA), 0.5);
    client_->assetTransferUpdatedProgress(receivedAsset(kB), 0.5);
    client_.reset();
    EXPECT_TRUE(logged(LogLevel::Error,
                       "<AppsClient> getting dealloc'd with 2 outstanding HFT transfers!"));
}

TEST_F(ClientObject, WarnsOfAwaitedPlaceholdersWhenItIsDestroyed) {
    Access::placeholdersForRestoringApps(*client_) = {kA, kB};
    client_.reset();
    EXPECT_TRUE(logged(LogLevel::Error,
                       "<AppsClient> getting dealloc'd with (com.example.a, com.example.b)pending "
                       "placeholder install complete notifications"));
}

TEST_F(ClientObject, WarnsInOrderBeforeItStopsListening) {
    client_->assetTransferUpdatedProgress(receivedAsset(kA), 0.5);
    Access::placeholdersForRestoringApps(*client_) = {kB};
    platform_.clearRecording();
    client_.reset();
    EXPECT_THAT(
        platform_.lines(),
        ElementsAre("8 error <AppsClient> getting dealloc'd with 1 outstanding HFT transfers!",
                    "8 error <AppsClient> getting dealloc'd with (com.example.b)pending "
                    "placeholder install complete notifications",
                    "AppRegistry.removeObserver()",
                    "SyncHost.mainBundleIdentifier() -> com.korvu.trd",
                    "NotificationCenter.removeObserver(" + std::string(kStartup) + ")"));
}

TEST_F(ClientObject, AsksOnceWhetherInstallsAreCoordinated) {
    platform_.coordination.setEnabled(true);
    client_->assetTransferUpdatedProgress(receivedAsset(kA), 0.5);
    EXPECT_THAT(client_->outstandingAssetTransfers(), testing::IsEmpty());
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService"}), testing::IsEmpty());
}

TEST_F(ClientObject, KeepsToCoordinationForItsWholeLife) {
    platform_.coordination.setEnabled(true);
    makeClient();
    platform_.coordination.setEnabled(false);
    EXPECT_EQ(client_->_progressForAssetIdentifier(kA), nullptr);
    EXPECT_THAT(platform_.messages(),
                ElementsAre("Not returning XOProgress * for com.example.a as tessarin is enabled"));
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService"}), testing::IsEmpty());
}

TEST_F(ClientObject, OwnsTheApplicationDataclass) {
    EXPECT_THAT(client_->supportedDataclasses(), ElementsAre("Application"));
}

TEST_F(ClientObject, KeepsNoAnchorOfItsOwn) {
    std::optional<ErrorRecord> error;
    EXPECT_TRUE(client_->prepareForSyncWithHostAnchor("host anchor", {}, &error));
    EXPECT_TRUE(client_->reconcileSync({}, "new anchor", {}, &error));
    EXPECT_EQ(client_->currentSyncAnchor(), "NO_APP_SYNC_ANCHOR");
}

TEST_F(ClientObject, ForgetsTheApplicationsToIgnoreWhenASessionBegins) {
    Access::kolmAppsToIgnore(*client_) = {kA};
    std::optional<ErrorRecord> error;
    EXPECT_TRUE(client_->prepareForSyncWithHostAnchor("anchor", {}, &error));
    EXPECT_TRUE(Access::kolmAppsToIgnore(*client_).empty());
    EXPECT_EQ(error, std::nullopt);
    EXPECT_THAT(platform_.lines(), testing::IsEmpty());
}

struct PolicyCase {
    PolicyAnswer installation;
    PolicyAnswer removal;
    bool disabled;
};

class DisabledAssetTypes : public ClientObject, public testing::WithParamInterface<PolicyCase> {};

TEST_P(DisabledAssetTypes, NeedBothPoliciesToSayNo) {
    platform_.policy.set(PolicyFeature::AppInstallationAllowed, GetParam().installation);
    platform_.policy.set(PolicyFeature::AppRemovalAllowed, GetParam().removal);
    const std::set<std::string> everything{"Application"};
    EXPECT_EQ(client_->disabledAssetTypes(),
              GetParam().disabled ? std::optional(everything) : std::nullopt);
}

constexpr auto kUnset = PolicyAnswer::Unset;
constexpr auto kYes = PolicyAnswer::Yes;
constexpr auto kNo = PolicyAnswer::No;

INSTANTIATE_TEST_SUITE_P(EveryAnswer, DisabledAssetTypes,
                         testing::Values(PolicyCase{kUnset, kUnset, false},
                                         PolicyCase{kUnset, kNo, false},
                                         PolicyCase{kYes, kNo, false}, PolicyCase{kNo, kYes, false},
                                         PolicyCase{kNo, kUnset, false},
                                         PolicyCase{kNo, kNo, true}));

TEST_F(ClientObject, CountsAnUnsetPolicyAsAllowed) {
    EXPECT_TRUE(client_->_appInstallationAllowed());
    EXPECT_TRUE(client_->_appRemovalAllowed());
    platform_.policy.set(PolicyFeature::AppRemovalAllowed, kNo);
    EXPECT_TRUE(client_->_appInstallationAllowed());
    EXPECT_FALSE(client_->_appRemovalAllowed());
}

TEST_F(ClientObject, CountsInstallAttemptsOnce) {
    client_->_enqueueAssetInstall(receivedAsset(kA));
    client_->_enqueueAssetInstall(receivedAsset(kB));
    platform_.runUntilIdle();
    EXPECT_EQ(client_->_getAndResetNumAppInstallsAttempted(), 2U);
    EXPECT_EQ(client_->_getAndResetNumAppInstallsAttempted(), 0U);
}

TEST_F(ClientObject, ObservesItsCoordinatorsAtTheNextStartWhenTheServiceCouldNotTellIt) {
    platform_.coordination.makeNoneNext(CoordinationObject::AppInstallObserver,
                                        "com.korvu.trd.rlink.tsappobserverdelegate");
    client_->setupInstallCoordinatorObserver();
    EXPECT_FALSE(Access::hasAppInstallObserver(*client_));
    client_->setupInstallCoordinatorObserver();
    EXPECT_TRUE(Access::hasAppInstallObserver(*client_));
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService"}), testing::SizeIs(2));
}

/// The daemon's start is told while the client is being destroyed. Whether it was told in time:
/// after the client could no longer be held, and before it stopped listening.
bool isToldWhileItDies(PropertyListSerialization& codec, std::uint64_t seed) {
    constexpr std::string_view told = "NotificationCenterObserver.callback(";
    SimulatedPlatform platform(codec, Scheduling::seeded(seed));
    auto client = AppsClient::create(platform.services());
    platform.runUntilIdle();
    platform.clearRecording();
    platform.onCall("AppRegistry.removeObserver", [&platform](const RecordEntry&) {
        platform.notificationCenter.post(kStartup);
    });
    client.reset();
    const std::vector<std::string> calls = platform.calls();
    platform.runUntilIdle();
    EXPECT_THAT(platform.coordination.appInstallObservers(), testing::IsEmpty());
    EXPECT_THAT(platform.callsTo({"InstallCoordinatorService"}), testing::IsEmpty());
    return std::any_of(calls.begin(), calls.end(),
                       [told](const std::string& call) { return call.starts_with(told); });
}

TEST_F(ClientObject, DoesNotHeedAStartThatIsToldWhileItDies) {
    int told = 0;
    for (std::uint64_t seed = 1; seed <= 30; ++seed) told += isToldWhileItDies(codec_, seed);
    EXPECT_GT(told, 0);
}

}  // namespace
}  // namespace appsync
