#include <chrono>
#include <functional>
#include <utility>

#include "platform/TransferService.h"
#include "tests/checked/CheckedPlatformFixture.h"
#include "tests/violators/CoordinationWrappers.h"

namespace appsync {
namespace {

using std::chrono::seconds;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

using Creation = InstallCoordinatorService::Creation;
using Kind = CoordinatorKind;

ErrorRecord reason() { return ErrorRecord::make(kSyncErrorDomain, 30, "not wanted any more"); }

/// Asks the coordinator that it hears of.
class AskingObserver : public InstallCoordinatorObserver {
  public:
    void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t /*promise*/) override {}
    void coordinatorDidInstallPlaceholder(const InstallCoordinatorPointer& coordinator) override {
        hear("placeholder", coordinator);
    }
    void coordinatorDidCompleteSuccessfully(const InstallCoordinatorPointer& coordinator) override {
        hear("completion", coordinator);
    }
    void coordinatorCanceledWithReason(const InstallCoordinatorPointer& coordinator,
                                       const ErrorRecord& /*reason*/,
                                       CoordinationClient /*client*/) override {
        hear("cancel", coordinator);
    }
    void coordinatorShouldPrioritize(const InstallCoordinatorPointer& coordinator) override {
        hear("priority", coordinator);
    }

    std::vector<std::string> heard;

  private:
    void hear(const std::string& news, const InstallCoordinatorPointer& coordinator) {
        heard.push_back(news + " " + coordinator->bundleIdentifier().value_or("?") +
                        (coordinator->error() ? " (error)" : ""));
    }
};

/// Puts into coordinators all that they take and refuse, through a platform that is checked.
class CheckedCoordinationTest : public CheckedPlatformFixture {
  protected:
    explicit CheckedCoordinationTest(Scheduling scheduling = Scheduling::runToCompletion())
        : CheckedPlatformFixture(scheduling) {}

    [[nodiscard]] InstallCoordinatorService& service() { return checked_->services().coordination; }

    std::shared_ptr<InstallCoordinator> create(const std::string& identifier) {
        auto made = service().coordinator(Kind::Initiating, identifier, SyncClientID,
                                          Creation::CreateIfNotExisting);
        if (made.coordinator != nullptr) made.coordinator->setObserver(observer_);
        return made.coordinator;
    }
    std::shared_ptr<InstallPlaceholder> placeholder(const std::string& identifier) {
        auto placeholder =
            service().makeAppPlaceholder("Example", identifier, kInstallTypeSync, SyncClientID);
        EXPECT_TRUE(placeholder->setAttributes({}));
        EXPECT_TRUE(placeholder->setConfigurationComplete());
        placeholder->setSinf({}).ignore();
        return placeholder;
    }
    std::shared_ptr<PathTransferPromise> package(const std::string& identifier) {
        auto promise = service().makePathTransferPromise(
            identifier + "-Asset", SyncClientID, FileURL::fromPath("/var/mobile/a.zip", false), 0);
        promise->setPercentComplete(0.25);
        promise->setPercentComplete(0.5);
        return promise;
    }
    /// A first install, each of whose pieces is set twice.
    void install() {
        const auto coordinator = create(kA);
        for (int time = 0; time < 2; ++time) {
            coordinator->setInstallOptions({{}, kInstallTypeSync, 1}).ignore();
            coordinator->setInitialODRAssetPromises({}).ignore();
            coordinator->setAppAssetPromiseResponsibleClient(SyncClientID).ignore();
            coordinator->setUserDataPromise(service().makeOutOfBandPromise("data", SyncClientID, 0))
                .ignore();
            coordinator->setAppAssetPromise(package(kA)).ignore();
            coordinator->setPlaceholderPromise(nullptr).ignore();
            coordinator->setPlaceholderPromise(placeholder(kB)).ignore();
            coordinator->setPlaceholderPromise(placeholder(kA)).ignore();
            platform_.runUntilIdle();
        }
        keep(*coordinator);
        platform_.advance(seconds(1));
        coordinator->setInitialODRAssetPromises({}).ignore();
    }
    void keep(const InstallCoordinator& coordinator) {
        platform_.files.addFile("/var/mobile/a.zip", "package");
        if (const auto* state = platform_.coordination.state(kA); state->userData != nullptr)
            state->userData->complete = true;
        const auto promise = coordinator.appAssetPromise();
        promise->setPercentComplete(1.0);
        promise->setComplete();
    }
    /// Another one that is cancelled, and what is asked for of the service beside.
    void cancel() {
        const auto coordinator = create(kC);
        coordinator->setInstallOptions({{}, kInstallTypeSync, 1}).ignore();
        coordinator->cancelForReason(reason(), SyncClientID);
        coordinator->setInitialODRAssetPromises({}).ignore();
        static_cast<void>(service().existingCoordinator(kC, SyncClientID));
        static_cast<void>(
            service().coordinator(Kind::Initiating, kC, SyncClientID, Creation::OnlyExisting));
        static_cast<void>(create("a/b"));
        service().uninstallApp(kA, [](const ErrorRecord* /*error*/) {});
        platform_.advance(seconds(60));
    }
    void installAndCancel(InstallCoordinatorService* broken = nullptr) {
        checkWith({.coordination = broken});
        install();
        cancel();
    }

    const std::shared_ptr<AskingObserver> observer_ = std::make_shared<AskingObserver>();
};

TEST_F(CheckedCoordinationTest, SaysNothingOfGoodCoordinators) {
    installAndCancel();
    EXPECT_THAT(told(), IsEmpty());
    EXPECT_THAT(observer_->heard,
                ElementsAre("placeholder com.example.a", "completion com.example.a",
                            "cancel com.example.c (error)"));
}

/// The same in other orders.
class CheckedCoordinationSeeds : public CheckedCoordinationTest,
                                 public testing::WithParamInterface<std::uint64_t> {
  protected:
    CheckedCoordinationSeeds() : CheckedCoordinationTest(Scheduling::seeded(GetParam())) {}
};

INSTANTIATE_TEST_SUITE_P(, CheckedCoordinationSeeds, testing::Range<std::uint64_t>(1, 51));

TEST_P(CheckedCoordinationSeeds, SayNothingOfGoodCoordinators) {
    installAndCancel();
    EXPECT_THAT(told(), IsEmpty());
}

/// What is broken, and what is told of it.
struct BrokenCoordination {
    const char* name;
    std::function<std::unique_ptr<InstallCoordinatorService>(InstallCoordinatorService&)> around;
    const char* told;
};

void PrintTo(const BrokenCoordination& broken, std::ostream* out) { *out << broken.name; }

template <typename Wrapper>
BrokenCoordination broken(const char* name, const char* told) {
    return {name, [](InstallCoordinatorService& good) { return std::make_unique<Wrapper>(good); },
            told};
}

// Those that the kit does not need: it sees the same otherwise.

using violating::Handle;
using violating::WithCoordinator;

struct OthersCoordinators : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    std::optional<std::string> bundleIdentifier() const override { return "com.example.other"; }
};
struct CreatedByAnother : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    CoordinationClient creatorIdentifier() const override { return AppStoreClientID; }
};
struct EveryIdentifierIsLegal : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                            CoordinationClient client, Creation creation) override {
        const bool isLegal = identifier.find('/') == std::string::npos;
        auto found = ForwardingCoordination::coordinator(kind, isLegal ? identifier : "legal",
                                                         client, creation);
        return found;
    }
};
struct AnErrorBesideACoordinator : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                            CoordinationClient client, Creation creation) override {
        auto found = ForwardingCoordination::coordinator(kind, identifier, client, creation);
        found.error = reason();
        return found;
    }
};
struct ErrorsWithoutADomain : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    Status setInstallOptions(const InstallOptions&) override {
        return ErrorRecord::make("", 1, "no");
    }
};
struct ProgressThatGoesBack : ForwardingPathTransferPromise {
    using ForwardingPathTransferPromise::ForwardingPathTransferPromise;
    void setPercentComplete(double percent) override {
        target()->setPercentComplete(percent > 0.25 ? 0.0 : percent);
    }
};

class BrokenCoordinationTest : public CheckedCoordinationTest,
                               public testing::WithParamInterface<BrokenCoordination> {};

TEST_P(BrokenCoordinationTest, IsTold) {
    const auto service = GetParam().around(platform_.coordination);
    installAndCancel(service.get());
    EXPECT_THAT(told(), Contains(HasSubstr(GetParam().told)));
}

INSTANTIATE_TEST_SUITE_P(
    LookUps, BrokenCoordinationTest,
    testing::Values(
        broken<violating::LookingCreates>("LookingCreates", "that was not asked for"),
        broken<WithCoordinator<OthersCoordinators>>("OthersCoordinators",
                                                    "the coordinator of another application"),
        broken<WithCoordinator<CreatedByAnother>>("CreatedByAnother",
                                                  "a new coordinator is that of another client"),
        broken<EveryIdentifierIsLegal>("EveryIdentifierIsLegal",
                                       "an illegal identifier has a coordinator"),
        broken<AnErrorBesideACoordinator>("AnErrorBesideACoordinator",
                                          "a coordinator and an error"),
        broken<WithCoordinator<ErrorsWithoutADomain>>("ErrorsWithoutADomain",
                                                      "an error without a domain"),
        broken<violating::UninstallsCompleteTwice>("UninstallsCompleteTwice",
                                                   "uninstallApp was called again"),
        broken<violating::UninstallsDoNotComplete>("UninstallsDoNotComplete",
                                                   "uninstallApp was not called in time")));

INSTANTIATE_TEST_SUITE_P(
    Promises, BrokenCoordinationTest,
    testing::Values(
        broken<violating::WithAsset<violating::PromisesOfAnotherClient>>(
            "PromisesOfAnotherClient", "a new promise is that of another client"),
        broken<violating::WithAsset<violating::PromisesWithoutAName>>("PromisesWithoutAName",
                                                                      "a new promise is named ''"),
        broken<violating::WithAsset<violating::PromisesThatAreKeptAtOnce>>(
            "PromisesThatAreKeptAtOnce", "a new promise is kept already"),
        broken<violating::WithAsset<violating::PercentOfAHundred>>("PercentOfAHundred",
                                                                   "a progress of 25"),
        broken<violating::WithAsset<ProgressThatGoesBack>>("ProgressThatGoesBack",
                                                           "is less than it was before"),
        broken<violating::WithAsset<violating::PathsAreForgotten>>(
            "PathsAreForgotten", "a new promise has another path")));

INSTANTIATE_TEST_SUITE_P(
    Pieces, BrokenCoordinationTest,
    testing::Values(
        broken<WithCoordinator<violating::NoOptionsAreThere>>(
            "NoOptionsAreThere", "took install options and has it not"),
        broken<WithCoordinator<violating::NoInitialAssetsAreThere>>(
            "NoInitialAssetsAreThere", "took initial assets and has it not"),
        broken<WithCoordinator<violating::NoUserDataIsThere>>(
            "NoUserDataIsThere", "took a promise of data and has it not"),
        broken<WithCoordinator<violating::NobodyIsResponsible>>(
            "NobodyIsResponsible", "took a client that brings the package and has it not"),
        broken<WithCoordinator<violating::APlaceholderIsAlwaysThere>>(
            "APlaceholderIsAlwaysThere", "that had a placeholder took another"),
        broken<WithCoordinator<violating::SecondSetsSucceed>>(
            "SecondSetsSucceed", "that had install options took another"),
        broken<WithCoordinator<violating::NullPlaceholdersAreTaken>>(
            "NullPlaceholdersAreTaken", "null was taken for a placeholder"),
        broken<WithCoordinator<violating::EveryPlaceholderIsTaken>>(
            "EveryPlaceholderIsTaken", "the placeholder of another application was taken"),
        broken<violating::WithPlaceholder<violating::CompletePlaceholdersTakeMore>>(
            "CompletePlaceholdersTakeMore", "a placeholder that was complete took a SINF"),
        broken<WithCoordinator<violating::CancelledCoordinatorsTakeMore>>(
            "CancelledCoordinatorsTakeMore", "that was cancelled took initial assets")));

INSTANTIATE_TEST_SUITE_P(
    News, BrokenCoordinationTest,
    testing::Values(
        broken<WithCoordinator<violating::WithListener<violating::CompletionsAreToldTwice>>>(
            "CompletionsAreToldTwice", "another completion was told"),
        broken<WithCoordinator<violating::WithListener<violating::CompletionsBeforePlaceholders>>>(
            "CompletionsBeforePlaceholders", "a placeholder was told of an install that had")));

/// Calls observers itself, as the test says.
class HandmadeNews : public ForwardingCoordination {
  public:
    using ForwardingCoordination::ForwardingCoordination;

    std::weak_ptr<InstallCoordinatorObserver> observer;
    std::function<void(const Handle&)> onOptions;
    std::function<void()> onError;

  private:
    class Coordinator : public ForwardingCoordinator {
      public:
        Coordinator(const Handle& target, HandmadeNews& news)
            : ForwardingCoordinator(target), news_(news) {}
        void setObserver(std::weak_ptr<InstallCoordinatorObserver> toTell) override {
            news_.observer = std::move(toTell);
        }
        Status setInstallOptions(const InstallOptions& options) override {
            if (news_.onOptions) news_.onOptions(target());
            return ForwardingCoordinator::setInstallOptions(options);
        }
        std::optional<ErrorRecord> error() const override {
            if (news_.onError) news_.onError();
            return ForwardingCoordinator::error();
        }

      private:
        HandmadeNews& news_;
    };
    std::shared_ptr<InstallCoordinator> handleFor(const Handle& coordinator) override {
        return std::make_shared<Coordinator>(coordinator, *this);
    }
};

class HandmadeNewsTest : public CheckedCoordinationTest {
  protected:
    HandmadeNewsTest() { checkWith({.coordination = &news_}); }

    HandmadeNews news_{platform_.coordination};
};

TEST_F(HandmadeNewsTest, OnACallersThreadAreTold) {
    news_.onOptions = [this](const Handle& coordinator) {
        news_.observer.lock()->coordinatorShouldPrioritize(coordinator);
    };
    EXPECT_TRUE(create(kA)->setInstallOptions({}));
    EXPECT_THAT(told(), ElementsAre(HasSubstr("on a thread that was in a call of the service")));
    EXPECT_THAT(observer_->heard, ElementsAre("priority com.example.a"));
}

TEST_F(HandmadeNewsTest, OnAnotherThreadAreGood) {
    const auto coordinator = create(kA);
    platform_.scheduler.spawn(
        "service", [&] { news_.observer.lock()->coordinatorShouldPrioritize(coordinator); });
    platform_.advance(seconds(60));
    EXPECT_THAT(told(), IsEmpty());
    EXPECT_THAT(observer_->heard, ElementsAre("priority com.example.a"));
}

/// Keeps whoever asks for an error from going on, as a lock would that is held by the one who
/// calls.
TEST_F(HandmadeNewsTest, UnderALockThatAnObserverNeedsAreTold) {
    const std::shared_ptr<Semaphore> unlocked = platform_.queues.makeSemaphore(0);
    const auto coordinator =
        service().coordinator(Kind::Initiating, kA, SyncClientID, Creation::CreateIfNotExisting);
    coordinator.coordinator->setObserver(observer_);
    news_.onError = [unlocked] { (void)unlocked->wait(); };
    const auto handle = news_.existingCoordinator(kA, SyncClientID);
    platform_.scheduler.spawn("service",
                              [&] { news_.observer.lock()->coordinatorShouldPrioritize(handle); });
    platform_.advance(seconds(29));
    EXPECT_THAT(told(), IsEmpty());
    platform_.advance(seconds(2));
    EXPECT_THAT(told(), ElementsAre(HasSubstr("by an observer was not answered in time")));
    unlocked->signal();
    platform_.runUntilIdle();
    EXPECT_THAT(observer_->heard, ElementsAre("priority com.example.a"));
}

/// A checked observer does not keep a coordinator from whoever comes after the one that is gone.
TEST_F(CheckedCoordinationTest, ADelegateHearsOfWhatAnObserverThatIsGoneWouldHaveHeard) {
    checkWith({});
    auto gone = std::make_shared<AskingObserver>();
    create(kA)->setObserver(gone);
    gone.reset();
    const auto registration = service().makeAppInstallObserver("name", {SyncClientID}, observer_);
    platform_.coordination.prioritize(kA);
    platform_.runUntilIdle();
    EXPECT_THAT(observer_->heard, ElementsAre("priority com.example.a"));
    EXPECT_THAT(told(), IsEmpty());
}

/// A transfer service whose completions the test calls.
class HandmadeTransfers : public SyncHost, public TransferService {
  public:
    std::string mainBundleIdentifier() const override { return "com.korvu.trd"; }
    std::string pluginBundleIdentifier() const override { return "com.example.sync"; }
    bool isRecoverableError(const ErrorRecord& /*error*/) const override { return false; }
    TransferService* transferService() override { return this; }

    bool canCancelTransfers() const override { return true; }
    void cancelTransferForFailedAsset(const SyncAsset& /*asset*/) override { ++cancelled; }
    bool canPrioritizeAssets() const override { return true; }
    void prioritizeAsset(const SyncAsset& /*asset*/, PrioritizeCompletion completion) override {
        completed = std::move(completion);
    }

    int cancelled = 0;
    PrioritizeCompletion completed;
};

class CheckedTransfersTest : public CheckedPlatformFixture {
  protected:
    CheckedTransfersTest() { checkWith({.host = &broken_}); }

    [[nodiscard]] TransferService& transfers() {
        return *checked_->services().host.transferService();
    }
    void prioritize() {
        transfers().prioritizeAsset({}, [this](const ErrorRecord* /*error*/) { ++completions_; });
    }

    HandmadeTransfers broken_;
    int completions_ = 0;
};

TEST_F(CheckedTransfersTest, OneCompletionIsGood) {
    prioritize();
    broken_.completed(nullptr);
    transfers().cancelTransferForFailedAsset({});
    platform_.advance(seconds(60));
    EXPECT_THAT(told(), IsEmpty());
    EXPECT_EQ(completions_, 1);
    EXPECT_EQ(broken_.cancelled, 1);
}

TEST_F(CheckedTransfersTest, ACompletionThatIsLostIsTold) {
    prioritize();
    platform_.advance(seconds(31));
    EXPECT_THAT(told(),
                ElementsAre(HasSubstr("the completion of prioritizeAsset was not called in time")));
}

TEST_F(CheckedTransfersTest, ACompletionThatComesTwiceIsTold) {
    prioritize();
    broken_.completed(nullptr);
    broken_.completed(nullptr);
    EXPECT_THAT(told(),
                ElementsAre(HasSubstr("the completion of prioritizeAsset was called again")));
    EXPECT_EQ(completions_, 1);
}

TEST_F(CheckedTransfersTest, AnErrorWithoutADomainIsTold) {
    prioritize();
    const ErrorRecord error = ErrorRecord::make("", 1, "no");
    broken_.completed(&error);
    EXPECT_THAT(told(), ElementsAre(HasSubstr("an error without a domain")));
}

}  // namespace
}  // namespace appsync
