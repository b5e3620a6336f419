#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using Access = AppsClientTestAccess;

/// Which packages are asked for where installs are coordinated.
class CoordinatedOutstandingTransfers : public AppsClientFixture {
  protected:
    CoordinatedOutstandingTransfers() {
        makeCoordinatedClient();
        platform_.files.addDirectory(std::string(kTodoDirectory));
    }
    std::vector<std::string> transfers() {
        assets_ = client_->outstandingAssetTransfers();
        platform_.runUntilIdle();
        std::vector<std::string> identifiers;
        for (const SyncAssetPointer& asset : assets_) identifiers.push_back(asset->identifier);
        return identifiers;
    }
    void request(std::initializer_list<const char*> identifiers) {
        PropertyList list = PropertyList::array();
        for (const char* identifier : identifiers) list.append(todoEntry(identifier, "install"));
        setTodoList(list);
    }
    void addPlaceholder(const std::string& identifier, std::uint64_t installType,
                        std::string_view type = kApplicationTypeUser) {
        AppProxy proxy;
        proxy.applicationIdentifier = identifier;
        proxy.applicationType = type;
        proxy.installType = installType;
        proxy.bundleContainerPath = "/containers/" + identifier;
        proxy.bundlePath = proxy.bundleContainerPath + "/Example.app";
        proxy.state.placeholder = true;
        platform_.registry.add(proxy);
    }

    std::vector<SyncAssetPointer> assets_;
};

TEST_F(CoordinatedOutstandingTransfers, HaveACoordinatorEachAndNoDirectPlaceholder) {
    request({kA, kB});
    EXPECT_THAT(transfers(), ElementsAre(kA, kB));
    EXPECT_THAT(platform_.coordination.identifiers(), ElementsAre(kA, kB));
    EXPECT_EQ(platform_.coordination.state(kA)->kind, CoordinatorKind::Initiating);
    EXPECT_THAT(platform_.callsTo({"AppRegistry.installPlaceholderBundle"}), IsEmpty());
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), ElementsAre(kA, kB));
    EXPECT_THAT(Access::updatingApps(*client_), IsEmpty());
    EXPECT_EQ(operationOf(kA), "install");
}

TEST_F(CoordinatedOutstandingTransfers, UpdateWhatIsInstalled) {
    platform_.registry.addApplication(kA, "0.9");
    request({kA, kB});
    EXPECT_THAT(transfers(), ElementsAre(kA, kB));
    EXPECT_EQ(platform_.coordination.state(kA)->kind, CoordinatorKind::Updating);
    EXPECT_THAT(Access::updatingApps(*client_), ElementsAre(kA));
    EXPECT_TRUE(
        logged(LogLevel::Default, "App com.example.a is already installed and will be updated."));
    EXPECT_FALSE(
        logged(LogLevel::Default, "App com.example.b is already installed and will be updated."));
}

TEST_F(CoordinatedOutstandingTransfers, LeaveOutWhatCannotBePrepared) {
    platform_.coordination.addCoordinator(CoordinatorKind::Initiating, kA, AppStoreClientID);
    request({kA, kB});
    EXPECT_THAT(transfers(), ElementsAre(kB));
    EXPECT_TRUE(logged(LogLevel::Error, "Not requesting app asset for com.example.a"));
    EXPECT_EQ(operationOf(kA), "FAILED");
    EXPECT_EQ(operationOf(kB), "install");
}

TEST_F(CoordinatedOutstandingTransfers, DoNotUpdateWhatCannotBePrepared) {
    platform_.registry.addApplication(kA, "0.9");
    platform_.coordination.failNext(CoordinationStep::InstallOptions, kA, {"Coordination", 7, {}});
    request({kA});
    EXPECT_THAT(transfers(), IsEmpty());
    EXPECT_THAT(Access::updatingApps(*client_), IsEmpty());
}

TEST_F(CoordinatedOutstandingTransfers, AskAgainForWhatStillHasItsPlaceholder) {
    request({kA});
    EXPECT_THAT(transfers(), ElementsAre(kA));
    EXPECT_THAT(transfers(), ElementsAre(kA));
    EXPECT_TRUE(logged(LogLevel::Default, "com.example.a already has a placeholder - skipping"));
    EXPECT_TRUE(
        logged(LogLevel::Default, "coordinator for com.example.a has a placeholder promise"));
}

TEST_F(CoordinatedOutstandingTransfers, LeaveOutWhatIsInProgress) {
    addPlaceholder(kA, kInstallTypeStoreDownload);
    platform_.registry.setProgress(kA, {kInstallStateActive, kInstallPhaseLoading, 0, 0});
    request({kA, kB});
    EXPECT_THAT(transfers(), ElementsAre(kB));
    EXPECT_THAT(platform_.coordination.identifiers(), ElementsAre(kB));
    EXPECT_EQ(operationOf(kA), "install");
}

TEST_F(CoordinatedOutstandingTransfers, ShowTheIconOfThePlaceholdersBundle) {
    addPlaceholder(kA, kInstallTypeDowngrade);
    request({kA});
    EXPECT_THAT(transfers(), ElementsAre(kA));
    EXPECT_EQ(platform_.files.contents(assets_.front()->icon->path()),
              SimulatedIconRenderer::imageOf("/containers/com.example.a/Example.app"));
}

TEST_F(CoordinatedOutstandingTransfers, LeaveRestoresToTheStore) {
    addPlaceholder(kA, kInstallTypeRestore);
    request({kA});
    EXPECT_THAT(transfers(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default,
                       "com.example.a is currenlty marked to be restored and will be handled by "
                       "bazaard - skipping"));
    EXPECT_THAT(platform_.coordination.identifiers(), IsEmpty());
}

TEST_F(CoordinatedOutstandingTransfers, LeaveOutRestoresToIgnoreFirst) {
    addPlaceholder(kA, kInstallTypeRestore);
    Access::kolmAppsToIgnore(*client_) = {kA};
    EXPECT_THAT(transfers(), IsEmpty());
    EXPECT_TRUE(
        logged(LogLevel::Default,
               "com.example.a is currenlty marked as to be ignored for download - skipping"));
    EXPECT_THAT(platform_.messages(), Not(Contains(HasSubstr("bazaard"))));
}

TEST_F(CoordinatedOutstandingTransfers, LeaveOutWhatIsNoRestoreWhenInstallingIsNotAllowed) {
    platform_.policy.set(PolicyFeature::AppInstallationAllowed, PolicyAnswer::No);
    request({kA});
    EXPECT_THAT(transfers(), IsEmpty());
    EXPECT_THAT(platform_.coordination.identifiers(), IsEmpty());
}

struct DemotionCase {
    std::uint64_t installType;
    const char* numbers;  // as the messages show them
};

class CoordinatedDemotion : public CoordinatedOutstandingTransfers,
                            public testing::WithParamInterface<DemotionCase> {};

TEST_P(CoordinatedDemotion, IsLeftAloneUnlessTheHostAsks) {
    addPlaceholder(kA, GetParam().installType);
    EXPECT_THAT(transfers(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default, "com.example.a is currenlty demoted (" +
                                              std::string(GetParam().numbers) + ") - skipping"));
    EXPECT_THAT(platform_.coordination.identifiers(), IsEmpty());
}

TEST_P(CoordinatedDemotion, EndsWhenTheHostAsks) {
    addPlaceholder(kA, GetParam().installType);
    request({kA});
    EXPECT_THAT(transfers(), ElementsAre(kA));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "com.example.a is currenlty demoted (" + std::string(GetParam().numbers) +
                           ") - but will be installed as it's requested by client"));
    // The placeholder's own files, not those that the host staged.
    EXPECT_EQ(assets_.front()->infoPath, "/containers/com.example.a/Info.plist");
    EXPECT_NE(platform_.coordination.state(kA), nullptr);
}

TEST_P(CoordinatedDemotion, DoesNotMatterWhereInstallsAreDirect) {
    platform_.coordination.setEnabled(false);
    makeClient();
    addPlaceholder(kA, GetParam().installType);
    EXPECT_THAT(transfers(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Not creating a placeholder app for com.example.a because we already have "
                       "one"));
    EXPECT_THAT(platform_.messages(), Not(Contains(HasSubstr("currenlty demoted"))));
}

// The labels stand the wrong way round in the messages.
INSTANTIATE_TEST_SUITE_P(BothKinds, CoordinatedDemotion,
                         testing::Values(DemotionCase{kInstallTypeDowngrade, "manual:1, auto:0"},
                                         DemotionCase{kInstallTypeIntentionalDowngrade,
                                                      "manual:0, auto:1"}));

TEST_F(CoordinatedOutstandingTransfers, LeaveOutSystemApplications) {
    addPlaceholder(kA, kInstallTypeDowngrade, kApplicationTypeSystem);
    addPlaceholder(kB, kInstallTypeIntentionalDowngrade, kApplicationTypeSystem);
    addPlaceholder(kC, kInstallTypeSync, kApplicationTypeSystem);
    request({kA, kB, kC});
    EXPECT_THAT(transfers(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default,
                       "com.example.a is auto demoted: 1, manual demoted: 0, system app:1 - "
                       "skipping"));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "com.example.b is auto demoted: 0, manual demoted: 1, system app:1 - "
                       "skipping"));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "com.example.c is auto demoted: 0, manual demoted: 0, system app:1 - "
                       "skipping"));
    EXPECT_THAT(platform_.coordination.identifiers(), IsEmpty());
}

/// A package under way to a coordinator; two of them, the second of an update.
class CoordinatedTransferEvents : public AppsClientFixture {
  protected:
    CoordinatedTransferEvents() {
        makeCoordinatedClient();
        client_->setupInstallCoordinatorObserver();
        platform_.files.addDirectory(std::string(kWorkArea));
        platform_.registry.addApplication(kB, "0.9");
        setTodoList(PropertyList::array({todoEntry(kA, "install"), todoEntry(kB, "install")}));
        for (const SyncAssetPointer& asset : client_->outstandingAssetTransfers()) {
            (asset->identifier == kA ? asset_ : update_) = asset;
        }
        platform_.runUntilIdle();
        platform_.clearRecording();
    }
    void receive(const SyncAssetPointer& asset) {
        asset->path = packagePath(asset->identifier);
        platform_.files.addFile(*asset->path, "package");
        client_->assetTransferSucceeded(asset, true, nullptr);
        platform_.runUntilIdle();
    }
    void fail(const SyncAssetPointer& asset, const ErrorRecord* error) {
        client_->assetTransferSucceeded(asset, false, error);
        platform_.runUntilIdle();
    }
    void cancelByUser(const std::string& identifier) {
        platform_.coordination.postCanceled(identifier, error_, AppStoreClientID);
        platform_.runUntilIdle();
        platform_.clearRecording();
    }
    [[nodiscard]] std::vector<std::string> cancels() const {
        return platform_.callsTo({"InstallCoordinator.cancelForReason"});
    }
    [[nodiscard]] std::set<std::string> outstanding() const {
        return AppsClientTestAccess::outstandingHFTTransfers(*client_);
    }

    SyncAssetPointer asset_;
    SyncAssetPointer update_;
    const ErrorRecord error_ = ErrorRecord::make("Transport", 54, "the cable was pulled");
};

TEST_F(CoordinatedTransferEvents, UpdateThePromiseOfTheRightCoordinator) {
    asset_->downloadProgress = 0.25;
    update_->downloadProgress = 0.5;
    client_->assetTransferUpdatedProgress(asset_, 0.25);
    client_->assetTransferUpdatedProgress(update_, 0.5);
    EXPECT_EQ(platform_.coordination.state(kA)->appAsset->percent, 0.25);
    EXPECT_EQ(platform_.coordination.state(kB)->appAsset->percent, 0.5);
    EXPECT_THAT(outstanding(), ElementsAre(kA, kB));
    EXPECT_THAT(platform_.callsTo({"AppRegistry", "InstallProgressRecord"}), IsEmpty());
    EXPECT_THAT(platform_.messages(), Not(Contains(HasSubstr("XOProgress"))));
}

TEST_F(CoordinatedTransferEvents, AreBookedWithoutACoordinatorToo) {
    platform_.coordination.cancel(kA, error_, AppStoreClientID);
    client_->assetTransferUpdatedProgress(asset_, 0.25);
    EXPECT_THAT(outstanding(), ElementsAre(kA));
}

TEST_F(CoordinatedTransferEvents, InstallWhatHasCome) {
    receive(asset_);
    receive(update_);
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kA, kB));
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_EQ(operationOf(kB), "INSTALLED");
    EXPECT_THAT(platform_.callsTo(
                    {"OperationQueue", "HomeScreenService", "AppRegistry.finishInstallPhase"}),
                IsEmpty());
    EXPECT_THAT(Access::updatingApps(*client_), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Not returning XOProgress * for com.example.a as tessarin is enabled"));
}

TEST_F(CoordinatedTransferEvents, MarkWhatCouldNotBeInstalled) {
    platform_.registry.failNextInstall(kA, error_);
    receive(asset_);
    EXPECT_EQ(operationOf(kA), "FAILED");
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), ElementsAre(kB));
}

TEST_F(CoordinatedTransferEvents, DoNotInstallARestore) {
    asset_->isRestore = true;
    receive(asset_);
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Not processing restore asset com.example.a as coordination is enabled"));
    EXPECT_FALSE(platform_.coordination.state(kA)->appAsset->complete);
    EXPECT_THAT(platform_.callsTo({"BackupManager"}), IsEmpty());
}

TEST_F(CoordinatedTransferEvents, DoNotTakeTheDataOfARestore) {
    asset_->isRestore = true;
    asset_->completedParts = kAssetPartApplicationData;
    receive(asset_);
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Not processing kTRAssetPartApplicationData for restore asset "
                       "com.example.a as coordination is enabled"));
    EXPECT_THAT(platform_.callsTo({"OperationQueue"}), IsEmpty());
}

TEST_F(CoordinatedTransferEvents, CancelTheCoordinatorAfterAFailure) {
    platform_.host.setRecoverableTest([](const ErrorRecord&) { return true; });
    fail(asset_, &error_);
    EXPECT_EQ(platform_.coordination.state(kA), nullptr);
    EXPECT_EQ(platform_.coordination.ended(kA)->cancelled->reason,
              platform_.coordination.userPresentableError(1, error_));
    EXPECT_TRUE(logged(LogLevel::Default, "Uninstalling placeholder com.example.a"));
    EXPECT_THAT(platform_.messages(),
                Contains(HasSubstr("Tessarin is enabled - treating error Error Domain=Transport "
                                   "Code=54")));
    EXPECT_THAT(platform_.messages(), Contains(HasSubstr("recoverable=0")));
    EXPECT_THAT(
        platform_.callsTo({"AppRegistry.uninstallApplication", "SyncHost.isRecoverableError"}),
        IsEmpty());
}

TEST_F(CoordinatedTransferEvents, CancelTheCoordinatorOfAnUpdateAndKeepTheApplication) {
    fail(update_, &error_);
    EXPECT_EQ(platform_.coordination.state(kB), nullptr);
    EXPECT_THAT(cancels(), testing::SizeIs(1));
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kB));
}

TEST_F(CoordinatedTransferEvents, GiveAFailureWithoutAnErrorOne) {
    fail(asset_, nullptr);
    EXPECT_EQ(platform_.coordination.state(kA), nullptr);
    const ErrorRecord unexplained{"TRError", 30, {}};
    EXPECT_EQ(platform_.coordination.ended(kA)->cancelled->reason,
              platform_.coordination.userPresentableError(1, unexplained));
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kB));
}

TEST_F(CoordinatedTransferEvents, StopAtAFailureThatTheUserCaused) {
    cancelByUser(kA);
    fail(asset_, &error_);
    EXPECT_THAT(cancels(), IsEmpty());
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService"}), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default, "Uninstalling placeholder com.example.a"));
    EXPECT_THAT(Access::userCancelledApps(*client_), IsEmpty());
}

TEST_F(CoordinatedTransferEvents, StopOnlyForTheApplicationThatWasCancelled) {
    cancelByUser(kA);
    fail(update_, &error_);
    EXPECT_THAT(cancels(), ElementsAre(HasSubstr("cancelForReason(com.example.b")));
    EXPECT_THAT(Access::userCancelledApps(*client_), Contains(kA));
}

TEST_F(CoordinatedTransferEvents, LeaveARestoreAloneThatFails) {
    asset_->isRestore = true;
    fail(asset_, &error_);
    EXPECT_THAT(cancels(), IsEmpty());
    EXPECT_THAT(platform_.callsTo({"BackupManager"}), IsEmpty());
}

TEST_F(CoordinatedTransferEvents, LeaveAloneWhatIsNotOnTheDevice) {
    auto unknown = std::make_shared<SyncAsset>();
    unknown->identifier = kC;
    fail(unknown, &error_);
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService"}), IsEmpty());
}

TEST_F(CoordinatedTransferEvents, CancelWhatIsOutstandingAfterAFailedPhase) {
    client_->assetTransferUpdatedProgress(asset_, 0.5);
    cancelByUser(kC);
    client_->assetTransferEndedWithSuccess(false);
    EXPECT_EQ(platform_.coordination.state(kA), nullptr);
    EXPECT_EQ(platform_.coordination.ended(kA)->cancelled,
              (SimulatedCancel{{"TRError", 30, {}}, SyncClientID}));
    EXPECT_NE(platform_.coordination.state(kB), nullptr);
    EXPECT_THAT(outstanding(), IsEmpty());
    EXPECT_THAT(Access::updatingApps(*client_), IsEmpty());
    EXPECT_THAT(Access::userCancelledApps(*client_), IsEmpty());
    EXPECT_THAT(platform_.messages(), Not(Contains(HasSubstr("HFT loading phase"))));
}

TEST_F(CoordinatedTransferEvents, CancelNothingAfterASuccessfulPhase) {
    client_->assetTransferUpdatedProgress(asset_, 0.5);
    client_->assetTransferEndedWithSuccess(true);
    EXPECT_THAT(cancels(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Error,
                       "Called with success == YES but with 1 outstanding HFT transfers!"));
    EXPECT_THAT(outstanding(), IsEmpty());
    EXPECT_THAT(Access::updatingApps(*client_), IsEmpty());
}

TEST_F(CoordinatedTransferEvents, KeepTheSetsOfAPhaseWithNothingOutstanding) {
    cancelByUser(kC);
    client_->assetTransferEndedWithSuccess(false);
    EXPECT_THAT(cancels(), IsEmpty());
    EXPECT_THAT(Access::updatingApps(*client_), ElementsAre(kB));
    EXPECT_THAT(Access::userCancelledApps(*client_), ElementsAre(kC));
}

/// The outcome of an install that the host reports itself.
using CoordinatedInstallOutcome = CoordinatedTransferEvents;

TEST_F(CoordinatedInstallOutcome, OfAFailureUninstallsThroughTheService) {
    const std::string version = "1.0";
    client_->_setRestoreStatePropertyValue("/a.zip", "path", kB, &version);
    platform_.host.setRecoverableTest([](const ErrorRecord&) { return true; });
    platform_.clearRecording();
    client_->assetInstallFailed(update_, error_);
    platform_.runUntilIdle();
    EXPECT_EQ(operationOf(kB), "FAILED");
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService", "AppRegistry"}),
                ElementsAre("InstallCoordinatorService.uninstallApp(com.example.b)"));
    EXPECT_THAT(platform_.messages(), Contains(HasSubstr("install failed unrecoverably")));
    EXPECT_THAT(platform_.transactions.scenarios(), IsEmpty());
    EXPECT_EQ(client_->_restoreStatePropertyForKey("path", kB, &version), std::nullopt);
}

TEST_F(CoordinatedInstallOutcome, OfAFailedRestoreChangesOnlyTheRestoreState) {
    const std::string version = "1.0";
    client_->_setRestoreStatePropertyValue("/a.zip", "path", kB, &version);
    update_->isRestore = true;
    client_->assetInstallFailed(update_, error_);
    platform_.runUntilIdle();
    EXPECT_EQ(operationOf(kB), "install");
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService.uninstallApp", "BackupManager"}),
                IsEmpty());
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre(HasSubstr("Tessarin is enabled - treating error Error Domain="),
                            HasSubstr("install failed but was recoverable")));
    EXPECT_EQ(client_->_restoreStatePropertyForKey("path", kB, &version), std::nullopt);
}

TEST_F(CoordinatedInstallOutcome, IsNeverRecoverable) {
    platform_.host.setRecoverableTest([](const ErrorRecord&) { return true; });
    EXPECT_FALSE(client_->_isRecoverableError(&error_));
    EXPECT_FALSE(client_->_isRecoverableError(nullptr));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre(HasSubstr("8 default Tessarin is enabled - treating error Error "
                                      "Domain=Transport"),
                            "8 default Tessarin is enabled - treating error (null) as non "
                            "recoverable"));
    EXPECT_THAT(platform_.callsTo({"SyncHost.isRecoverableError"}), IsEmpty());
}

TEST_F(CoordinatedInstallOutcome, HasNoProgressRecord) {
    EXPECT_EQ(client_->_progressForAssetIdentifier(kA), nullptr);
    EXPECT_THAT(platform_.lines(),
                ElementsAre("8 default Not returning XOProgress * for com.example.a as tessarin is "
                            "enabled"));
}

TEST_F(CoordinatedOutstandingTransfers, InstallAnewWhatTheRegistryKnowsButHasNotInstalled) {
    AppProxy proxy;
    proxy.applicationIdentifier = kA;
    platform_.registry.add(proxy);
    request({kA});
    EXPECT_THAT(transfers(), ElementsAre(kA));
    EXPECT_THAT(Access::updatingApps(*client_), IsEmpty());
    EXPECT_FALSE(
        logged(LogLevel::Default, "App com.example.a is already installed and will be updated."));
}

TEST_F(CoordinatedTransferEvents, FinishNoInstallPhase) {
    // The record is one from before: a coordinated client gets none.
    Access::setUseInstallCoordinator(*client_, false);
    platform_.onCall("AppRegistry.installProgress", [this](const RecordEntry&) {
        Access::setUseInstallCoordinator(*client_, true);
    });
    platform_.registry.setProgress(kA, {kInstallStateActive, kInstallPhaseLoading, 1000, 1000});
    receive(asset_);
    EXPECT_TRUE(logged(LogLevel::Default,
                       "not setting install phase finished for com.example.a as coordination is "
                       "enabled"));
    EXPECT_THAT(platform_.callsTo({"AppRegistry.finishInstallPhase"}), IsEmpty());
}

}  // namespace
}  // namespace appsync
