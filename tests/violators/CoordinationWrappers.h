#pragma once

#include <chrono>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "contract/forwarding/ForwardingCoordination.h"
#include "platform/AppRegistry.h"
#include "platform/FileSystem.h"
#include "platform/Platform.h"
#include "platform/WorkQueues.h"

// The wrappers that break one sentence of the install-coordination service each, for whoever looks
// for what is broken: the contract kit (CoordinationViolators.cpp) and `CheckedPlatform`.

namespace appsync::violating {

using Handle = std::shared_ptr<InstallCoordinator>;
using Asset = std::shared_ptr<PathTransferPromise>;
using UserData = std::shared_ptr<OutOfBandPromise>;
using PlaceholderPointer = std::shared_ptr<InstallPlaceholder>;
using WeakListener = std::weak_ptr<InstallCoordinatorObserver>;

/// A service that puts a `Wrapper` around each coordinator.
template <typename Wrapper>
struct WithCoordinator : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Handle handleFor(const Handle& coordinator) override {
        return std::make_shared<Wrapper>(coordinator);
    }
};

/// A coordinator that puts a `Listener` in its observer's place, and holds it.
template <typename Listener>
struct WithListener : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    void setObserver(WeakListener observer) override {
        static std::vector<std::shared_ptr<Listener>> kept;
        kept.push_back(std::make_shared<Listener>(std::move(observer)));
        target()->setObserver(kept.back());
    }
};

// Look-ups.

struct LookingCreates : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                            CoordinationClient client, Creation) override {
        return ForwardingCoordination::coordinator(kind, identifier, client,
                                                   Creation::CreateIfNotExisting);
    }
};
struct NothingWasCreated : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                            CoordinationClient client, Creation creation) override {
        auto found = ForwardingCoordination::coordinator(kind, identifier, client, creation);
        found.wasCreated = false;
        return found;
    }
};
struct EverythingWasCreated : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                            CoordinationClient client, Creation creation) override {
        auto found = ForwardingCoordination::coordinator(kind, identifier, client, creation);
        found.wasCreated = found.coordinator != nullptr;
        return found;
    }
};
struct NothingIsAnError : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                            CoordinationClient client, Creation creation) override {
        auto found = ForwardingCoordination::coordinator(kind, identifier, client, creation);
        if (found.coordinator == nullptr && !found.error) {
            found.error = ErrorRecord::make(kSyncErrorDomain, 1, "there is none");
        }
        return found;
    }
};
struct KindsDoNotMatter : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                            CoordinationClient client, Creation creation) override {
        if (auto there = existingCoordinator(identifier, client)) return {there, false, {}};
        return ForwardingCoordination::coordinator(kind, identifier, client, creation);
    }
};
struct RefusalsWithoutAnError : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                            CoordinationClient client, Creation creation) override {
        auto found = ForwardingCoordination::coordinator(kind, identifier, client, creation);
        found.error.reset();
        return found;
    }
};
struct UpdatesNeedNothing : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                            CoordinationClient client, Creation creation) override {
        auto found = ForwardingCoordination::coordinator(kind, identifier, client, creation);
        if (kind != CoordinatorKind::Updating || found.coordinator != nullptr) return found;
        return ForwardingCoordination::coordinator(CoordinatorKind::Initiating, identifier, client,
                                                   creation);
    }
};
struct ForeignCoordinatorsAreHidden : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Handle existingCoordinator(const std::string& identifier, CoordinationClient client) override {
        auto found = ForwardingCoordination::existingCoordinator(identifier, client);
        return found != nullptr && found->creatorIdentifier() == client ? found : nullptr;
    }
};
struct OnlyFirstInstallsExist : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Handle existingCoordinator(const std::string& identifier, CoordinationClient client) override {
        return coordinator(CoordinatorKind::Initiating, identifier, client, Creation::OnlyExisting)
            .coordinator;
    }
};
struct WhoAsksIsTheCreator : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    CoordinationClient creatorIdentifier() const override { return SyncClientID; }
};
struct CoordinatorsAreNobodys : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    std::optional<std::string> bundleIdentifier() const override { return std::nullopt; }
};

// Promises.

template <typename Wrapper>
struct WithAsset : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    Asset makePathTransferPromise(const std::string& name, CoordinationClient client,
                                  const std::optional<FileURL>& path,
                                  std::uint64_t diskSpaceNeeded) override {
        return std::make_shared<Wrapper>(
            target().makePathTransferPromise(name, client, path, diskSpaceNeeded));
    }
};
struct PromisesOfAnotherClient : ForwardingPathTransferPromise {
    using ForwardingPathTransferPromise::ForwardingPathTransferPromise;
    CoordinationClient clientIdentifier() const override { return AppStoreClientID; }
};
struct PromisesWithoutAName : ForwardingPathTransferPromise {
    using ForwardingPathTransferPromise::ForwardingPathTransferPromise;
    std::string name() const override { return {}; }
};
struct PromisesThatAreKeptAtOnce : ForwardingPathTransferPromise {
    using ForwardingPathTransferPromise::ForwardingPathTransferPromise;
    bool isComplete() const override { return true; }
};
struct PercentOfOneHandle : ForwardingPathTransferPromise {
    using ForwardingPathTransferPromise::ForwardingPathTransferPromise;
    double percentComplete() const override { return percent; }
    void setPercentComplete(double set) override {
        percent = set;
        target()->setPercentComplete(set);
    }
    double percent = 0.0;
};
struct PercentOfAHundred : ForwardingPathTransferPromise {
    using ForwardingPathTransferPromise::ForwardingPathTransferPromise;
    void setPercentComplete(double percent) override {
        target()->setPercentComplete(percent * 100);
    }
};
struct PathsAreForgotten : ForwardingPathTransferPromise {
    using ForwardingPathTransferPromise::ForwardingPathTransferPromise;
    std::optional<FileURL> transferPath() const override { return std::nullopt; }
};

/// A coordinator that puts a `Wrapper` around its package.
template <typename Wrapper>
struct WithAttachedAsset : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    Asset appAssetPromise() const override {
        auto promise = target()->appAssetPromise();
        return promise == nullptr ? nullptr : std::make_shared<Wrapper>(promise);
    }
};
struct KeepingIsLost : ForwardingPathTransferPromise {
    using ForwardingPathTransferPromise::ForwardingPathTransferPromise;
    void setComplete() override {}
};
struct PathsAreNotSet : ForwardingPathTransferPromise {
    using ForwardingPathTransferPromise::ForwardingPathTransferPromise;
    void setTransferPath(const FileURL&) override {}
};
/// Shows what was set, also when the service no longer has it.
struct ChangingAfterTheEnd : ForwardingPathTransferPromise {
    using ForwardingPathTransferPromise::ForwardingPathTransferPromise;
    double percentComplete() const override { return last.value_or(target()->percentComplete()); }
    void setPercentComplete(double percent) override {
        target()->setPercentComplete(percent);
        if (target()->percentComplete() != percent) last = percent;
    }
    std::optional<double> last;
};
struct DataWithoutACancel : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    struct Promise : ForwardingOutOfBandPromise {
        using ForwardingOutOfBandPromise::ForwardingPromise;
        void cancelForReason(const ErrorRecord&, CoordinationClient) override {}
    };
    UserData makeOutOfBandPromise(const std::string& name, CoordinationClient client,
                                  std::uint64_t diskSpaceNeeded) override {
        return std::make_shared<Promise>(
            target().makeOutOfBandPromise(name, client, diskSpaceNeeded));
    }
};
struct DataIsNotWaitedFor : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    Status setUserDataPromise(const UserData& promise) override {
        Status status = ForwardingCoordinator::setUserDataPromise(promise);
        if (status) promise->setComplete();
        return status;
    }
};

// Pieces.

struct NoOptionsAreThere : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    bool hasInstallOptions() const override { return false; }
};
struct NoInitialAssetsAreThere : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    bool hasInitialODRAssetPromises() const override { return false; }
};
struct NoUserDataIsThere : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    bool hasUserDataPromise() const override { return false; }
};
struct APlaceholderIsAlwaysThere : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    bool hasPlaceholderPromise() const override { return true; }
};
struct NobodyIsResponsible : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    std::optional<CoordinationClient> appAssetPromiseResponsibleClient() const override {
        return std::nullopt;
    }
};
struct SecondSetsSucceed : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    Status setInstallOptions(const InstallOptions& options) override {
        target()->setInstallOptions(options).ignore();
        return {};
    }
};
/// Takes the second client, and shows it.
struct SecondSetsReplace : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    struct Coordinator : ForwardingCoordinator {
        Coordinator(const Handle& target, std::map<std::string, CoordinationClient>& all)
            : ForwardingCoordinator(target), clients(all) {}
        std::optional<CoordinationClient> appAssetPromiseResponsibleClient() const override {
            const auto found = clients.find(bundleIdentifier().value_or(""));
            if (found == clients.end()) return target()->appAssetPromiseResponsibleClient();
            return found->second;
        }
        Status setAppAssetPromiseResponsibleClient(CoordinationClient client) override {
            clients[bundleIdentifier().value_or("")] = client;
            return target()->setAppAssetPromiseResponsibleClient(client);
        }
        std::map<std::string, CoordinationClient>& clients;
    };
    Handle handleFor(const Handle& coordinator) override {
        return std::make_shared<Coordinator>(coordinator, chosen);
    }
    std::map<std::string, CoordinationClient> chosen;
};
struct NullPlaceholdersAreTaken : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    Status setPlaceholderPromise(const PlaceholderPointer& placeholder) override {
        if (placeholder == nullptr) return {};
        return ForwardingCoordinator::setPlaceholderPromise(placeholder);
    }
};
struct EveryPlaceholderIsTaken : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    Status setPlaceholderPromise(const PlaceholderPointer& placeholder) override {
        Status status = ForwardingCoordinator::setPlaceholderPromise(placeholder);
        if (status || placeholder == nullptr || hasPlaceholderPromise()) return status;
        return {};
    }
};

template <typename Wrapper>
struct WithPlaceholder : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    PlaceholderPointer makeAppPlaceholder(const std::string& name, const std::string& identifier,
                                          std::uint64_t installType,
                                          CoordinationClient client) override {
        return std::make_shared<Wrapper>(
            target().makeAppPlaceholder(name, identifier, installType, client));
    }
};
struct CompletePlaceholdersTakeMore : ForwardingPlaceholder {
    using ForwardingPlaceholder::ForwardingPlaceholder;
    Status setSinf(const Bytes& sinf) override {
        target()->setSinf(sinf).ignore();
        return {};
    }
};
struct SecondPiecesAreRefused : ForwardingPlaceholder {
    using ForwardingPlaceholder::ForwardingPlaceholder;
    Status setAttributes(const PlaceholderAttributes& attributes) override {
        if (has) return ErrorRecord::make(kSyncErrorDomain, 1, "they are there");
        has = true;
        return target()->setAttributes(attributes);
    }
    bool has = false;
};
struct NoMetadataIsRefused : ForwardingPlaceholder {
    using ForwardingPlaceholder::ForwardingPlaceholder;
    Status setMetadata(const std::optional<StoreMetadata>& metadata) override {
        if (!metadata) return ErrorRecord::make(kSyncErrorDomain, 1, "nothing given");
        return target()->setMetadata(metadata);
    }
};
struct ConfigurationsNeverComplete : ForwardingPlaceholder {
    using ForwardingPlaceholder::ForwardingPlaceholder;
    Status setConfigurationComplete() override { return {}; }
};
struct PlaceholdersAreNotGivenUp : ForwardingPlaceholder {
    using ForwardingPlaceholder::ForwardingPlaceholder;
    void cancelForReason(const ErrorRecord&, CoordinationClient) override {}
};
/// Completes the configuration with the first piece.
struct ConfigurationsCompleteThemselves : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    Status setPlaceholderPromise(const PlaceholderPointer& placeholder) override {
        if (placeholder != nullptr) placeholder->setConfigurationComplete().ignore();
        return ForwardingCoordinator::setPlaceholderPromise(placeholder);
    }
};
struct VersionsOfPlaceholdersAreLost : ForwardingPlaceholder {
    using ForwardingPlaceholder::ForwardingPlaceholder;
    Status setAttributes(const PlaceholderAttributes& attributes) override {
        PlaceholderAttributes changed = attributes;
        changed.bundleVersion.reset();
        return target()->setAttributes(changed);
    }
};

// What is told.

struct PlaceholdersAreNotTold : ForwardingCoordinatorObserver {
    using ForwardingCoordinatorObserver::ForwardingCoordinatorObserver;
    void coordinatorDidInstallPlaceholder(const Handle&) override {}
};
struct CompletionsAreNotTold : ForwardingCoordinatorObserver {
    using ForwardingCoordinatorObserver::ForwardingCoordinatorObserver;
    void coordinatorDidCompleteSuccessfully(const Handle&) override {}
};
struct CompletionsAreToldTwice : ForwardingCoordinatorObserver {
    using ForwardingCoordinatorObserver::ForwardingCoordinatorObserver;
    void coordinatorDidCompleteSuccessfully(const Handle& coordinator) override {
        ForwardingCoordinatorObserver::coordinatorDidCompleteSuccessfully(coordinator);
        ForwardingCoordinatorObserver::coordinatorDidCompleteSuccessfully(coordinator);
    }
};
struct FailuresAreToldAsCancels : ForwardingCoordinatorObserver {
    using ForwardingCoordinatorObserver::ForwardingCoordinatorObserver;
    void coordinatorDidCompleteSuccessfully(const Handle& coordinator) override {
        if (const auto error = coordinator->error()) {
            coordinatorCanceledWithReason(coordinator, *error, SyncClientID);
        } else {
            ForwardingCoordinatorObserver::coordinatorDidCompleteSuccessfully(coordinator);
        }
    }
};
struct CoordinatorCancelsAreNotTold : ForwardingCoordinatorObserver {
    using ForwardingCoordinatorObserver::ForwardingCoordinatorObserver;
    void coordinatorCanceledWithReason(const Handle&, const ErrorRecord&,
                                       CoordinationClient) override {}
};
struct CancelsOfAnotherClient : ForwardingCoordinatorObserver {
    using ForwardingCoordinatorObserver::ForwardingCoordinatorObserver;
    void coordinatorCanceledWithReason(const Handle& coordinator, const ErrorRecord& reason,
                                       CoordinationClient) override {
        ForwardingCoordinatorObserver::coordinatorCanceledWithReason(coordinator, reason, 0);
    }
};
struct CancelsWithoutAReason : ForwardingCoordinatorObserver {
    using ForwardingCoordinatorObserver::ForwardingCoordinatorObserver;
    void coordinatorCanceledWithReason(const Handle& coordinator, const ErrorRecord&,
                                       CoordinationClient client) override {
        ForwardingCoordinatorObserver::coordinatorCanceledWithReason(coordinator, {}, client);
    }
};
struct CompletionsBeforePlaceholders : ForwardingCoordinatorObserver {
    using ForwardingCoordinatorObserver::ForwardingCoordinatorObserver;
    void coordinatorDidInstallPlaceholder(const Handle& coordinator) override {
        ForwardingCoordinatorObserver::coordinatorDidCompleteSuccessfully(coordinator);
    }
    void coordinatorDidCompleteSuccessfully(const Handle& coordinator) override {
        ForwardingCoordinatorObserver::coordinatorDidInstallPlaceholder(coordinator);
    }
};
struct ReportsOfAFailureThatIsNone : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    std::optional<ErrorRecord> error() const override {
        return target()->error().value_or(ErrorRecord::make(kSyncErrorDomain, 1, "none"));
    }
};
struct ErrorsAreForgotten : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    std::optional<ErrorRecord> error() const override { return std::nullopt; }
};
struct CoordinatorObserversAreOwned : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    void setObserver(WeakListener observer) override {
        static std::vector<std::shared_ptr<InstallCoordinatorObserver>> owned;
        owned.push_back(observer.lock());
        target()->setObserver(std::move(observer));
    }
};
struct EarlierObserversHearToo : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    struct Both : ForwardingCoordinatorObserver {
        Both(WeakListener first, WeakListener second)
            : ForwardingCoordinatorObserver(std::move(first)), also(std::move(second)) {}
        void coordinatorCanceledWithReason(const Handle& coordinator, const ErrorRecord& reason,
                                           CoordinationClient client) override {
            ForwardingCoordinatorObserver::coordinatorCanceledWithReason(coordinator, reason,
                                                                         client);
            if (const auto to = also.lock()) {
                to->coordinatorCanceledWithReason(coordinator, reason, client);
            }
        }
        const WeakListener also;
    };
    struct Coordinator : ForwardingCoordinator {
        Coordinator(const Handle& target, EarlierObserversHearToo& all)
            : ForwardingCoordinator(target), service(all) {}
        void setObserver(WeakListener observer) override {
            WeakListener& former = service.earlier[bundleIdentifier().value_or("")];
            service.kept.push_back(std::make_shared<Both>(observer, former));
            former = observer;
            target()->setObserver(service.kept.back());
        }
        EarlierObserversHearToo& service;
    };
    Handle handleFor(const Handle& coordinator) override {
        return std::make_shared<Coordinator>(coordinator, *this);
    }
    std::map<std::string, WeakListener> earlier;
    std::vector<std::shared_ptr<Both>> kept;
};

// Ends.

struct SecondCancelsCount : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    std::optional<ErrorRecord> error() const override { return last ? last : target()->error(); }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        last = reason;
        target()->cancelForReason(reason, client);
    }
    std::optional<ErrorRecord> last;
};
struct CancelledCoordinatorsTakeMore : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    Status setInitialODRAssetPromises(const std::vector<Asset>& promises) override {
        Status status = ForwardingCoordinator::setInitialODRAssetPromises(promises);
        return error() ? Status() : status;
    }
};
struct CancelledCoordinatorsForget : ForwardingCoordinator {
    using ForwardingCoordinator::ForwardingCoordinator;
    bool hasInstallOptions() const override { return !error() && target()->hasInstallOptions(); }
};
/// A wrapper that has the rest of the platform, too.
struct CoordinationWithPlatform : ForwardingCoordination {
    CoordinationWithPlatform(InstallCoordinatorService& target, const Platform& all)
        : ForwardingCoordination(target), platform(all) {}
    const Platform platform;
};
struct CancelsRemoveTheVersion : CoordinationWithPlatform {
    using CoordinationWithPlatform::CoordinationWithPlatform;
    struct Coordinator : ForwardingCoordinator {
        Coordinator(const Handle& target, AppRegistry& from)
            : ForwardingCoordinator(target), registry(from) {}
        void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
            const std::string identifier = bundleIdentifier().value_or("");
            while (registry.uninstallApplication(identifier, {})) continue;
            target()->cancelForReason(reason, client);
        }
        AppRegistry& registry;
    };
    Handle handleFor(const Handle& coordinator) override {
        return std::make_shared<Coordinator>(coordinator, platform.registry);
    }
};
/// Leaves the file where it is: what it installs is a copy.
struct PackagesAreLeft : CoordinationWithPlatform {
    using CoordinationWithPlatform::CoordinationWithPlatform;
    struct Promise : ForwardingPathTransferPromise {
        Promise(const Asset& target, FileSystem& all)
            : ForwardingPathTransferPromise(target), files(all) {}
        void setTransferPath(const FileURL& path) override {
            const std::string copy = path.path() + ".copy";
            files.copyItem(path.path(), copy).ignore();
            target()->setTransferPath(*FileURL::fromPath(copy, false));
        }
        FileSystem& files;
    };
    struct Coordinator : ForwardingCoordinator {
        Coordinator(const Handle& target, FileSystem& all)
            : ForwardingCoordinator(target), files(all) {}
        Asset appAssetPromise() const override {
            auto promise = target()->appAssetPromise();
            return promise == nullptr ? nullptr : std::make_shared<Promise>(promise, files);
        }
        FileSystem& files;
    };
    Handle handleFor(const Handle& coordinator) override {
        return std::make_shared<Coordinator>(coordinator, platform.files);
    }
};
struct UninstallsCompleteTwice : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    void uninstallApp(const std::string& identifier, UninstallCompletion completion) override {
        target().uninstallApp(identifier, [completion](const ErrorRecord* error) {
            completion(error);
            completion(error);
        });
    }
};
struct UninstallsDoNotComplete : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    void uninstallApp(const std::string& identifier, UninstallCompletion) override {
        target().uninstallApp(identifier, [](const ErrorRecord*) {});
    }
};
struct FailedUninstallsSucceed : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    void uninstallApp(const std::string& identifier, UninstallCompletion completion) override {
        target().uninstallApp(identifier,
                              [completion](const ErrorRecord*) { completion(nullptr); });
    }
};
/// Calls back before it returns.
struct UninstallsOnTheCallersThread : CoordinationWithPlatform {
    using CoordinationWithPlatform::CoordinationWithPlatform;
    void uninstallApp(const std::string& identifier, UninstallCompletion completion) override {
        const Status removed = platform.registry.uninstallApplication(identifier, {});
        completion(removed ? nullptr : &removed.error());
    }
};
struct UninstallsTakeTheApplicationToo : CoordinationWithPlatform {
    using CoordinationWithPlatform::CoordinationWithPlatform;
    void uninstallApp(const std::string& identifier, UninstallCompletion completion) override {
        if (platform.registry.proxyForIdentifier(identifier, AppRegistry::Placeholders::Excluded)) {
            const PropertyList only = PropertyList::map({{UninstallPlaceholderOnlyKey, true}});
            platform.registry.uninstallApplication(identifier, only).ignore();
        }
        target().uninstallApp(identifier, std::move(completion));
    }
};
struct UnderlyingErrorsAreLost : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    ErrorRecord userPresentableError(std::int64_t code,
                                     const std::optional<ErrorRecord>&) override {
        return target().userPresentableError(code, std::nullopt);
    }
};
struct PersonsErrorsHaveNoCode : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    ErrorRecord userPresentableError(std::int64_t,
                                     const std::optional<ErrorRecord>& underlying) override {
        return target().userPresentableError(0, underlying);
    }
};

// Delegates.

struct DelegatesHearOfEverybody : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    std::shared_ptr<AppInstallObserver> makeAppInstallObserver(
        const std::string& serviceName, const std::set<CoordinationClient>& clients,
        WeakListener delegate) override {
        std::set<CoordinationClient> all = clients;
        for (CoordinationClient client = 0; client < 10; ++client) all.insert(client);
        return target().makeAppInstallObserver(serviceName, all, std::move(delegate));
    }
};
struct DelegatesHearNothing : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    std::shared_ptr<AppInstallObserver> makeAppInstallObserver(const std::string& serviceName,
                                                               const std::set<CoordinationClient>&,
                                                               WeakListener delegate) override {
        return target().makeAppInstallObserver(serviceName, {}, std::move(delegate));
    }
};
struct RegistrationsDoNotEnd : ForwardingCoordination {
    using ForwardingCoordination::ForwardingCoordination;
    struct Handle : AppInstallObserver {};
    std::shared_ptr<AppInstallObserver> makeAppInstallObserver(
        const std::string& serviceName, const std::set<CoordinationClient>& clients,
        WeakListener delegate) override {
        registrations.push_back(
            target().makeAppInstallObserver(serviceName, clients, std::move(delegate)));
        return std::make_shared<Handle>();
    }
    std::vector<std::shared_ptr<AppInstallObserver>> registrations;
};

}  // namespace appsync::violating
