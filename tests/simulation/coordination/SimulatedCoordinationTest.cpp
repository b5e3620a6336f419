#include <algorithm>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/InstallCoordinator.h"
#include "platform/SyncAsset.h"
#include "tests/simulation/SimulationFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::Each;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::StartsWith;
using testing::UnorderedElementsAre;

using Creation = InstallCoordinatorService::Creation;
using Kind = CoordinatorKind;

constexpr CoordinationClient kOtherClient = 7;

ErrorRecord failure(std::int64_t code = 30) { return {std::string(kSyncErrorDomain), code, {}}; }

/// Notes what it hears, and whether it ever heard it on another thread than the service's.
class NotingObserver : public InstallCoordinatorObserver {
  public:
    explicit NotingObserver(Scheduler& scheduler) : scheduler_(scheduler) {}

    void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t promise) override {
        note("begin " + std::to_string(promise));
    }
    void coordinatorDidInstallPlaceholder(
        const std::shared_ptr<InstallCoordinator>& coordinator) override {
        note("placeholder " + textOf(*coordinator));
    }
    void coordinatorDidCompleteSuccessfully(
        const std::shared_ptr<InstallCoordinator>& coordinator) override {
        note("complete " + textOf(*coordinator));
    }
    void coordinatorCanceledWithReason(const std::shared_ptr<InstallCoordinator>& coordinator,
                                       const ErrorRecord& reason,
                                       CoordinationClient client) override {
        note("cancelled " + textOf(*coordinator) + " " + std::to_string(reason.code) + " by " +
             std::to_string(client));
    }
    void coordinatorShouldPrioritize(
        const std::shared_ptr<InstallCoordinator>& coordinator) override {
        note("prioritize " + textOf(*coordinator));
    }

    [[nodiscard]] const std::vector<std::string>& heard() const { return heard_; }
    [[nodiscard]] bool wasCalledElsewhere() const { return wasCalledElsewhere_; }

  private:
    static std::string textOf(const InstallCoordinator& coordinator) {
        const auto error = coordinator.error();
        return coordinator.bundleIdentifier().value_or("nothing") +
               (error ? " with " + std::to_string(error->code) : "");
    }
    void note(std::string text) {
        heard_.push_back(std::move(text));
        if (scheduler_.currentName() != "coordination") wasCalledElsewhere_ = true;
    }

    Scheduler& scheduler_;
    std::vector<std::string> heard_;
    bool wasCalledElsewhere_ = false;
};

// What the contract promises is tested for every implementation; here stands what only the
// simulation does.
class SimulatedCoordinationTest : public SimulationFixture {
  protected:
    explicit SimulatedCoordinationTest(Scheduling scheduling = Scheduling::runToCompletion())
        : SimulationFixture(scheduling) {}

    [[nodiscard]] std::shared_ptr<InstallCoordinator> create(Kind kind,
                                                             const std::string& identifier) {
        return service_.coordinator(kind, identifier, SyncClientID, Creation::CreateIfNotExisting)
            .coordinator;
    }
    [[nodiscard]] std::shared_ptr<InstallPlaceholder> placeholder(const std::string& identifier) {
        return service_.makeAppPlaceholder("Atlas", identifier, kInstallTypeRestore, SyncClientID);
    }
    [[nodiscard]] std::shared_ptr<InstallPlaceholder> completePlaceholder(
        const std::string& identifier) {
        auto result = placeholder(identifier);
        EXPECT_TRUE(result->setConfigurationComplete());
        return result;
    }
    [[nodiscard]] std::shared_ptr<PathTransferPromise> promise(
        const std::string& name, const std::optional<std::string>& path = std::nullopt) {
        return service_.makePathTransferPromise(
            name, SyncClientID, path ? FileURL::fromPath(*path, false) : std::nullopt, 0);
    }
    /// A coordinator that lacks nothing but the file of its package.
    std::shared_ptr<InstallCoordinator> prepared(const std::string& identifier) {
        auto coordinator = create(Kind::Initiating, identifier);
        coordinator->setObserver(observer_);
        EXPECT_TRUE(coordinator->setInstallOptions({}));
        EXPECT_TRUE(coordinator->setInitialODRAssetPromises({}));
        EXPECT_TRUE(coordinator->setAppAssetPromise(promise(identifier + "-Asset")));
        EXPECT_TRUE(coordinator->setPlaceholderPromise(completePlaceholder(identifier)));
        return coordinator;
    }
    void keepAsset(const InstallCoordinator& coordinator) {
        platform_.files.addFile(kPackage, "a package");
        coordinator.appAssetPromise()->setTransferPath(FileURL::fromPath(kPackage, false).value());
        coordinator.appAssetPromise()->setComplete();
    }
    /// Registers the observer as the delegate for the plug-in's client.
    [[nodiscard]] std::shared_ptr<AppInstallObserver> registered() {
        return service_.makeAppInstallObserver("com.example.delegate", {SyncClientID}, observer_);
    }
    [[nodiscard]] const std::vector<std::string>& heard() {
        platform_.runUntilIdle();
        return observer_->heard();
    }

    static constexpr const char* kPackage = "/var/mobile/a.zip";

    SimulatedCoordination& service_ = platform_.coordination;
    const std::shared_ptr<NotingObserver> observer_ =
        std::make_shared<NotingObserver>(platform_.scheduler);
};

TEST_F(SimulatedCoordinationTest, EveryCallIsRecordedWithItsArguments) {
    const auto coordinator = create(Kind::Initiating, kA);
    (void)coordinator->hasInstallOptions();
    EXPECT_TRUE(coordinator->setInstallOptions({StoreMetadata{}, 4, 1}));
    EXPECT_TRUE(coordinator->setInitialODRAssetPromises({}));
    const auto asset = promise("com.example.a-Asset");
    EXPECT_TRUE(coordinator->setAppAssetPromise(asset));
    asset->setPercentComplete(0.25);
    const auto atlas = placeholder(kA);
    EXPECT_TRUE(atlas->setMetadata(std::nullopt));
    EXPECT_TRUE(coordinator->setPlaceholderPromise(atlas));
    (void)service_.existingCoordinator(kB, SyncClientID);
    EXPECT_THAT(
        platform_.calls(),
        ElementsAre("InstallCoordinatorService.coordinator(initiating, com.example.a, 3, create if "
                    "not existing) -> com.example.a, created",
                    "InstallCoordinator.hasInstallOptions(com.example.a) -> no",
                    "InstallCoordinator.setInstallOptions(com.example.a, {}, type 4, target 1) "
                    "-> ok",
                    "InstallCoordinator.setInitialODRAssetPromises(com.example.a, []) -> ok",
                    "InstallCoordinatorService.makePathTransferPromise(com.example.a-Asset, 3, "
                    "(null), 0) -> a promise",
                    "InstallCoordinator.setAppAssetPromise(com.example.a, com.example.a-Asset) -> "
                    "ok",
                    "PathTransferPromise.setPercentComplete(com.example.a-Asset, 0.25)",
                    "InstallCoordinatorService.makeAppPlaceholder(Atlas, com.example.a, 2, 3) -> a "
                    "placeholder",
                    "InstallPlaceholder.setMetadata(com.example.a, (null)) -> ok",
                    "InstallCoordinator.setPlaceholderPromise(com.example.a, Atlas) -> ok",
                    "InstallCoordinatorService.existingCoordinator(com.example.b, 3) -> (null)"));
}

TEST_F(SimulatedCoordinationTest, WhatTheServiceInstallsIsNotTheClientsCall) {
    keepAsset(*prepared(kA));
    EXPECT_THAT(heard(), ElementsAre("placeholder com.example.a", "complete com.example.a"));
    EXPECT_THAT(platform_.callsTo({"AppRegistry", "FileSystem"}), IsEmpty());
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorObserver"}),
                ElementsAre("InstallCoordinatorObserver.coordinatorDidInstallPlaceholder("
                            "com.example.a)",
                            "InstallCoordinatorObserver.coordinatorDidCompleteSuccessfully("
                            "com.example.a)"));
    EXPECT_FALSE(observer_->wasCalledElsewhere());
}

TEST_F(SimulatedCoordinationTest, SetsAreRefusedAsScriptedAndChangeNothing) {
    using Step = CoordinationStep;
    for (const Step step :
         {Step::InstallOptions, Step::InitialODRAssetPromises, Step::AppAssetPromise,
          Step::AppAssetPromiseResponsibleClient, Step::UserDataPromise, Step::PlaceholderPromise,
          Step::IconPromise, Step::Attributes, Step::Metadata, Step::Sinf,
          Step::ConfigurationComplete}) {
        service_.failNext(step, kA, failure());
    }
    const auto coordinator = create(Kind::Initiating, kA);
    const auto atlas = placeholder(kA);
    const auto setAll = [&] {
        const auto data = service_.makeOutOfBandPromise("data", SyncClientID, 0);
        return std::vector<bool>{coordinator->setInstallOptions({}).ok(),
                                 coordinator->setInitialODRAssetPromises({}).ok(),
                                 coordinator->setAppAssetPromise(promise("asset")).ok(),
                                 coordinator->setAppAssetPromiseResponsibleClient(1).ok(),
                                 coordinator->setUserDataPromise(data).ok(),
                                 coordinator->setPlaceholderPromise(atlas).ok(),
                                 atlas->setIconPromise(promise("icon")).ok(),
                                 atlas->setAttributes({}).ok(),
                                 atlas->setMetadata(std::nullopt).ok(),
                                 atlas->setSinf({}).ok(),
                                 atlas->setConfigurationComplete().ok()};
    };
    EXPECT_THAT(setAll(), Each(false));
    EXPECT_THAT(setAll(), Each(true));
}

TEST_F(SimulatedCoordinationTest, AScriptedErrorIsUsedUpInOrder) {
    service_.failNext(CoordinationStep::LookUp, kA, failure(1));
    service_.failNext(CoordinationStep::LookUp, kA, failure(2));
    for (const std::int64_t code : {1, 2}) {
        const auto result =
            service_.coordinator(Kind::Initiating, kA, 3, Creation::CreateIfNotExisting);
        EXPECT_EQ(result.coordinator, nullptr);
        EXPECT_EQ(result.error, failure(code));
    }
    EXPECT_NE(create(Kind::Initiating, kA), nullptr);
}

TEST_F(SimulatedCoordinationTest, ObjectsComeOutNullAsScripted) {
    service_.makeNoneNext(CoordinationObject::Coordinator, kA);
    service_.makeNoneNext(CoordinationObject::PathTransferPromise, "asset");
    service_.makeNoneNext(CoordinationObject::OutOfBandPromise, "data");
    service_.makeNoneNext(CoordinationObject::Placeholder, kA);
    const auto none =
        service_.coordinator(Kind::Initiating, kA, SyncClientID, Creation::CreateIfNotExisting);
    EXPECT_EQ(none.coordinator, nullptr);
    EXPECT_FALSE(none.error);
    EXPECT_EQ(promise("asset"), nullptr);
    EXPECT_EQ(service_.makeOutOfBandPromise("data", SyncClientID, 0), nullptr);
    EXPECT_EQ(placeholder(kA), nullptr);
    EXPECT_NE(create(Kind::Initiating, kA), nullptr);
    EXPECT_NE(promise("asset"), nullptr);
    EXPECT_NE(service_.makeOutOfBandPromise("data", SyncClientID, 0), nullptr);
    EXPECT_NE(placeholder(kA), nullptr);
    service_.makeNoneNext(CoordinationObject::ExistingCoordinator, kA);
    EXPECT_EQ(service_.existingCoordinator(kA, SyncClientID), nullptr);
    EXPECT_NE(service_.existingCoordinator(kA, SyncClientID), nullptr);
}

TEST_F(SimulatedCoordinationTest, HasAnswersAreScriptable) {
    const auto coordinator = create(Kind::Initiating, kA);
    service_.setHas(CoordinationStep::InstallOptions, kA, true);
    EXPECT_TRUE(coordinator->hasInstallOptions());
    service_.setHas(CoordinationStep::InstallOptions, kA, std::nullopt);
    EXPECT_FALSE(coordinator->hasInstallOptions());
    EXPECT_TRUE(coordinator->setPlaceholderPromise(placeholder(kA)));
    service_.setHas(CoordinationStep::PlaceholderPromise, kA, false);
    EXPECT_FALSE(coordinator->hasPlaceholderPromise());
}

TEST_F(SimulatedCoordinationTest, ACoordinatorMayBeAnotherClientsOrCarryAnError) {
    (void)service_.addCoordinator(Kind::Initiating, kA, kOtherClient);
    service_.setError(kA, failure());
    const auto found =
        service_.coordinator(Kind::Initiating, kA, SyncClientID, Creation::OnlyExisting);
    EXPECT_EQ(found.coordinator->creatorIdentifier(), kOtherClient);
    EXPECT_EQ(found.coordinator->error(), failure());
    service_.setError(kA, std::nullopt);
    EXPECT_FALSE(found.coordinator->error());
    EXPECT_NE(failureOf([&] { service_.addCoordinator(Kind::Initiating, kA, 1); }), "no failure");
    EXPECT_NE(failureOf([&] { service_.setError(kB, failure()); }), "no failure");
    EXPECT_NE(failureOf([&] { service_.cancel(kB, failure(), 1); }), "no failure");
}

TEST_F(SimulatedCoordinationTest, TheRecordsCanBeLookedAt) {
    platform_.files.addFile("/tmp/Icon.png", "an icon");
    const auto coordinator = prepared(kA);
    const auto atlas = placeholder(kB);
    const auto icon = promise("com.example.b-Icon", "/tmp/Icon.png");
    icon->setComplete();
    EXPECT_TRUE(atlas->setIconPromise(icon));
    EXPECT_TRUE(atlas->setSinf(Bytes{1, 2}));
    atlas->cancelForReason(failure(29), SyncClientID);
    EXPECT_THAT(service_.identifiers(), ElementsAre(kA));
    ASSERT_NE(service_.state(kA), nullptr);
    EXPECT_EQ(service_.state(kA)->kind, Kind::Initiating);
    EXPECT_EQ(service_.state(kA)->appAsset.get(), service_.promise("com.example.a-Asset"));
    EXPECT_EQ(service_.state(kA)->placeholder->installType, kInstallTypeRestore);
    const SimulatedPlaceholderState* other = service_.placeholder(kB);
    ASSERT_NE(other, nullptr);
    EXPECT_EQ(other->sinf, (Bytes{1, 2}));
    EXPECT_EQ(other->iconBytes, platform_.files.contents("/tmp/Icon.png"));
    EXPECT_EQ(other->cancelled, (SimulatedCancel{failure(29), SyncClientID}));
    EXPECT_FALSE(other->metadataSet);
    EXPECT_EQ(service_.state(kB), nullptr);
    EXPECT_EQ(service_.promise("nothing"), nullptr);
}

TEST_F(SimulatedCoordinationTest, WhatHasEndedCanBeLookedAt) {
    const auto coordinator = prepared(kA);
    EXPECT_EQ(service_.ended(kA), nullptr);
    service_.cancel(kA, failure(5), kOtherClient);
    EXPECT_EQ(service_.state(kA), nullptr);
    ASSERT_NE(service_.ended(kA), nullptr);
    EXPECT_EQ(service_.ended(kA)->cancelled, (SimulatedCancel{failure(5), kOtherClient}));
    EXPECT_THAT(heard(), ElementsAre("cancelled com.example.a with 5 5 by 7"));
}

TEST_F(SimulatedCoordinationTest, APlaceholderMayBeCompletedAfterItWasHandedOver) {
    const auto coordinator = create(Kind::Restoring, kA);
    coordinator->setObserver(observer_);
    const auto atlas = placeholder(kA);
    EXPECT_TRUE(coordinator->setPlaceholderPromise(atlas));
    EXPECT_THAT(heard(), IsEmpty());
    EXPECT_TRUE(atlas->setConfigurationComplete());
    EXPECT_THAT(heard(), ElementsAre("placeholder com.example.a"));
    EXPECT_EQ(platform_.registry.placeholder(kA)->installType, kInstallTypeRestore);
}

TEST_F(SimulatedCoordinationTest, APlaceholderThatWasGivenUpIsNotShown) {
    const auto coordinator = create(Kind::Restoring, kA);
    const auto atlas = completePlaceholder(kA);
    atlas->cancelForReason(failure(), SyncClientID);
    EXPECT_TRUE(coordinator->setPlaceholderPromise(atlas));
    platform_.runUntilIdle();
    EXPECT_FALSE(platform_.registry.placeholder(kA));
}

TEST_F(SimulatedCoordinationTest, APlaceholderThatCannotBeShownEndsItsCoordinator) {
    platform_.registry.failNextPlaceholderInstall(kA, failure(9));
    const auto coordinator = prepared(kA);
    EXPECT_THAT(heard(),
                ElementsAre("placeholder com.example.a with 9", "complete com.example.a with 9"));
    EXPECT_EQ(service_.state(kA), nullptr);
    EXPECT_EQ(coordinator->error(), failure(9));
}

TEST_F(SimulatedCoordinationTest, ADemotedApplicationIsDoneWithItsPlaceholder) {
    const auto coordinator = create(Kind::RestoringDemoted, kA);
    coordinator->setObserver(observer_);
    EXPECT_TRUE(coordinator->setPlaceholderPromise(completePlaceholder(kA)));
    EXPECT_THAT(heard(), ElementsAre("placeholder com.example.a", "complete com.example.a"));
    EXPECT_TRUE(platform_.registry.placeholder(kA));
    EXPECT_EQ(service_.state(kA), nullptr);
}

TEST_F(SimulatedCoordinationTest, AnInstallFailsAsTheRegistrySays) {
    platform_.registry.failNextInstall(kA, failure(12));
    keepAsset(*prepared(kA));
    EXPECT_THAT(heard(), ElementsAre("placeholder com.example.a",
                                     "complete com.example.a with "
                                     "12"));
    EXPECT_FALSE(platform_.registry.placeholder(kA));
    EXPECT_FALSE(platform_.files.exists(kPackage));
}

TEST_F(SimulatedCoordinationTest, AnInstallWaitsForWhatItsKindNeeds) {
    const auto coordinator = create(Kind::Initiating, kA);
    coordinator->setObserver(observer_);
    EXPECT_TRUE(coordinator->setAppAssetPromise(promise("asset")));
    keepAsset(*coordinator);
    EXPECT_TRUE(coordinator->setPlaceholderPromise(placeholder(kA)));
    EXPECT_TRUE(coordinator->setInstallOptions({}));
    EXPECT_THAT(heard(), IsEmpty());
    const auto initial = promise("initial");
    EXPECT_TRUE(coordinator->setInitialODRAssetPromises({initial}));
    EXPECT_THAT(heard(), IsEmpty());
    initial->setComplete();
    EXPECT_THAT(heard(), ElementsAre("complete com.example.a"));
}

TEST_F(SimulatedCoordinationTest, APackageWithoutAPathCannotBeInstalled) {
    const auto coordinator = prepared(kA);
    coordinator->appAssetPromise()->setComplete();
    platform_.runUntilIdle();
    EXPECT_TRUE(coordinator->error());
    EXPECT_FALSE(platform_.registry.installed(kA));
}

TEST_F(SimulatedCoordinationTest, ACancelDuringTheInstallLeavesNothing) {
    platform_.registry.setInstallDuration(std::chrono::seconds(10));
    const auto coordinator = prepared(kA);
    keepAsset(*coordinator);
    platform_.advance(std::chrono::seconds(5));
    coordinator->cancelForReason(failure(), SyncClientID);
    platform_.advance(std::chrono::seconds(10));
    EXPECT_THAT(heard(), ElementsAre("placeholder com.example.a",
                                     "cancelled com.example.a with 30 30 by 3"));
    EXPECT_FALSE(platform_.registry.installed(kA));
    EXPECT_FALSE(platform_.registry.placeholder(kA));
}

TEST_F(SimulatedCoordinationTest, ReportsByHandComeWhetherTheyAreTrueOrNot) {
    const auto registration = registered();
    service_.postDidBeginFulfillment(5);
    service_.postDidInstallPlaceholder("com.example.unknown");
    service_.postDidInstallPlaceholder(std::nullopt, failure(4));
    service_.postDidComplete("com.example.unknown", failure(5));
    service_.postCanceled(std::nullopt, failure(6), kOtherClient);
    service_.postShouldPrioritize(std::nullopt);
    service_.prioritize(kB);
    EXPECT_THAT(observer_->heard(), IsEmpty());
    EXPECT_THAT(
        heard(),
        ElementsAre("begin 5", "placeholder com.example.unknown", "placeholder nothing with 4",
                    "complete com.example.unknown with 5", "cancelled nothing 6 by 7",
                    "prioritize nothing", "prioritize com.example.b"));
    EXPECT_FALSE(observer_->wasCalledElsewhere());
}

TEST_F(SimulatedCoordinationTest, AReportByHandOfACoordinatorGoesToItsObserver) {
    create(Kind::Initiating, kA)->setObserver(observer_);
    service_.postCanceled(kA, failure(), kOtherClient);
    service_.postCanceled(kA, failure(), kOtherClient);
    EXPECT_THAT(heard(),
                ElementsAre("cancelled com.example.a 30 by 7", "cancelled com.example.a 30 by 7"));
    EXPECT_NE(service_.state(kA), nullptr);
}

TEST_F(SimulatedCoordinationTest, ReportsReachNobodyOnceTheClientHasGone) {
    auto observer = std::make_shared<NotingObserver>(platform_.scheduler);
    auto registration = service_.makeAppInstallObserver("one", {SyncClientID}, observer);
    EXPECT_THAT(service_.appInstallObservers(), ElementsAre("one"));
    service_.postDidComplete(kA);
    service_.postShouldPrioritize(kA);
    registration.reset();
    observer.reset();
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorObserver"}), IsEmpty());
    EXPECT_THAT(service_.appInstallObservers(), IsEmpty());
}

TEST_F(SimulatedCoordinationTest, ADelegateHearsWhenTheObserverHasGone) {
    const auto registration = registered();
    const auto coordinator = create(Kind::Initiating, kA);
    coordinator->setObserver(std::make_shared<NotingObserver>(platform_.scheduler));
    service_.prioritize(kA);
    EXPECT_THAT(heard(), ElementsAre("prioritize com.example.a"));
}

TEST_F(SimulatedCoordinationTest, AnUninstallFailsAsTheRegistrySays) {
    platform_.registry.addApplication(kA);
    platform_.registry.failNextUninstall(kA, failure(8));
    std::vector<std::string> outcomes;
    const auto uninstall = [&] {
        service_.uninstallApp(kA, [&](const ErrorRecord* error) {
            outcomes.push_back(error != nullptr ? std::to_string(error->code) : "ok");
        });
    };
    uninstall();
    EXPECT_THAT(outcomes, IsEmpty());
    EXPECT_TRUE(platform_.registry.installed(kA));
    platform_.runUntilIdle();
    uninstall();
    platform_.runUntilIdle();
    EXPECT_THAT(outcomes, ElementsAre("8", "ok"));
    EXPECT_FALSE(platform_.registry.installed(kA));
}

TEST_F(SimulatedCoordinationTest, TheDeviceServiceIsTheHostsUntilItHasNone) {
    EXPECT_EQ(platform_.host.transferService(), &platform_.transfers);
    platform_.host.setTransferService(nullptr);
    EXPECT_EQ(platform_.host.transferService(), nullptr);
    EXPECT_THAT(platform_.calls(), ElementsAre("SyncHost.transferService() -> a service",
                                               "SyncHost.transferService() -> (null)"));
}

TEST_F(SimulatedCoordinationTest, TransfersAreRecordedAndReportTheirEnd) {
    SyncAsset asset;
    asset.identifier = kA;
    asset.dataclass = "Application";
    platform_.transfers.failNextPrioritize(kA, failure(3));
    std::vector<std::string> outcomes;
    const auto prioritize = [&] {
        platform_.transfers.prioritizeAsset(asset, [&](const ErrorRecord* error) {
            outcomes.push_back(error != nullptr ? std::to_string(error->code) : "ok");
        });
    };
    EXPECT_TRUE(platform_.transfers.canCancelTransfers());
    platform_.transfers.cancelTransferForFailedAsset(asset);
    prioritize();
    prioritize();
    EXPECT_THAT(outcomes, IsEmpty());
    platform_.runUntilIdle();
    EXPECT_THAT(outcomes, ElementsAre("3", "ok"));
    EXPECT_THAT(
        platform_.calls(),
        ElementsAre(
            "TransferService.canCancelTransfers() -> yes",
            "TransferService.cancelTransferForFailedAsset(com.example.a, Application, download)",
            "TransferService.prioritizeAsset(com.example.a, Application, download)",
            "TransferService.prioritizeAsset(com.example.a, Application, download)"));
}

TEST_F(SimulatedCoordinationTest, WhatTheDeviceServiceDoesNotOfferMayNotBeCalled) {
    platform_.transfers.setCanCancelTransfers(false);
    platform_.transfers.setCanPrioritizeAssets(false);
    EXPECT_FALSE(platform_.transfers.canCancelTransfers());
    EXPECT_FALSE(platform_.transfers.canPrioritizeAssets());
    EXPECT_NE(failureOf([&] { platform_.transfers.cancelTransferForFailedAsset({}); }),
              "no failure");
    EXPECT_NE(failureOf([&] { platform_.transfers.prioritizeAsset({}, {}); }), "no failure");
}

/// The same with a seed: the service's threads take turns.
class InterleavedCoordinationTest : public SimulatedCoordinationTest,
                                    public testing::WithParamInterface<std::uint64_t> {
  protected:
    InterleavedCoordinationTest() : SimulatedCoordinationTest(Scheduling::seeded(GetParam())) {}
};

INSTANTIATE_TEST_SUITE_P(, InterleavedCoordinationTest,
                         testing::Range(std::uint64_t{1}, std::uint64_t{21}));

TEST_P(InterleavedCoordinationTest, EachPlaceholderIsReportedBeforeItsCompletion) {
    const auto a = prepared(kA);
    const auto b = prepared(kB);
    keepAsset(*a);
    platform_.runUntilIdle();
    keepAsset(*b);
    const std::vector<std::string> all = heard();
    EXPECT_THAT(all, UnorderedElementsAre("placeholder com.example.a", "complete com.example.a",
                                          "placeholder com.example.b", "complete com.example.b"));
    for (const char* identifier : {kA, kB}) {
        const std::string name(identifier);
        EXPECT_LT(std::find(all.begin(), all.end(), "placeholder " + name),
                  std::find(all.begin(), all.end(), "complete " + name));
    }
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kA, kB));
}

TEST_P(InterleavedCoordinationTest, ACancelledCoordinatorLeavesNoPlaceholder) {
    const auto coordinator = prepared(kA);
    keepAsset(*coordinator);
    coordinator->cancelForReason(failure(), SyncClientID);
    const std::vector<std::string> all = heard();
    EXPECT_FALSE(platform_.registry.placeholder(kA));
    const bool installed = platform_.registry.installed(kA).has_value();
    EXPECT_THAT(all, Contains(StartsWith(installed ? "complete" : "cancelled")));
    EXPECT_THAT(all, testing::Not(Contains(StartsWith(installed ? "cancelled" : "complete"))));
}

}  // namespace
}  // namespace appsync
