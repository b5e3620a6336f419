#include <cstddef>

#include "tests/coordination/CoordinationFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using Access = AppsClientTestAccess;

constexpr const char* kObserverService = "com.korvu.trd.rlink.tsappobserverdelegate";

/// A client that hears of every coordinator of the plug-in's.
class CoordinatorReports : public PreparedAppFixture {
  protected:
    explicit CoordinatorReports(Scheduling scheduling = Scheduling::runToCompletion())
        : PreparedAppFixture(scheduling) {
        client_->setupInstallCoordinatorObserver();
        platform_.clearRecording();
    }
    void cancel(const SimulatedCoordination::Identifier& identifier) {
        service().postCanceled(identifier, refusal_, AppStoreClientID);
        platform_.runUntilIdle();
    }
    void finish(const SimulatedCoordination::Identifier& identifier,
                const std::optional<ErrorRecord>& error = std::nullopt) {
        service().postDidComplete(identifier, error);
        platform_.runUntilIdle();
    }
    void prioritize(const SimulatedCoordination::Identifier& identifier) {
        service().postShouldPrioritize(identifier);
        platform_.runUntilIdle();
    }
    [[nodiscard]] std::vector<std::string> transferCalls() const {
        return platform_.callsTo(
            {"TransferService.cancelTransferForFailedAsset", "TransferService.prioritizeAsset"});
    }
    [[nodiscard]] bool isUserCancelled(const std::string& identifier) {
        return Access::userCancelledApps(*client_).contains(identifier);
    }
};

TEST_F(CoordinatorReports, AreAskedForOnce) {
    EXPECT_THAT(service().appInstallObservers(), ElementsAre(kObserverService));
    client_->setupInstallCoordinatorObserver();
    EXPECT_THAT(platform_.calls(), IsEmpty());
    EXPECT_THAT(service().appInstallObservers(), ElementsAre(kObserverService));
}

TEST_F(CoordinatorReports, EndWithTheClient) {
    client_.reset();
    EXPECT_THAT(service().appInstallObservers(), IsEmpty());
}

TEST_F(CoordinatorReports, OfABeginningAreLogged) {
    service().postDidBeginFulfillment(7);
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default promiseDidBeginFulfillmentWithIdentifier 7"));
}

TEST_F(CoordinatorReports, OfAPlaceholderAreBooked) {
    client_->relocantSetPlaceHolderPromiseForRestoreAppBundle(kA);
    platform_.clearRecording();
    service().postDidInstallPlaceholder(kA);
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default coordinatorDidInstallPlaceholder for com.example.a with "
                            "error (null)",
                            "8 default TS finished installing placeholder for com.example.a, "
                            "_restoringPlaceholderCount 0"));
    EXPECT_EQ(Access::restoringPlaceholderCount(*client_), 0);
}

TEST_F(CoordinatorReports, OfAPlaceholderThatNobodyAwaitsAreIgnored) {
    service().postDidInstallPlaceholder(kB, refusal_);
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default coordinatorDidInstallPlaceholder for com.example.b with "
                            "error Error Domain=Coordination Code=7 \"(null)\"",
                            "8 error Ignoring notification from TS about installing placeholder "
                            "for com.example.b"));
}

TEST_F(CoordinatorReports, OfSuccessMarkTheTodoEntry) {
    const std::string version = "1.0";
    client_->_setRestoreStatePropertyValue("/a.zip", "path", kA, &version);
    finish(kA);
    EXPECT_EQ(operationOf(kA), "INSTALLED");
    EXPECT_EQ(client_->_restoreStatePropertyForKey("path", kA, &version), std::nullopt);
    EXPECT_TRUE(logged(LogLevel::Default,
                       "coordinatorDidCompleteSuccessfully for com.example.a with error (null)"));
}

TEST_F(CoordinatorReports, OfSuccessWithAnErrorMarkTheTodoEntryAsFailed) {
    const std::string version = "1.0";
    client_->_setRestoreStatePropertyValue("/a.zip", "path", kA, &version);
    finish(kA, refusal_);
    EXPECT_EQ(operationOf(kA), "FAILED");
    EXPECT_EQ(client_->_restoreStatePropertyForKey("path", kA, &version), std::nullopt);
    EXPECT_TRUE(logged(LogLevel::Default,
                       "coordinatorDidCompleteSuccessfully for com.example.a with error Error "
                       "Domain=Coordination Code=7 \"(null)\""));
}

TEST_F(CoordinatorReports, OfAWholeInstallComeInOrder) {
    EXPECT_TRUE(prepare());
    receive();
    client_->transferCompleteForApp(*asset_, nullptr, false);
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorObserver"}),
                ElementsAre("InstallCoordinatorObserver.coordinatorDidInstallPlaceholder("
                            "com.example.a)",
                            "InstallCoordinatorObserver.coordinatorDidCompleteSuccessfully("
                            "com.example.a)"));
    EXPECT_EQ(operationOf(kA), "INSTALLED");
}

TEST_F(CoordinatorReports, OfACancelStopTheTransfer) {
    cancel(kA);
    EXPECT_TRUE(isUserCancelled(kA));
    EXPECT_THAT(
        transferCalls(),
        ElementsAre(
            "TransferService.cancelTransferForFailedAsset(com.example.a, Application, download)"));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default Cancelling asset sync for com.example.a"));
    EXPECT_THAT(platform_.callsTo({"SerialQueue"}), ElementsAre("SerialQueue#3.sync()"));
}

TEST_F(CoordinatorReports, OfASecondCancelDoNotAskTheHostAgain) {
    cancel(kA);
    platform_.clearRecording();
    cancel(kA);
    EXPECT_THAT(platform_.callsTo({"TransferService"}), IsEmpty());
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 error Cannot cancel com.example.a as it's already cancelled 1 OR "
                            "the call is not supported"));
    EXPECT_TRUE(isUserCancelled(kA));
}

TEST_F(CoordinatorReports, OfACancelThatTheHostCannotPassOnAreKept) {
    platform_.transfers.setCanCancelTransfers(false);
    cancel(kA);
    EXPECT_TRUE(isUserCancelled(kA));
    EXPECT_THAT(transferCalls(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Error,
                       "Cannot cancel com.example.a as it's already cancelled 0 OR the call is "
                       "not supported"));
}

TEST_F(CoordinatorReports, NeedNoDeviceService) {
    platform_.host.setTransferService(nullptr);
    cancel(kA);
    prioritize(kA);
    EXPECT_TRUE(isUserCancelled(kA));
    EXPECT_TRUE(logged(LogLevel::Error, "Cannot prioritize com.example.a as it's not supported"));
}

TEST_F(CoordinatorReports, OfOurOwnCancelsAreTreatedAlike) {
    EXPECT_TRUE(prepare());
    client_->assetSyncFinishedWithStatus(false, {kA});
    platform_.runUntilIdle();
    EXPECT_TRUE(isUserCancelled(kA));
    EXPECT_THAT(transferCalls(), testing::SizeIs(1));
}

TEST_F(CoordinatorReports, OfAPriorityReachTheHost) {
    prioritize(kA);
    EXPECT_THAT(
        transferCalls(),
        ElementsAre("TransferService.prioritizeAsset(com.example.a, Application, download)"));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default Prioritize com.example.a",
                            "8 default Prioritize com.example.a finished with error (null)"));
}

TEST_F(CoordinatorReports, OfAPriorityTellHowTheHostFared) {
    platform_.transfers.failNextPrioritize(kA, refusal_);
    prioritize(kA);
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Prioritize com.example.a finished with error Error Domain=Coordination "
                       "Code=7 \"(null)\""));
}

TEST_F(CoordinatorReports, OfAPriorityThatTheHostDoesNotKnowAreLogged) {
    platform_.transfers.setCanPrioritizeAssets(false);
    prioritize(kA);
    EXPECT_THAT(transferCalls(), IsEmpty());
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default Prioritize com.example.a",
                            "8 error Cannot prioritize com.example.a as it's not supported"));
}

TEST_F(CoordinatorReports, OfBundlesNeverSeenAreTaken) {
    finish("com.example.unknown");
    cancel("com.example.unknown");
    prioritize("com.example.unknown");
    EXPECT_TRUE(isUserCancelled("com.example.unknown"));
    EXPECT_EQ(operationOf(kA), "install");
}

TEST_F(CoordinatorReports, WithoutAnIdentifierChangeNothing) {
    finish(std::nullopt);
    cancel(std::nullopt);
    prioritize(std::nullopt);
    service().postDidInstallPlaceholder(std::nullopt);
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default coordinatorDidCompleteSuccessfully for (null) with error "
                            "(null)",
                            "8 default coordinatorDidInstallPlaceholder for (null) with error "
                            "(null)"));
    EXPECT_THAT(Access::userCancelledApps(*client_), IsEmpty());
    EXPECT_THAT(platform_.callsTo({"TransferService", "FileSystem"}), IsEmpty());
}

TEST_F(CoordinatorReports, WithoutACoordinatorChangeNothing) {
    client_->coordinatorDidInstallPlaceholder(nullptr);
    client_->coordinatorDidCompleteSuccessfully(nullptr);
    client_->coordinatorCanceledWithReason(nullptr, refusal_, AppStoreClientID);
    client_->coordinatorShouldPrioritize(nullptr);
    EXPECT_THAT(platform_.callsTo({"TransferService", "FileSystem"}), IsEmpty());
    EXPECT_THAT(Access::userCancelledApps(*client_), IsEmpty());
}

TEST_F(CoordinatorReports, AfterTheClientHasGoneReachNobody) {
    EXPECT_TRUE(prepare());
    service().postDidInstallPlaceholder(kA);
    service().postDidComplete(kB);
    service().postCanceled(kB, refusal_, AppStoreClientID);
    service().postShouldPrioritize(kA);
    client_.reset();
    platform_.clearRecording();
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.lines(), IsEmpty());
}

TEST_F(CoordinatorReports, OfAPriorityAreAnsweredAlsoAfterTheClientHasGone) {
    platform_.onCall("TransferService.prioritizeAsset", [this](const RecordEntry&) {
        client_.reset();  // the callback holds the last one
    });
    prioritize(kA);
    EXPECT_TRUE(logged(LogLevel::Default, "Prioritize com.example.a finished with error (null)"));
}

TEST_F(CoordinatorReports, MayHoldTheLastOfTheClient) {
    platform_.onCall("TransferService.cancelTransferForFailedAsset",
                     [this](const RecordEntry&) { client_.reset(); });
    cancel(kA);
    EXPECT_THAT(transferCalls(), testing::SizeIs(1));
    EXPECT_THAT(service().appInstallObservers(), IsEmpty());
}

/// Every order in which reports and the host may meet.
class ReportsInAnyOrder : public CoordinatorReports, public testing::WithParamInterface<unsigned> {
  protected:
    ReportsInAnyOrder() : CoordinatorReports(Scheduling::seeded(GetParam())) {}
};

TEST_P(ReportsInAnyOrder, AskTheHostOnceForEachBundle) {
    for (int i = 0; i < 4; ++i) {
        service().postCanceled(kA, refusal_, AppStoreClientID);
        service().postCanceled(kB, refusal_, AppStoreClientID);
    }
    platform_.runUntilIdle();
    EXPECT_THAT(
        transferCalls(),
        testing::UnorderedElementsAre(
            "TransferService.cancelTransferForFailedAsset(com.example.a, Application, download)",
            "TransferService.cancelTransferForFailedAsset(com.example.b, Application, download)"));
}

TEST_P(ReportsInAnyOrder, MeetTheHostWithoutHarm) {
    EXPECT_TRUE(client_->prepareAppForInstallUsingCoordination(*asset_, false));
    service().postCanceled(kA, refusal_, AppStoreClientID);
    service().postDidComplete(kB);
    client_->assetTransferUpdatedProgress(asset_, 0.5);
    service().postDidInstallPlaceholder(kC);
    receive();
    client_->assetTransferSucceeded(asset_, true, nullptr);
    client_->assetTransferEndedWithSuccess(true);
    platform_.runUntilIdle();
    EXPECT_THAT(service().identifiers(), IsEmpty());
    EXPECT_EQ(operationOf(kA), "INSTALLED");
}

TEST_P(ReportsInAnyOrder, MeetTheEndOfTheClientWithoutHarm) {
    EXPECT_TRUE(client_->prepareAppForInstallUsingCoordination(*asset_, false));
    service().cancel(kA, refusal_, AppStoreClientID);
    service().postDidComplete(kB);
    service().postShouldPrioritize(kB);
    client_->uninstallAppUsingCoordination(kC);
    client_.reset();
    platform_.runUntilIdle();
    EXPECT_THAT(service().appInstallObservers(), IsEmpty());
}

INSTANTIATE_TEST_SUITE_P(Seeds, ReportsInAnyOrder, testing::Range(1U, 40U));

class RegistryCancels : public CoordinationFixture {};

TEST_F(RegistryCancels, AreLeftToTheCoordinators) {
    AppProxy proxy;
    proxy.applicationIdentifier = kA;
    proxy.installType = kInstallTypeRestore;
    client_->applicationInstallsDidCancel({proxy});
    EXPECT_THAT(platform_.lines(),
                ElementsAre("8 default not handling applicationInstallsDidCancel because install "
                            "coordination is enabled."));
}

}  // namespace
}  // namespace appsync
