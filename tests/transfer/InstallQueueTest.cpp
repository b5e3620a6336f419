#include <cerrno>
#include <chrono>

#include "tests/client/AppsClientFixture.h"
#include "transfer/InstallRetry.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::Each;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

constexpr int kGranted = TerminationAssertionResult::kGranted;
constexpr int kDenied = TerminationAssertionResult::kDenied;
constexpr int kNoSuchApplication = TerminationAssertionResult::kNoSuchApplication;

class InstallQueue : public AppsClientFixture {
  protected:
    InstallQueue() {
        setTodoList(PropertyList::array({todoEntry(kA, "DOWNLOADED")}));
        platform_.registry.addPlaceholder(kA, kInstallTypeSync);
        platform_.runUntilIdle();
        platform_.clearRecording();
    }
    void install(const SyncAssetPointer& asset) {
        client_->_enqueueAssetInstall(asset);
        platform_.runUntilIdle();
    }
    void install() { install(receivedAsset(kA)); }
    SyncAssetPointer restoreAsset() {
        auto asset = receivedAsset(kA);
        asset->isRestore = true;
        return asset;
    }
    void script(std::vector<int> outcomes) {
        platform_.homeScreen.scriptTermination(kA, std::move(outcomes));
    }
    void refuse(std::string_view domain) {
        platform_.registry.failNextInstall(kA, ErrorRecord::make(domain, 3, "refused"));
    }
    void recoverEverything() {
        platform_.host.setRecoverableTest([](const ErrorRecord&) { return true; });
    }
    [[nodiscard]] std::vector<std::string> installs() const {
        return platform_.callsTo({"AppRegistry.installPackage"});
    }
    [[nodiscard]] const std::vector<std::string>& records() const {
        return platform_.transactions.records();
    }
};

TEST_F(InstallQueue, InstallsInOrder) {
    script({kGranted});
    install();
    EXPECT_THAT(
        platform_.lines(),
        ElementsAre(
            "WaitGroup#1.enter()", "8 default Enqueue install request for com.example.a",
            "OperationQueue#1.add()", "8 default Performing install for com.example.a",
            "8 default Grabbing assertion for com.example.a",
            "HomeScreenService.takeTerminationAssertion(com.example.a, 0) -> 0",
            "8 default Assertion succeeded for com.example.a",
            "InstallTransactionLog.logScenario(Asset install, 0, yes, com.example.a, assertion "
            "succeeded)",
            "AppRegistry.installPackage(/var/mobile/Media/PublicStaging/com.example.a.zip, "
            "{PackageType = Customer; BundleIdentifier = com.example.a;}) -> ok",
            "8 default com.example.a install succeeded", "Lock#1.lock()",
            HasSubstr("FileSystem.readFile(" + std::string(kTodoListPath)), HasSubstr("parse"),
            "8 default Changing com.example.a from DOWNLOADED to INSTALLED", HasSubstr("serialize"),
            HasSubstr("FileSystem.writeFileAtomically(" + std::string(kTodoListPath)),
            "Lock#1.unlock()", "Lock#2.lock()", HasSubstr("FileSystem.readFile"), "Lock#2.unlock()",
            "TerminationAssertion.release(com.example.a)",
            "FileSystem.removeItem(/var/mobile/Media/PublicStaging/com.example.a.zip) -> ok",
            "8 default Finished install for com.example.a", "Lock#2.lock()",
            HasSubstr("FileSystem.readFile"), "Lock#2.unlock()", "WaitGroup#1.leave()",
            // Its placeholder has gone: what the registry then reports is of no concern.
            HasSubstr("AppRegistryObserver.applicationInstallsArePrioritized")));
}

TEST_F(InstallQueue, InstallsAnApplicationThatNobodyHolds) {
    script({kNoSuchApplication});
    install();
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_TRUE(
        logged(LogLevel::Default, "Assertion not found for com.example.a, installing anyway..."));
    EXPECT_THAT(records(), ElementsAre("Asset install|0|yes|com.example.a|assertion not found"));
}

TEST_F(InstallQueue, CountsEachCallOfTheInstaller) {
    refuse(kInstallerErrorDomain);
    install();
    install();
    EXPECT_EQ(client_->_getAndResetNumAppInstallsAttempted(), 2U);
}

TEST_F(InstallQueue, RetriesAfterThirtySecondsWhenTheAssertionIsDenied) {
    script({kDenied, kGranted});
    install();
    EXPECT_THAT(installs(), IsEmpty());
    EXPECT_THAT(platform_.homeScreen.heldAssertions(), IsEmpty());
    EXPECT_TRUE(platform_.files.exists(packagePath(kA))) << "the package is kept";
    EXPECT_TRUE(logged(LogLevel::Error, "Assertion denied for com.example.a"));
    EXPECT_TRUE(logged(LogLevel::Error, "Will retry installation of com.example.a in 30 seconds"));
    EXPECT_THAT(records(), ElementsAre("Asset install|0|yes|com.example.a|assertion denied",
                                       "Asset install|0|yes|com.example.a|retrying asset install"));
    platform_.advance(std::chrono::milliseconds(29'999));
    EXPECT_THAT(installs(), IsEmpty());
    platform_.advance(std::chrono::milliseconds(1));
    EXPECT_THAT(installs(), testing::SizeIs(1));
    EXPECT_TRUE(logged(LogLevel::Error, "Re-enqueue installation request for com.example.a"));
    EXPECT_EQ(operationOf(kA), "INSTALLED");
}

TEST_F(InstallQueue, HoldsTheEndOfTheTransfersWhileARetryIsDue) {
    script({kDenied, kGranted});
    client_->_enqueueAssetInstall(receivedAsset(kA));
    client_->assetTransferEndedWithSuccess(true);
    EXPECT_EQ(platform_.now(), kInstallRetryDelay);
    EXPECT_EQ(operationOf(kA), "INSTALLED");
}

TEST_F(InstallQueue, RetriesForAsLongAsTheDenialLasts) {
    platform_.homeScreen.setRunning(kA, true);
    client_->_enqueueAssetInstall(receivedAsset(kA));
    platform_.advance(std::chrono::hours(10) + std::chrono::seconds(1));
    EXPECT_EQ(platform_.countMessages("Assertion denied for com.example.a"), 1201U);
    platform_.homeScreen.setRunning(kA, false);
    client_->assetTransferEndedWithSuccess(true);
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_EQ(client_->_getAndResetNumAppInstallsAttempted(), 0U) << "read by the end";
}

TEST_F(InstallQueue, DoesNotCountADenialAsAnAttempt) {
    script({kDenied});
    install();
    EXPECT_EQ(client_->_getAndResetNumAppInstallsAttempted(), 0U);
}

TEST_F(InstallQueue, ForgetsTheRestoreStateAfterADenialToo) {
    client_->_setRestoreStatePropertyValue("/path", "path", kA, &kOneZero);
    script({kDenied});
    install();
    EXPECT_FALSE(platform_.files.exists(std::string(kRestoreStatePath)));
}

TEST_F(InstallQueue, FailsOnAnUnknownAnswer) {
    script({17});
    install();
    EXPECT_THAT(installs(), IsEmpty());
    EXPECT_EQ(client_->_getAndResetNumAppInstallsAttempted(), 0U);
    EXPECT_TRUE(logged(LogLevel::Error, "Unknown error 17 getting assertion for com.example.a"));
    EXPECT_THAT(platform_.messages(),
                Contains("com.example.a install failed unrecoverably: Error Domain=POSIX Code=22 "
                         "\"(null)\""));
    EXPECT_THAT(records(),
                ElementsAre("Asset install|0|no|com.example.a|unknown error grabbing assertion",
                            "Nimbra restore|0|yes|com.example.a|placeholder removed"));
    EXPECT_FALSE(platform_.files.exists(packagePath(kA)));
    EXPECT_EQ(operationOf(kA), "FAILED");
}

TEST_F(InstallQueue, ReleasesTheAssertionWhateverHappens) {
    for (const char* domain : {"InstallerService", "RegistaError", ""}) {
        script({kGranted});
        if (*domain != '\0') refuse(domain);
        install();
        EXPECT_THAT(platform_.homeScreen.heldAssertions(), IsEmpty());
    }
}

TEST_F(InstallQueue, ReleasesAnAssertionThatWasNotGranted) {
    for (const int outcome : {kDenied, 17}) {
        script({outcome});
        install();
        EXPECT_THAT(platform_.homeScreen.heldAssertions(), IsEmpty()) << outcome;
    }
    EXPECT_THAT(platform_.callsTo({"TerminationAssertion"}), testing::SizeIs(2));
}

TEST_F(InstallQueue, ReleasesADeniedAssertionBeforeItSchedulesTheRetry) {
    script({kDenied});
    install();
    EXPECT_THAT(
        platform_.callsTo({"TerminationAssertion", "InstallTransactionLog", "WorkQueues"}),
        ElementsAre(HasSubstr("assertion denied"), "TerminationAssertion.release(com.example.a)",
                    HasSubstr("retrying asset install"), "WorkQueues.runAfter(30000 ms)"));
}

TEST_F(InstallQueue, IgnoresThatThePackageCannotBeDeleted) {
    platform_.files.failNext(FileOperation::RemoveItem, packagePath(kA), EIO);
    install();
    EXPECT_EQ(operationOf(kA), "INSTALLED");
}

TEST_F(InstallQueue, FailsOnAPathThatNoURLCanHold) {
    auto asset = receivedAsset(kA);
    asset->path = std::string("/a\0b", 4);
    install(asset);
    asset->path.reset();
    install(asset);
    EXPECT_THAT(installs(), IsEmpty());
    EXPECT_EQ(operationOf(kA), "FAILED");
    EXPECT_EQ(client_->_getAndResetNumAppInstallsAttempted(), 0U);
    EXPECT_EQ(platform_.countMessages("com.example.a install failed unrecoverably: Error "
                                      "Domain=POSIX Code=22 \"(null)\""),
              2U);
}

// Outcomes

TEST_F(InstallQueue, FailsUnrecoverablyByDefault) {
    refuse("Other");
    install();
    EXPECT_EQ(operationOf(kA), "FAILED");
    EXPECT_FALSE(platform_.registry.placeholder(kA));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "com.example.a install failed unrecoverably: Error Domain=Other Code=3 "
                       "\"refused\""));
    EXPECT_THAT(platform_.callsTo({"AppRegistry.uninstallApplication"}),
                ElementsAre("AppRegistry.uninstallApplication(com.example.a, (null)) -> ok"));
    EXPECT_THAT(records(), Contains("Nimbra restore|0|yes|com.example.a|placeholder removed"));
    EXPECT_FALSE(platform_.files.exists(packagePath(kA)));
}

TEST_F(InstallQueue, SaysThatThePlaceholderOfAFailedInstallCannotBeRemoved) {
    refuse("Other");
    platform_.registry.failNextUninstall(kA, ErrorRecord::make(kRegistryErrorDomain, 1, "no"));
    install();
    EXPECT_TRUE(logged(LogLevel::Error, "Uninstall of com.example.a failed."));
    EXPECT_THAT(records(),
                Contains("Nimbra restore|0|no|com.example.a|failed to remove placeholder"));
    EXPECT_EQ(operationOf(kA), "FAILED");
}

TEST_F(InstallQueue, LeavesTheInstalledVersionOfAFailedUpdate) {
    platform_.registry.addApplication(kA, "0.9");
    refuse("Other");
    install();
    EXPECT_FALSE(platform_.registry.placeholder(kA));
    EXPECT_EQ(platform_.registry.installed(kA)->bundleVersion, "0.9");
}

TEST_F(InstallQueue, LeavesEverythingAfterARecoverableFailure) {
    recoverEverything();
    refuse("Other");
    install();
    EXPECT_EQ(operationOf(kA), "DOWNLOADED");
    EXPECT_TRUE(platform_.registry.placeholder(kA));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "com.example.a install failed but was recoverable: Error Domain=Other "
                       "Code=3 \"refused\""));
    EXPECT_THAT(records(),
                Contains("Nimbra restore|0|no|com.example.a|install failed recoverably"));
    EXPECT_FALSE(platform_.files.exists(packagePath(kA)));
}

TEST_F(InstallQueue, TakesNoErrorOfTheInstallerOrTheRegistryForRecoverable) {
    recoverEverything();
    for (const std::string_view domain : {kInstallerErrorDomain, kRegistryErrorDomain}) {
        const auto error = ErrorRecord::make(domain, 1, "refused");
        EXPECT_FALSE(client_->_isRecoverableError(&error)) << domain;
    }
    const auto other = ErrorRecord::make(kPosixErrorDomain, ENOSPC, "full");
    EXPECT_TRUE(client_->_isRecoverableError(&other));
    EXPECT_FALSE(client_->_isRecoverableError(nullptr));
}

TEST_F(InstallQueue, AsksTheHostWhetherAnErrorIsRecoverable) {
    const auto error = ErrorRecord::make("Other", 1, "refused");
    EXPECT_FALSE(client_->_isRecoverableError(&error));
    EXPECT_THAT(platform_.callsTo({"SyncHost.isRecoverableError"}), testing::SizeIs(1));
}

TEST_F(InstallQueue, TakesEveryFailureOfARestoreForRecoverable) {
    client_->_setRestoreStatePropertyValue(packagePath(kA), "path", kA, &kOneZero);
    refuse(kInstallerErrorDomain);
    install(restoreAsset());
    EXPECT_EQ(operationOf(kA), "DOWNLOADED");
    EXPECT_TRUE(platform_.registry.placeholder(kA));
    EXPECT_FALSE(platform_.files.exists(std::string(kRestoreStatePath)));
    EXPECT_THAT(platform_.messages(),
                Contains(StartsWith("com.example.a install failed but was recoverable: ")));
    EXPECT_THAT(platform_.backup.cancelled(), IsEmpty());
}

TEST_F(InstallQueue, AsksTheHostAboutTheFailureOfARestoreToo) {
    refuse("Other");
    install(restoreAsset());
    EXPECT_THAT(platform_.callsTo({"SyncHost.isRecoverableError"}), testing::SizeIs(1));
}

TEST_F(InstallQueue, ForgetsTheRestoreStateOfAnInstalledApplication) {
    client_->_setRestoreStatePropertyValue(packagePath(kA), "path", kA, &kOneZero);
    client_->_setRestoreStatePropertyValue("/b", "path", kB, &kOneZero);
    install(restoreAsset());
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_FALSE(client_->_restoreStatePropertyForKey("path", kA, &kOneZero));
    EXPECT_TRUE(client_->_restoreStatePropertyForKey("path", kB, &kOneZero));
}

TEST_F(InstallQueue, RunsTenInstallsAtOnceAndNoMore) {
    platform_.registry.setInstallDuration(std::chrono::minutes(1));
    for (int i = 0; i < 25; ++i) {
        client_->_enqueueAssetInstall(receivedAsset("com.example.x" + std::to_string(i)));
    }
    platform_.advance(std::chrono::seconds(30));
    EXPECT_THAT(installs(), testing::SizeIs(10));
    client_->assetTransferEndedWithSuccess(true);
    EXPECT_EQ(platform_.now(), std::chrono::minutes(3));
    EXPECT_THAT(platform_.registry.installedIdentifiers(), testing::SizeIs(25));
}

// The end of the client

TEST_F(InstallQueue, FinishesWhatItHasBegunForAClientThatIsLetGo) {
    platform_.registry.setInstallDuration(std::chrono::minutes(1));
    client_->_enqueueAssetInstall(receivedAsset(kA));
    client_->assetTransferUpdatedProgress(receivedAsset(kB), 0.5);
    client_.reset();
    platform_.advance(std::chrono::minutes(2));
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_TRUE(logged(LogLevel::Error,
                       "<AppsClient> getting dealloc'd with 1 outstanding HFT transfers!"));
    EXPECT_EQ(platform_.registry.observers(), 0U);
}

TEST_F(InstallQueue, RetriesNothingForAClientThatIsLetGo) {
    script({kDenied, kGranted});
    install();
    client_.reset();
    platform_.clearRecording();
    platform_.advance(std::chrono::minutes(1));
    EXPECT_THAT(platform_.lines(), IsEmpty());
    EXPECT_TRUE(platform_.files.exists(packagePath(kA)));
    EXPECT_EQ(operationOf(kA), "DOWNLOADED");
}

TEST_F(InstallQueue, KeepsTheClientUntilItsLastRetryHasRun) {
    script({kDenied, kGranted});
    platform_.registry.setInstallDuration(std::chrono::seconds(10));
    install();
    platform_.onCall("AppRegistry.installPackage", [this](const RecordEntry&) { client_.reset(); });
    platform_.advance(std::chrono::minutes(1));
    EXPECT_EQ(client_, nullptr);
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_EQ(platform_.registry.observers(), 0U);
}

/// No restore fails for good: its failure counts as recoverable. Here the asset becomes one when
/// that has been decided.
class InstallQueueOfALateRestore : public InstallQueue {
  protected:
    void failAsRestore(bool coordinated) {
        const auto asset = receivedAsset(kA);
        platform_.onCall("FileSystem.readFile", [this, asset, coordinated](const RecordEntry&) {
            asset->isRestore = true;
            AppsClientTestAccess::setUseInstallCoordinator(*client_, coordinated);
        });
        client_->assetInstallFailed(asset, ErrorRecord::make(kInstallerErrorDomain, 3, "refused"));
        platform_.runUntilIdle();
    }
};

TEST_F(InstallQueueOfALateRestore, GivesTheRestoreUp) {
    failAsRestore(false);
    EXPECT_THAT(platform_.backup.cancelled(), ElementsAre(kA));
    EXPECT_FALSE(platform_.registry.placeholder(kA));
    EXPECT_EQ(operationOf(kA), "FAILED");
}

TEST_F(InstallQueueOfALateRestore, LeavesACoordinatedRestoreAlone) {
    failAsRestore(true);
    EXPECT_THAT(platform_.backup.cancelled(), IsEmpty());
    EXPECT_TRUE(platform_.registry.placeholder(kA));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "not asking backup manager to cancel app restore for com.example.a as "
                       "install coordination is enabled"));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "not uninstalling restore asset com.example.a as install coordination is "
                       "enabled"));
}

}  // namespace
}  // namespace appsync
