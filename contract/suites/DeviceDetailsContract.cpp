#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <array>
#include <atomic>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "contract/DeviceContract.h"
#include "contract/Sentence.h"
#include "contract/suites/Applications.h"
#include "platform/InstallCoordinator.h"
#include "platform/SyncHost.h"

namespace appsync {

void linkDeviceDetailsContract() {}

namespace {

using testing::ElementsAre;

class BackupDetailsContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(BackupDetailsContract, devicePorts({OptionalService::Backup}));

TEST_P(BackupDetailsContract, OneRestoreIsGivenUpAndTheOthersAreNot) {
    checks("platform/BackupService.h", "Gives the application's restore up.");
    device_->addRestoreData(kA);
    device_->addRestoreData(kB);
    const auto manager = services_.backup.makeManager();
    EXPECT_TRUE(manager->restoreDataExists(kA));
    EXPECT_TRUE(manager->restoreDataExists(kB));
    manager->cancelApplicationRestore(kA);
    EXPECT_FALSE(manager->restoreDataExists(kA));
    EXPECT_TRUE(manager->restoreDataExists(kB));
}

class SmallServicesContract : public DeviceContract {
  protected:
    /// Calls it from several threads, several times.
    void callFromSeveralThreads(const std::function<void()>& call) {
        const auto operations = services_.queues.makeOperationQueue();
        operations->setMaximumConcurrentOperations(4);
        for (int operation = 0; operation < 4; ++operation) {
            operations->add([&call] {
                for (int round = 0; round < 5; ++round) call();
            });
        }
    }
};

APPSYNC_CONTRACT_SUITE(SmallServicesContract, devicePorts());

TEST_P(SmallServicesContract, ThePolicyIsAskedByAnyThread) {
    checks("platform/DevicePolicyService.h", "Callable on any thread; never fails.");
    callFromSeveralThreads([this] {
        const PolicyAnswer answer =
            services_.policy.effectiveValue(PolicyFeature::AppRemovalAllowed);
        EXPECT_TRUE(answer == PolicyAnswer::Unset || answer == PolicyAnswer::Yes ||
                    answer == PolicyAnswer::No);
    });
}

TEST_P(SmallServicesContract, TheBackupServiceIsAskedByAnyThread) {
    checks("platform/BackupService.h", "Callable on any thread");
    callFromSeveralThreads([this] {
        const auto manager = services_.backup.makeManager();
        ASSERT_NE(manager, nullptr);
        EXPECT_FALSE(manager->restoreDataExists(kA));
        manager->cancelApplicationRestore(kA);
    });
}

TEST_P(SmallServicesContract, TheListOfWhatWasUninstalledIsAskedByAnyThread) {
    checks("platform/InstallerService.h", "Callable on any thread.");
    callFromSeveralThreads([this] {
        const auto list = services_.installer.lookupUninstalled();
        EXPECT_TRUE(!list || list->isMap());
    });
}

TEST_P(SmallServicesContract, TheTransactionLogIsWrittenByAnyThread) {
    checks("platform/InstallTransactionLog.h", "Callable on any thread; never fails visibly.");
    callFromSeveralThreads([this] {
        services_.transactions.logStep(1, 1, 1, true, kA, "");
        services_.transactions.logScenario("Asset install", 0, true, kA, "assertion succeeded");
    });
}

TEST_P(SmallServicesContract, TheHostAnswersAnyThreadTheSame) {
    checks("platform/SyncHost.h", "Callable on any thread; never fails.");
    const std::string main = services_.host.mainBundleIdentifier();
    const std::string plugIn = services_.host.pluginBundleIdentifier();
    callFromSeveralThreads([&] {
        EXPECT_EQ(services_.host.mainBundleIdentifier(), main);
        EXPECT_EQ(services_.host.pluginBundleIdentifier(), plugIn);
    });
    checks("platform/SyncHost.h",
           "The identifier of the plug-in's own bundle, with which every message begins.");
    EXPECT_FALSE(plugIn.empty());
}

TEST_P(SmallServicesContract, MessagesAreWrittenByAnyThread) {
    checks("platform/LogFacility.h",
           "Called by any thread at any time, the destructor of the client included.");
    callFromSeveralThreads([this] {
        const std::array<LogArgument, 2> arguments{std::string_view("com.example"), nullptr};
        services_.log.write({LogCategory::Applications, LogLevel::Debug,
                             "%s|Received file at %{public}@", arguments});
    });
}

TEST_P(SmallServicesContract, TheHomeScreenIsAskedByAnyThread) {
    checks("platform/HomeScreenService.h", "Callable on any thread; nothing throws.");
    ASSERT_TRUE(installPackage({kA}));
    callFromSeveralThreads([this] {
        const auto result = services_.homeScreen.takeTerminationAssertion(kA, 0);
        if (const auto connection = services_.homeScreen.blockableConnection()) {
            const auto layout = connection->flattenedIconState(1);
            EXPECT_TRUE(!layout || services_.propertyLists.parse(*layout));
        }
    });
}

TEST_P(SmallServicesContract, TheIconRendererIsAskedByAnyThread) {
    checks("platform/IconRenderer.h",
           "Callable on any thread; every result is the caller's, and null when the step fails.");
    callFromSeveralThreads([this] {
        Bytes buffer;
        EXPECT_EQ(services_.icons.createImageDestination("public.no-such-type", 1, buffer),
                  nullptr);
    });
}

TEST_P(SmallServicesContract, ARecordIsChangedByAnyThread) {
    checks("platform/InstallProgressRecord.h", "Callable on any thread; never fails.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto record = progress(kA);
    ASSERT_NE(record, nullptr);
    callFromSeveralThreads([&] {
        record->setTotalUnitCount(1000);
        record->setCompletedUnitCount(456);
        EXPECT_EQ(progress(kA)->totalUnitCount(), 1000);
    });
    EXPECT_EQ(record->completedUnitCount(), 456);
}

/// Signals when a coordinator of its is cancelled.
class CancelObserver : public InstallCoordinatorObserver {
  public:
    explicit CancelObserver(WorkQueues& queues) : cancelled_(queues.makeSemaphore(0)) {}
    void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t) override {}
    void coordinatorDidInstallPlaceholder(const InstallCoordinatorPointer&) override {}
    void coordinatorDidCompleteSuccessfully(const InstallCoordinatorPointer&) override {}
    void coordinatorCanceledWithReason(const InstallCoordinatorPointer&, const ErrorRecord&,
                                       CoordinationClient) override {
        cancelled_->signal();
    }
    void coordinatorShouldPrioritize(const InstallCoordinatorPointer&) override {}

    void waitForCancel() { EXPECT_TRUE(cancelled_->wait()); }

  private:
    const std::unique_ptr<Semaphore> cancelled_;
};

class CoordinationDetailsContract : public SmallServicesContract {};

APPSYNC_CONTRACT_SUITE(CoordinationDetailsContract, devicePorts({OptionalService::Coordination}));

TEST_P(CoordinationDetailsContract, AnyThreadLooksForOneCoordinator) {
    checks("platform/InstallCoordinatorService.h",
           "The platform's install-coordination service: one coordinator at most for each "
           "application.");
    std::atomic<int> created{0};
    callFromSeveralThreads([&] {
        const auto found = services_.coordination.coordinator(
            CoordinatorKind::Initiating, kA, SyncClientID,
            InstallCoordinatorService::Creation::CreateIfNotExisting);
        ASSERT_NE(found.coordinator, nullptr);
        if (found.wasCreated) ++created;
        EXPECT_EQ(found.coordinator->bundleIdentifier(), kA);
    });
    EXPECT_EQ(created, 1);
}

TEST_P(CoordinationDetailsContract, AnObserverHearsOfWhatIsDoneThroughOtherHandles) {
    checks("platform/InstallCoordinator.h",
           "It also hears of what happens to the record through other handles.");
    const auto observer = std::make_shared<CancelObserver>(services_.queues);
    const auto mine = services_.coordination
                          .coordinator(CoordinatorKind::Initiating, kA, SyncClientID,
                                       InstallCoordinatorService::Creation::CreateIfNotExisting)
                          .coordinator;
    ASSERT_NE(mine, nullptr);
    mine->setObserver(observer);
    const auto other = services_.coordination.existingCoordinator(kA, AppStoreClientID);
    ASSERT_NE(other, nullptr);
    other->cancelForReason(ErrorRecord::make(kSyncErrorDomain, 30, "enough"), AppStoreClientID);
    observer->waitForCancel();
    EXPECT_TRUE(mine->error());
}

// The completion needs the lock that the caller holds: it would wait for itself.
TEST_P(CoordinationDetailsContract, AnUninstallIsNotCompletedByItsCaller) {
    checks("platform/InstallCoordinatorService.h", "Called on a thread of the service's;");
    ASSERT_TRUE(installPackage({kA}));
    const std::shared_ptr<Lock> lock = services_.queues.makeLock();
    const std::shared_ptr<Semaphore> done = services_.queues.makeSemaphore(0);
    std::vector<std::string> notes;
    {
        const std::lock_guard<Lock> guard(*lock);
        services_.coordination.uninstallApp(kA, [&notes, lock, done](const ErrorRecord* error) {
            {
                const std::lock_guard<Lock> inner(*lock);
                notes.emplace_back(error == nullptr ? "removed" : "not removed");
            }
            done->signal();
        });
        notes.emplace_back("returned");
    }
    EXPECT_TRUE(done->wait());
    EXPECT_THAT(notes, ElementsAre("returned", "removed"));
}

}  // namespace
}  // namespace appsync
