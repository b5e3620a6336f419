#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "contract/DeviceContract.h"
#include "contract/suites/Applications.h"
#include "platform/InstallCoordinator.h"
#include "platform/InstallPlaceholder.h"
#include "platform/InstallPromises.h"
#include "platform/LogRendering.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

using Creation = InstallCoordinatorService::Creation;
using Kind = CoordinatorKind;

constexpr CoordinationClient kOtherClient = 7;

ErrorRecord reason(std::int64_t code = 30) { return {std::string(kSyncErrorDomain), code, {}}; }

/// Keeps what it hears: "placeholder com.example.a", "complete com.example.a, failed", "cancelled
/// com.example.a, 30, client 7".
class HearingObserver : public InstallCoordinatorObserver {
  public:
    explicit HearingObserver(WorkQueues& queues) : heardOne_(queues.makeSemaphore(0)) {}

    void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t) override {}
    void coordinatorDidInstallPlaceholder(
        const std::shared_ptr<InstallCoordinator>& coordinator) override {
        hear("placeholder " + outcome(*coordinator));
    }
    void coordinatorDidCompleteSuccessfully(
        const std::shared_ptr<InstallCoordinator>& coordinator) override {
        hear("complete " + outcome(*coordinator));
    }
    void coordinatorCanceledWithReason(const std::shared_ptr<InstallCoordinator>& coordinator,
                                       const ErrorRecord& reason,
                                       CoordinationClient client) override {
        hear("cancelled " + coordinator->bundleIdentifier().value_or("?") + ", " +
             std::to_string(reason.code) + ", client " + std::to_string(client));
    }
    void coordinatorShouldPrioritize(const std::shared_ptr<InstallCoordinator>&) override {}

    /// Waits until one more thing has been heard than at the last wait.
    void waitForOne() { EXPECT_TRUE(heardOne_->wait()); }
    [[nodiscard]] std::vector<std::string> heard() {
        const std::lock_guard lock(mutex_);
        return heard_;
    }

  private:
    static std::string outcome(const InstallCoordinator& coordinator) {
        return coordinator.bundleIdentifier().value_or("?") +
               (coordinator.error() ? ", failed" : "");
    }
    void hear(std::string what) {
        {
            const std::lock_guard lock(mutex_);
            heard_.push_back(std::move(what));
        }
        heardOne_->signal();
    }

    const std::unique_ptr<Semaphore> heardOne_;
    std::mutex mutex_;
    std::vector<std::string> heard_;
};

class CoordinationContract : public DeviceContract {
  protected:
    [[nodiscard]] std::shared_ptr<InstallCoordinator> create(
        Kind kind, const std::string& identifier, CoordinationClient client = SyncClientID) {
        const auto result =
            service_.coordinator(kind, identifier, client, Creation::CreateIfNotExisting);
        EXPECT_TRUE(result.wasCreated);
        EXPECT_NE(result.coordinator, nullptr);
        if (result.coordinator != nullptr) result.coordinator->setObserver(observer_);
        return result.coordinator;
    }
    [[nodiscard]] InstallCoordinatorService::Coordinator existing(Kind kind,
                                                                  const std::string& identifier) {
        return service_.coordinator(kind, identifier, SyncClientID, Creation::OnlyExisting);
    }
    [[nodiscard]] std::shared_ptr<PathTransferPromise> assetPromise(
        const std::string& identifier, const std::optional<std::string>& path = std::nullopt) {
        const auto url = path ? FileURL::fromPath(*path, false) : std::nullopt;
        return service_.makePathTransferPromise(identifier + "-Asset", SyncClientID, url, 0);
    }
    [[nodiscard]] std::shared_ptr<OutOfBandPromise> dataPromise(const std::string& identifier) {
        return service_.makeOutOfBandPromise(identifier + "-UserData", SyncClientID, 0);
    }
    /// A placeholder whose configuration is complete.
    [[nodiscard]] std::shared_ptr<InstallPlaceholder> placeholder(const std::string& identifier) {
        auto placeholder =
            service_.makeAppPlaceholder("Atlas", identifier, kInstallTypeSync, SyncClientID);
        PlaceholderAttributes attributes;
        attributes.bundleVersion = "2.5";
        EXPECT_TRUE(placeholder->setAttributes(attributes));
        EXPECT_TRUE(placeholder->setMetadata(StoreMetadata{}));
        EXPECT_TRUE(placeholder->setConfigurationComplete());
        return placeholder;
    }
    static InstallOptions options() { return {StoreMetadata{}, kInstallTypeSync, 1}; }

    /// A coordinator with everything but the package, once its placeholder is shown.
    std::shared_ptr<InstallCoordinator> prepared(Kind kind, const std::string& identifier) {
        const auto coordinator = create(kind, identifier);
        EXPECT_TRUE(coordinator->setInstallOptions(options()));
        EXPECT_TRUE(coordinator->setInitialODRAssetPromises({}));
        EXPECT_TRUE(coordinator->setAppAssetPromise(assetPromise(identifier)));
        EXPECT_TRUE(coordinator->setPlaceholderPromise(placeholder(identifier)));
        observer_->waitForOne();
        return coordinator;
    }
    /// Gives a restore of A everything but the package, which the store promises: the store's
    /// handle on it.
    std::shared_ptr<InstallCoordinator> restoredByTheStore(InstallCoordinator& coordinator) {
        const auto data = dataPromise(kA);
        data->setComplete();
        EXPECT_TRUE(coordinator.setUserDataPromise(data));
        EXPECT_TRUE(coordinator.setPlaceholderPromise(placeholder(kA)));
        EXPECT_TRUE(coordinator.setAppAssetPromiseResponsibleClient(AppStoreClientID));
        observer_->waitForOne();
        auto theirs = service_.existingCoordinator(kA, AppStoreClientID);
        if (theirs == nullptr) return nullptr;
        EXPECT_TRUE(theirs->setAppAssetPromise(assetPromise(kA)));
        return theirs;
    }
    /// Keeps the promise of the package.
    static void keepAsset(const InstallCoordinator& coordinator, const std::string& path) {
        const auto promise = coordinator.appAssetPromise();
        promise->setTransferPath(FileURL::fromPath(path, false).value());
        promise->setPercentComplete(1.0);
        promise->setComplete();
    }
    /// Waits until the service has done what was begun before this, as far as it reports it.
    void waitForReportOfB() {
        create(Kind::Initiating, kB)->cancelForReason(reason(), SyncClientID);
        observer_->waitForOne();
    }
    /// Uninstalls and waits for the completion: "ok", or "error".
    std::string uninstall(const std::string& identifier) {
        const std::shared_ptr<Semaphore> done = services_.queues.makeSemaphore(0);
        const auto outcome = std::make_shared<std::string>();
        service_.uninstallApp(identifier, [done, outcome](const ErrorRecord* error) {
            *outcome += error == nullptr ? "ok" : "error";
            done->signal();
        });
        EXPECT_TRUE(done->wait());
        waitForReportOfB();
        return *outcome;
    }

    InstallCoordinatorService& service_ = services_.coordination;
    const std::shared_ptr<HearingObserver> observer_ =
        std::make_shared<HearingObserver>(services_.queues);
};

APPSYNC_CONTRACT_SUITE(CoordinationContract, devicePorts({OptionalService::Coordination}));

TEST_P(CoordinationContract, NothingIsThereUntilItIsCreated) {
    checks("platform/InstallCoordinatorService.h",
           "No coordinator and no error when there is none and none was to be created.");
    const auto result = existing(Kind::Initiating, kA);
    EXPECT_EQ(result.coordinator, nullptr);
    EXPECT_FALSE(result.error);
    EXPECT_EQ(service_.existingCoordinator(kA, SyncClientID), nullptr);
}

TEST_P(CoordinationContract, ACoordinatorIsCreatedOnceAndKeepsItsCreator) {
    checks("platform/InstallCoordinator.h", "The client that created it.");
    const auto coordinator = create(Kind::Initiating, kA, kOtherClient);
    EXPECT_EQ(coordinator->bundleIdentifier(), kA);
    EXPECT_EQ(coordinator->creatorIdentifier(), kOtherClient);
    EXPECT_FALSE(coordinator->error());
    checks(
        "platform/InstallCoordinatorService.h",
        "one of the kind when there is one, else, if asked for, a new one that `client` creates.");
    const auto again =
        service_.coordinator(Kind::Initiating, kA, SyncClientID, Creation::CreateIfNotExisting);
    ASSERT_NE(again.coordinator, nullptr);
    EXPECT_FALSE(again.wasCreated);
    EXPECT_FALSE(again.error);
    EXPECT_EQ(again.coordinator->creatorIdentifier(), kOtherClient);
}

TEST_P(CoordinationContract, ACoordinatorIsFoundWhateverItsKindAndClient) {
    checks("platform/InstallCoordinatorService.h",
           "The coordinator of an application, of whatever kind; null when there is none.");
    (void)create(Kind::Restoring, kA, kOtherClient);
    const auto found = service_.existingCoordinator(kA, SyncClientID);
    ASSERT_NE(found, nullptr);
    EXPECT_EQ(found->bundleIdentifier(), kA);
    EXPECT_EQ(service_.existingCoordinator(kB, SyncClientID), nullptr);
}

TEST_P(CoordinationContract, AnotherKindStandsInTheWay) {
    checks("platform/InstallCoordinatorService.h",
           "An error when one of another kind stands in the way,");
    (void)create(Kind::Restoring, kA);
    for (const Creation creation : {Creation::OnlyExisting, Creation::CreateIfNotExisting}) {
        const auto result = service_.coordinator(Kind::Initiating, kA, SyncClientID, creation);
        EXPECT_EQ(result.coordinator, nullptr);
        EXPECT_FALSE(result.wasCreated);
        EXPECT_TRUE(result.error);
    }
    EXPECT_NE(existing(Kind::Restoring, kA).coordinator, nullptr);
}

TEST_P(CoordinationContract, OnlyWhatIsInstalledCanBeUpdated) {
    checks("platform/InstallCoordinatorService.h",
           "when an update is wanted of what is not installed,");
    const auto refused =
        service_.coordinator(Kind::Updating, kA, SyncClientID, Creation::CreateIfNotExisting);
    EXPECT_EQ(refused.coordinator, nullptr);
    EXPECT_TRUE(refused.error);
    EXPECT_EQ(service_.existingCoordinator(kA, SyncClientID), nullptr);
    ASSERT_TRUE(installPackage({kA}));
    EXPECT_NE(create(Kind::Updating, kA), nullptr);
}

TEST_P(CoordinationContract, IllegalIdentifiersAreRefused) {
    checks("platform/InstallCoordinatorService.h",
           "or when the identifier is not legal (1 to 255 bytes of letters, digits, '.', '-', '_'; "
           "not \".\" or \"..\").");
    using std::string_literals::operator""s;
    for (const std::string& identifier :
         {""s, "."s, ".."s, "a/b"s, "a b"s, "a\0b"s, "a\nb"s, "\u00e4"s, std::string(256, 'x')}) {
        const auto result = service_.coordinator(Kind::Initiating, identifier, SyncClientID,
                                                 Creation::CreateIfNotExisting);
        EXPECT_EQ(result.coordinator, nullptr);
        EXPECT_TRUE(result.error);
        EXPECT_EQ(service_.existingCoordinator(identifier, SyncClientID), nullptr);
        EXPECT_EQ(uninstall(identifier), "error");
    }
}

TEST_P(CoordinationContract, PiecesAreThereOnceTheyAreSet) {
    checks("platform/InstallCoordinator.h", "Null when there is none.");
    const auto coordinator = create(Kind::Initiating, kA);
    EXPECT_EQ(coordinator->appAssetPromise(), nullptr);
    checks("platform/InstallCoordinator.h", "a set of pieces, each of which may be there or not.");
    EXPECT_FALSE(coordinator->hasInstallOptions());
    EXPECT_FALSE(coordinator->hasInitialODRAssetPromises());
    EXPECT_FALSE(coordinator->appAssetPromiseResponsibleClient());
    EXPECT_FALSE(coordinator->hasUserDataPromise());
    EXPECT_FALSE(coordinator->hasPlaceholderPromise());
    ASSERT_TRUE(coordinator->setInstallOptions(options()));
    ASSERT_TRUE(coordinator->setInitialODRAssetPromises({}));
    ASSERT_TRUE(coordinator->setAppAssetPromise(assetPromise(kA)));
    ASSERT_TRUE(coordinator->setAppAssetPromiseResponsibleClient(AppStoreClientID));
    ASSERT_TRUE(coordinator->setUserDataPromise(dataPromise(kA)));
    ASSERT_TRUE(coordinator->setPlaceholderPromise(
        service_.makeAppPlaceholder("Atlas", kA, kInstallTypeSync, SyncClientID)));
    const auto other = service_.existingCoordinator(kA, SyncClientID);
    EXPECT_TRUE(other->hasInstallOptions());
    EXPECT_TRUE(other->hasInitialODRAssetPromises());
    ASSERT_NE(other->appAssetPromise(), nullptr);
    EXPECT_EQ(other->appAssetPromise()->name(), "com.example.a-Asset");
    EXPECT_EQ(other->appAssetPromiseResponsibleClient(), AppStoreClientID);
    EXPECT_TRUE(other->hasUserDataPromise());
    EXPECT_TRUE(other->hasPlaceholderPromise());
}

TEST_P(CoordinationContract, ASecondSetIsRefusedAndTheFirstStands) {
    checks("platform/InstallCoordinator.h",
           "a second set is refused with an error, and the first stands.");
    const auto coordinator = prepared(Kind::Initiating, kA);
    ASSERT_TRUE(coordinator->setAppAssetPromiseResponsibleClient(AppStoreClientID));
    ASSERT_TRUE(coordinator->setUserDataPromise(dataPromise(kA)));
    EXPECT_FALSE(coordinator->setInstallOptions(options()));
    EXPECT_FALSE(coordinator->setInitialODRAssetPromises({}));
    EXPECT_FALSE(coordinator->setAppAssetPromise(assetPromise(kB)));
    EXPECT_FALSE(coordinator->setAppAssetPromiseResponsibleClient(kOtherClient));
    EXPECT_FALSE(coordinator->setUserDataPromise(dataPromise(kA)));
    EXPECT_FALSE(coordinator->setPlaceholderPromise(placeholder(kA)));
    EXPECT_EQ(coordinator->appAssetPromise()->name(), "com.example.a-Asset");
    EXPECT_EQ(coordinator->appAssetPromiseResponsibleClient(), AppStoreClientID);
}

TEST_P(CoordinationContract, APromiseSaysWhatItWasMadeWith) {
    checks("platform/InstallPromises.h", "Who has to keep it.");
    const auto promise = assetPromise(kA);
    EXPECT_EQ(promise->name(), "com.example.a-Asset");
    EXPECT_EQ(promise->clientIdentifier(), SyncClientID);
    checks("platform/InstallCoordinatorService.h", "`path` is where the file lies or will lie.");
    EXPECT_FALSE(promise->transferPath());
    EXPECT_EQ(promise->percentComplete(), 0.0);
    EXPECT_FALSE(promise->isComplete());
    EXPECT_EQ(assetPromise(kA, "/a.zip")->transferPath(), FileURL::fromPath("/a.zip", false));
}

TEST_P(CoordinationContract, TwoHandlesOnOnePromiseShowTheSame) {
    checks(
        "platform/InstallPromises.h",
        "An object is a handle on the service's record: two handles on one promise show the same.");
    const auto coordinator = create(Kind::Initiating, kA);
    const auto mine = assetPromise(kA);
    mine->setPercentComplete(0.25);
    ASSERT_TRUE(coordinator->setAppAssetPromise(mine));
    const auto other = service_.existingCoordinator(kA, SyncClientID)->appAssetPromise();
    EXPECT_EQ(other->percentComplete(), 0.25);
    other->setPercentComplete(0.5);
    EXPECT_EQ(mine->percentComplete(), 0.5);
    mine->setTransferPath(FileURL::fromPath("/a.zip", false).value());
    EXPECT_EQ(other->transferPath(), FileURL::fromPath("/a.zip", false));
    mine->setComplete();
    EXPECT_TRUE(other->isComplete());
}

TEST_P(CoordinationContract, ACompletePlaceholderIsShown) {
    checks("platform/InstallPlaceholder.h",
           "once the coordinator has such a placeholder, the service puts it on the home screen.");
    (void)prepared(Kind::Initiating, kA);
    EXPECT_THAT(observer_->heard(), ElementsAre("placeholder com.example.a"));
    const std::optional<AppProxy> proxy = preferred(kA);
    ASSERT_TRUE(proxy);
    EXPECT_TRUE(proxy->state.placeholder);
    EXPECT_EQ(proxy->installType, kInstallTypeSync);
    EXPECT_EQ(proxy->displayName, "Atlas");
    EXPECT_EQ(proxy->bundleVersion, "2.5");
    EXPECT_NE(progress(kA), nullptr);
    EXPECT_FALSE(application(kA));
}

TEST_P(CoordinationContract, APlaceholderThatIsNotCompleteIsKeptAndNotShown) {
    checks("platform/InstallPlaceholder.h",
           "One whose configuration never completes is kept and not shown.");
    const auto coordinator = create(Kind::Initiating, kA);
    ASSERT_TRUE(coordinator->setPlaceholderPromise(
        service_.makeAppPlaceholder("Atlas", kA, kInstallTypeSync, SyncClientID)));
    waitForReportOfB();
    EXPECT_TRUE(coordinator->hasPlaceholderPromise());
    EXPECT_THAT(observer_->heard(), ElementsAre("cancelled com.example.b, 30, client 3"));
    EXPECT_FALSE(preferred(kA));
}

TEST_P(CoordinationContract, APlaceholderThatIsGivenUpIsNotShown) {
    checks("platform/InstallPlaceholder.h",
           "Gives it up: it never comes to stand on the home screen.");
    const auto coordinator = create(Kind::Initiating, kA);
    const auto given = service_.makeAppPlaceholder("Atlas", kA, kInstallTypeSync, SyncClientID);
    ASSERT_TRUE(given->setAttributes({}));
    ASSERT_TRUE(coordinator->setPlaceholderPromise(given));
    given->cancelForReason(reason(), SyncClientID);
    static_cast<void>(given->setConfigurationComplete());
    waitForReportOfB();
    EXPECT_THAT(observer_->heard(), Not(Contains("placeholder com.example.a")));
    EXPECT_FALSE(preferred(kA));
}

TEST_P(CoordinationContract, NoPlaceholderIsRefused) {
    checks("platform/InstallCoordinator.h",
           "Refuses null, and the placeholder of another application.");
    const auto coordinator = create(Kind::Initiating, kA);
    EXPECT_FALSE(coordinator->setPlaceholderPromise(nullptr));
    EXPECT_FALSE(coordinator->hasPlaceholderPromise());
}

TEST_P(CoordinationContract, APlaceholderOfAnotherApplicationIsRefused) {
    checks("platform/InstallCoordinator.h",
           "Refuses null, and the placeholder of another application.");
    const auto coordinator = create(Kind::Initiating, kA);
    EXPECT_FALSE(coordinator->setPlaceholderPromise(placeholder(kB)));
    EXPECT_FALSE(coordinator->hasPlaceholderPromise());
    EXPECT_FALSE(preferred(kB));
}

TEST_P(CoordinationContract, ACompletePlaceholderTakesNoMore) {
    checks("platform/InstallPlaceholder.h",
           "A second set of the same piece replaces the first, until the configuration is "
           "complete; from then on every set is refused.");
    const auto placeholder =
        service_.makeAppPlaceholder("Atlas", kA, kInstallTypeSync, SyncClientID);
    EXPECT_TRUE(placeholder->setAttributes({}));
    EXPECT_TRUE(placeholder->setAttributes({}));
    EXPECT_TRUE(placeholder->setMetadata(std::nullopt));
    EXPECT_TRUE(placeholder->setSinf(Bytes{1, 2}));
    EXPECT_TRUE(placeholder->setConfigurationComplete());
    EXPECT_FALSE(placeholder->setAttributes({}));
    EXPECT_FALSE(placeholder->setMetadata(std::nullopt));
    EXPECT_FALSE(placeholder->setSinf(Bytes{1, 2}));
    EXPECT_FALSE(placeholder->setIconPromise(assetPromise(kA)));
    EXPECT_FALSE(placeholder->setConfigurationComplete());
}

TEST_P(CoordinationContract, ThePackageIsInstalledWhenItsPromiseIsKept) {
    checks("platform/InstallCoordinator.h",
           "When the pieces that its kind needs are there and every promise is complete, the "
           "service installs on threads of its own, and the coordinator is gone afterwards.");
    const auto coordinator = prepared(Kind::Initiating, kA);
    const std::string path = device_->addPackage({kA, "2.5", "Atlas"});
    keepAsset(*coordinator, path);
    observer_->waitForOne();
    EXPECT_THAT(observer_->heard(),
                ElementsAre("placeholder com.example.a", "complete com.example.a"));
    ASSERT_TRUE(application(kA));
    EXPECT_EQ(application(kA).value().bundleVersion, "2.5");
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
    EXPECT_FALSE(coordinator->error());
    EXPECT_EQ(service_.existingCoordinator(kA, SyncClientID), nullptr);
    checks(
        "platform/InstallPromises.h",
        "it reads it when it needs it and removes it afterwards (an icon may be left standing).");
    EXPECT_FALSE(services_.files.itemExists(path));
}

TEST_P(CoordinationContract, AnUpdateReplacesTheVersion) {
    checks("platform/InstallCoordinator.h",
           "When the pieces that its kind needs are there and every promise is complete, the "
           "service installs on threads of its own, and the coordinator is gone afterwards.");
    ASSERT_TRUE(installPackage({kA, "1.0"}));
    const auto coordinator = prepared(Kind::Updating, kA);
    EXPECT_EQ(application(kA).value().bundleVersion, "1.0");
    keepAsset(*coordinator, device_->addPackage({kA, "2.0"}));
    observer_->waitForOne();
    EXPECT_EQ(application(kA).value().bundleVersion, "2.0");
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
}

TEST_P(CoordinationContract, TheInstallWaitsForEveryPromise) {
    checks("platform/InstallCoordinator.h",
           "When the pieces that its kind needs are there and every promise is complete, the "
           "service installs on threads of its own, and the coordinator is gone afterwards.");
    const auto coordinator = prepared(Kind::Initiating, kA);
    const auto data = dataPromise(kA);
    ASSERT_TRUE(coordinator->setUserDataPromise(data));
    keepAsset(*coordinator, device_->addPackage({kA}));
    waitForReportOfB();
    EXPECT_FALSE(application(kA));
    data->setComplete();
    observer_->waitForOne();
    EXPECT_TRUE(application(kA));
}

TEST_P(CoordinationContract, APromiseThatIsGivenUpIsNotWaitedFor) {
    checks("platform/InstallPromises.h",
           "Gives it up: the service no longer waits for it, and does not hold it against its "
           "keeper.");
    const auto coordinator = prepared(Kind::Initiating, kA);
    const auto data = dataPromise(kA);
    ASSERT_TRUE(coordinator->setUserDataPromise(data));
    keepAsset(*coordinator, device_->addPackage({kA}));
    data->cancelForReason(reason(), SyncClientID);
    observer_->waitForOne();
    EXPECT_TRUE(application(kA));
}

TEST_P(CoordinationContract, AFailedInstallKeepsTheOldVersionAndTakesThePlaceholder) {
    checks("platform/InstallCoordinator.h",
           "An install that fails takes the placeholder away and leaves an installed version as it "
           "is;");
    ASSERT_TRUE(installPackage({kA, "1.0"}));
    const auto coordinator = prepared(Kind::Updating, kA);
    keepAsset(*coordinator, "/var/mobile/missing.zip");
    observer_->waitForOne();
    EXPECT_THAT(observer_->heard(),
                ElementsAre("placeholder com.example.a", "complete com.example.a, failed"));
    EXPECT_TRUE(coordinator->error());
    EXPECT_EQ(application(kA).value().bundleVersion, "1.0");
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
    EXPECT_EQ(service_.existingCoordinator(kA, SyncClientID), nullptr);
}

// Nothing but a restore brings it back, so it waits for another package.
TEST_P(CoordinationContract, AFailedInstallOfARestoredApplicationKeepsItsPlaceholder) {
    checks("platform/InstallCoordinator.h",
           "of an application that is being restored the placeholder stays, and a coordinator that "
           "waits for another package.");
    const auto coordinator = create(Kind::Restoring, kA);
    const auto theirs = restoredByTheStore(*coordinator);
    ASSERT_NE(theirs, nullptr);
    keepAsset(*theirs, "/var/mobile/missing.zip");
    observer_->waitForOne();
    EXPECT_THAT(observer_->heard(),
                ElementsAre("placeholder com.example.a", "complete com.example.a, failed"));
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle),
                ElementsAre(std::string(kA) + " (placeholder)"));
    const auto again = service_.existingCoordinator(kA, AppStoreClientID);
    ASSERT_NE(again, nullptr);
    EXPECT_FALSE(again->error());
    ASSERT_TRUE(again->setAppAssetPromise(assetPromise(kA)));
    again->setObserver(observer_);
    keepAsset(*again, device_->addPackage({kA}));
    observer_->waitForOne();
    EXPECT_EQ(observer_->heard().back(), "complete com.example.a");
    EXPECT_TRUE(application(kA));
}

TEST_P(CoordinationContract, APackageOfAnotherApplicationIsNotInstalled) {
    checks("platform/InstallCoordinator.h", "It failed when the coordinator carries an error.");
    const auto coordinator = prepared(Kind::Initiating, kA);
    keepAsset(*coordinator, device_->addPackage({kB}));
    observer_->waitForOne();
    EXPECT_TRUE(coordinator->error());
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), IsEmpty());
}

TEST_P(CoordinationContract, ARestoredApplicationIsInstalledFromTheStoresPromise) {
    checks("platform/InstallCoordinator.h",
           "Whose task the package is where nobody has promised it;");
    const auto coordinator = create(Kind::Restoring, kA);
    const auto theirs = restoredByTheStore(*coordinator);
    ASSERT_NE(theirs, nullptr);
    keepAsset(*theirs, device_->addPackage({kA}));
    observer_->waitForOne();
    EXPECT_THAT(observer_->heard(),
                ElementsAre("placeholder com.example.a", "complete com.example.a"));
    EXPECT_TRUE(application(kA));
}

TEST_P(CoordinationContract, ACancelTakesThePlaceholderAndKeepsTheVersion) {
    checks("platform/InstallCoordinator.h", "Its observer hears.");
    ASSERT_TRUE(installPackage({kA, "1.0"}));
    const auto coordinator = prepared(Kind::Updating, kA);
    coordinator->cancelForReason(reason(), kOtherClient);
    observer_->waitForOne();
    EXPECT_THAT(observer_->heard(),
                ElementsAre("placeholder com.example.a", "cancelled com.example.a, 30, client 7"));
    checks("platform/InstallCoordinator.h",
           "Ends it: its placeholder goes, its promises are given up, an installed version stays.");
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
    EXPECT_EQ(application(kA).value().bundleVersion, "1.0");
    EXPECT_EQ(coordinator->error(), reason());
    EXPECT_EQ(service_.existingCoordinator(kA, SyncClientID), nullptr);
}

TEST_P(CoordinationContract, ACancelledCoordinatorAnswersAsBeforeAndTakesNoMore) {
    checks("platform/InstallCoordinator.h",
           "On a coordinator that is done or cancelled every set is refused and every question is "
           "answered as when it ended.");
    const auto coordinator = create(Kind::Initiating, kA);
    ASSERT_TRUE(coordinator->setInstallOptions(options()));
    coordinator->cancelForReason(reason(), SyncClientID);
    EXPECT_TRUE(coordinator->hasInstallOptions());
    EXPECT_FALSE(coordinator->setInitialODRAssetPromises({}));
    EXPECT_FALSE(coordinator->setAppAssetPromise(assetPromise(kA)));
    EXPECT_FALSE(coordinator->setAppAssetPromiseResponsibleClient(AppStoreClientID));
    EXPECT_FALSE(coordinator->setUserDataPromise(dataPromise(kA)));
    EXPECT_FALSE(coordinator->setPlaceholderPromise(placeholder(kA)));
    EXPECT_FALSE(coordinator->hasInitialODRAssetPromises());
    EXPECT_FALSE(coordinator->hasPlaceholderPromise());
}

TEST_P(CoordinationContract, ASecondCancelDoesNothing) {
    checks("platform/InstallCoordinator.h", "A second cancel does nothing.");
    const auto coordinator = create(Kind::Initiating, kA);
    const auto other = service_.existingCoordinator(kA, SyncClientID);
    coordinator->cancelForReason(reason(1), SyncClientID);
    observer_->waitForOne();
    other->cancelForReason(reason(2), kOtherClient);
    coordinator->cancelForReason(reason(2), kOtherClient);
    waitForReportOfB();
    EXPECT_EQ(other->error(), reason(1));
    EXPECT_THAT(observer_->heard(), ElementsAre("cancelled com.example.a, 1, client 3",
                                                "cancelled com.example.b, 30, client 3"));
}

TEST_P(CoordinationContract, ACancelledIdentifierCanBeginAnew) {
    checks(
        "platform/InstallCoordinatorService.h",
        "one of the kind when there is one, else, if asked for, a new one that `client` creates.");
    const auto old = prepared(Kind::Initiating, kA);
    old->cancelForReason(reason(), SyncClientID);
    observer_->waitForOne();
    const auto coordinator = prepared(Kind::Initiating, kA);
    old->cancelForReason(reason(), SyncClientID);
    keepAsset(*coordinator, device_->addPackage({kA}));
    observer_->waitForOne();
    EXPECT_EQ(observer_->heard().back(), "complete com.example.a");
    EXPECT_TRUE(application(kA));
}

TEST_P(CoordinationContract, PromisesOfWhatHasEndedDoNotChange) {
    checks("platform/InstallPromises.h",
           "a change of a promise that the service no longer has (its coordinator is done or "
           "cancelled) does nothing.");
    const auto coordinator = prepared(Kind::Initiating, kA);
    const auto promise = coordinator->appAssetPromise();
    promise->setPercentComplete(0.5);
    coordinator->cancelForReason(reason(), SyncClientID);
    promise->setPercentComplete(1.0);
    promise->setTransferPath(FileURL::fromPath(device_->addPackage({kA}), false).value());
    promise->setComplete();
    observer_->waitForOne();
    waitForReportOfB();
    EXPECT_EQ(promise->percentComplete(), 0.5);
    EXPECT_FALSE(promise->transferPath());
    EXPECT_FALSE(promise->isComplete());
    EXPECT_FALSE(application(kA));
}

TEST_P(CoordinationContract, ObserversAreHeldWeakly) {
    checks("platform/InstallCoordinator.h", "Who hears of this coordinator, held weakly;");
    const auto coordinator = create(Kind::Initiating, kA);
    auto observer = std::make_shared<HearingObserver>(services_.queues);
    const std::weak_ptr<HearingObserver> weak = observer;
    coordinator->setObserver(observer);
    observer.reset();
    EXPECT_TRUE(weak.expired());
    coordinator->cancelForReason(reason(), SyncClientID);
    waitForReportOfB();
    EXPECT_THAT(observer_->heard(), ElementsAre("cancelled com.example.b, 30, client 3"));
}

TEST_P(CoordinationContract, ALaterObserverTakesThePlaceOfTheEarlier) {
    checks("platform/InstallCoordinator.h",
           "One at a time: a later one takes the place of the earlier.");
    (void)create(Kind::Initiating, kA);
    const auto later = std::make_shared<HearingObserver>(services_.queues);
    const auto other = service_.existingCoordinator(kA, SyncClientID);
    other->setObserver(later);
    other->cancelForReason(reason(), SyncClientID);
    later->waitForOne();
    EXPECT_THAT(later->heard(), ElementsAre("cancelled com.example.a, 30, client 3"));
    EXPECT_THAT(observer_->heard(), IsEmpty());
}

TEST_P(CoordinationContract, ADelegateHearsOfItsClientsCoordinatorsThatNobodyObserves) {
    checks("platform/InstallCoordinatorService.h",
           "From now on the delegate, held weakly, hears of every coordinator that one of the "
           "clients has created and that has no observer of its own:");
    const auto delegate = std::make_shared<HearingObserver>(services_.queues);
    const auto registration =
        service_.makeAppInstallObserver("com.example.observer", {SyncClientID}, delegate);
    const auto cancel = [&](const std::string& identifier, CoordinationClient client) {
        service_.coordinator(Kind::Initiating, identifier, client, Creation::CreateIfNotExisting)
            .coordinator->cancelForReason(reason(), kOtherClient);
    };
    cancel("com.example.c", kOtherClient);
    create(Kind::Initiating, kB)->cancelForReason(reason(), SyncClientID);
    observer_->waitForOne();
    cancel(kA, SyncClientID);
    delegate->waitForOne();
    EXPECT_THAT(delegate->heard(), ElementsAre("cancelled com.example.a, 30, client 7"));
}

TEST_P(CoordinationContract, ADelegateHearsNothingOnceItsRegistrationHasEnded) {
    checks("platform/InstallCoordinatorService.h",
           "It ends with the object: no call begins after that.");
    const auto delegate = std::make_shared<HearingObserver>(services_.queues);
    auto registration =
        service_.makeAppInstallObserver("com.example.observer", {SyncClientID}, delegate);
    registration.reset();
    const auto coordinator = create(Kind::Initiating, kA);
    coordinator->setObserver({});
    coordinator->cancelForReason(reason(), SyncClientID);
    waitForReportOfB();
    EXPECT_THAT(delegate->heard(), IsEmpty());
}

TEST_P(CoordinationContract, AnUninstallIsReportedOnce) {
    checks("platform/InstallCoordinatorService.h",
           "Returns at once; the completion is called exactly once.");
    ASSERT_TRUE(installPackage({kA}));
    EXPECT_EQ(uninstall(kA), "ok");
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), IsEmpty());
    EXPECT_EQ(uninstall(kA), "error");
}

TEST_P(CoordinationContract, AnUninstallTakesThePlaceholderFirst) {
    checks("platform/InstallCoordinatorService.h",
           "Uninstalls the application, or its placeholder where one covers it, without asking the "
           "person who uses the device.");
    ASSERT_TRUE(installPackage({kA}));
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    EXPECT_EQ(uninstall(kA), "ok");
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
}

TEST_P(CoordinationContract, APersonsErrorHoldsTheUnderlyingOne) {
    checks("platform/InstallCoordinatorService.h",
           "it says that an install did not come about, and holds the underlying error.");
    const ErrorRecord underlying = ErrorRecord::make("Transport", 77, "the cable is out");
    const ErrorRecord error = service_.userPresentableError(1, underlying);
    EXPECT_EQ(error.code, 1);
    EXPECT_THAT(describe(error.userInfo), HasSubstr("the cable is out"));
    EXPECT_EQ(service_.userPresentableError(1, std::nullopt).code, 1);
}

}  // namespace

void linkCoordinationContract() {}

}  // namespace appsync
