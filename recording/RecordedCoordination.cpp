#include "recording/RecordedCoordination.h"

#include <string_view>
#include <utility>
#include <vector>

#include "platform/Error.h"
#include "recording/Recording.h"

namespace appsync {
namespace {

using Observers = std::shared_ptr<RecordedCoordinatorObservers>;

/// What all that is handed out has.
template <typename Interface>
class RecordedHandle : public Interface {
  public:
    RecordedHandle(std::shared_ptr<Interface> inner, Recording& recording)
        : inner_(std::move(inner)), number_(recording.newNumber()), recording_(recording) {}

    [[nodiscard]] const std::shared_ptr<Interface>& inner() const { return inner_; }
    [[nodiscard]] std::uint64_t number() const { return number_; }

  protected:
    Recording& recording() const { return recording_; }

  private:
    const std::shared_ptr<Interface> inner_;
    const std::uint64_t number_;
    Recording& recording_;
};

/// The platform's own object and the number of what the plug-in has in its place; null
/// and 0 for null.
template <typename Interface>
std::shared_ptr<Interface> innerOf(const std::shared_ptr<Interface>& handle) {
    return handle ? static_cast<const RecordedHandle<Interface>&>(*handle).inner() : nullptr;
}
template <typename Interface>
std::uint64_t numberOf(const std::shared_ptr<Interface>& handle) {
    if (handle == nullptr) return 0;
    return static_cast<const RecordedHandle<Interface>&>(*handle).number();
}

template <typename Interface>
constexpr const char* kPromise = nullptr;
template <>
constexpr const char* kPromise<PathTransferPromise> = "PathTransferPromise.";
template <>
constexpr const char* kPromise<OutOfBandPromise> = "OutOfBandPromise.";

template <typename Interface>
class RecordedPromise : public RecordedHandle<Interface> {
  public:
    using RecordedHandle<Interface>::RecordedHandle;

    std::string name() const override { return call("name").answer(this->inner()->name()); }
    CoordinationClient clientIdentifier() const override {
        return call("clientIdentifier").answer(this->inner()->clientIdentifier());
    }
    double percentComplete() const override {
        return call("percentComplete").answer(this->inner()->percentComplete());
    }
    void setPercentComplete(double percent) override {
        const CallRecord record = call("setPercentComplete", percent);
        this->inner()->setPercentComplete(percent);
    }
    bool isComplete() const override {
        return call("isComplete").answer(this->inner()->isComplete());
    }
    void setComplete() override {
        const AnnouncedCall call = announced("setComplete");
        this->inner()->setComplete();
    }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        const AnnouncedCall call = announced("cancelForReason", reason, client);
        this->inner()->cancelForReason(reason, client);
    }

  protected:
    template <typename... Arguments>
    CallRecord call(const char* method, const Arguments&... arguments) const {
        return CallRecord(this->recording(), CallName(kPromise<Interface>, method), this->number(),
                          arguments...);
    }
    template <typename... Arguments>
    AnnouncedCall announced(const char* method, const Arguments&... arguments) const {
        return AnnouncedCall(this->recording(), CallName(kPromise<Interface>, method),
                             this->number(), arguments...);
    }
};

using RecordedOutOfBandPromise = RecordedPromise<OutOfBandPromise>;

class RecordedPathPromise : public RecordedPromise<PathTransferPromise> {
  public:
    using RecordedPromise::RecordedPromise;

    std::optional<FileURL> transferPath() const override {
        return call("transferPath").answer(inner()->transferPath());
    }
    void setTransferPath(const FileURL& path) override {
        const CallRecord record = call("setTransferPath", path);
        inner()->setTransferPath(path);
    }
};

class RecordedPlaceholder : public RecordedHandle<InstallPlaceholder> {
  public:
    using RecordedHandle::RecordedHandle;

    std::string description() const override {
        return call("description").answer(inner()->description());
    }
    Status setIconPromise(const std::shared_ptr<PathTransferPromise>& promise) override {
        return call("setIconPromise", numberOf(promise))
            .answer(inner()->setIconPromise(innerOf(promise)));
    }
    Status setAttributes(const PlaceholderAttributes& attributes) override {
        return call("setAttributes", attributes).answer(inner()->setAttributes(attributes));
    }
    Status setMetadata(const std::optional<StoreMetadata>& metadata) override {
        return call("setMetadata", metadata).answer(inner()->setMetadata(metadata));
    }
    Status setSinf(const Bytes& sinf) override {
        return call("setSinf", sinf).answer(inner()->setSinf(sinf));
    }
    Status setConfigurationComplete() override {
        return call("setConfigurationComplete").answer(inner()->setConfigurationComplete());
    }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        const CallRecord record = call("cancelForReason", reason, client);
        inner()->cancelForReason(reason, client);
    }

  private:
    template <typename... Arguments>
    CallRecord call(const char* method, const Arguments&... arguments) const {
        return CallRecord(recording(), CallName("InstallPlaceholder.", method), number(),
                          arguments...);
    }
};

}  // namespace

/// Stands for an observer of the plug-in's with the coordination service.
class RecordedCoordinatorObserver
    : public InstallCoordinatorObserver,
      public std::enable_shared_from_this<RecordedCoordinatorObserver> {
  public:
    RecordedCoordinatorObserver(std::weak_ptr<InstallCoordinatorObserver> plugIn,
                                const Observers& observers, Recording& recording)
        : plugIn_(std::move(plugIn)),
          observers_(observers),
          number_(recording.newNumber()),
          recording_(recording.shared_from_this()) {}

    [[nodiscard]] std::uint64_t number() const { return number_; }

    void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t promise) override {
        const SpanRecord span(*recording_, "callback",
                              "InstallCoordinatorObserver.promiseDidBeginFulfillmentWithIdentifier",
                              number_, promise);
        const auto plugIn = plugIn_.lock();
        if (plugIn != nullptr) plugIn->promiseDidBeginFulfillmentWithIdentifier(promise);
    }
    void coordinatorDidInstallPlaceholder(const InstallCoordinatorPointer& coordinator) override;
    void coordinatorDidCompleteSuccessfully(const InstallCoordinatorPointer& coordinator) override;
    void coordinatorCanceledWithReason(const InstallCoordinatorPointer& coordinator,
                                       const ErrorRecord& reason,
                                       CoordinationClient client) override;
    void coordinatorShouldPrioritize(const InstallCoordinatorPointer& coordinator) override;

  private:
    [[nodiscard]] InstallCoordinatorPointer handleOn(const InstallCoordinatorPointer& inner) const;
    template <auto Method, typename... Arguments>
    void pass(std::string_view callback, const InstallCoordinatorPointer& coordinator,
              const Arguments&... arguments) const;

    const std::weak_ptr<InstallCoordinatorObserver> plugIn_;
    const std::weak_ptr<RecordedCoordinatorObservers> observers_;
    const std::uint64_t number_;
    const std::shared_ptr<Recording> recording_;
};

namespace {

std::shared_ptr<RecordedCoordinatorObserver> standInFor(
    const Observers& observers, const std::weak_ptr<InstallCoordinatorObserver>& observer,
    Recording& recording) {
    const std::shared_ptr<InstallCoordinatorObserver> plugIn = observer.lock();
    return observers->standInFor(plugIn.get(), observer, [&] {
        return std::make_shared<RecordedCoordinatorObserver>(observer, observers, recording);
    });
}

class RecordedCoordinator : public RecordedHandle<InstallCoordinator> {
  public:
    RecordedCoordinator(InstallCoordinatorPointer inner, Observers observers, Recording& recording)
        : RecordedHandle(std::move(inner), recording), observers_(std::move(observers)) {}

    std::optional<std::string> bundleIdentifier() const override {
        return call("bundleIdentifier").answer(inner()->bundleIdentifier());
    }
    CoordinationClient creatorIdentifier() const override {
        return call("creatorIdentifier").answer(inner()->creatorIdentifier());
    }
    std::optional<ErrorRecord> error() const override {
        return call("error").answer(inner()->error());
    }
    std::string description() const override {
        return call("description").answer(inner()->description());
    }
    void setObserver(std::weak_ptr<InstallCoordinatorObserver> observer) override {
        const auto standIn = standInFor(observers_, observer, recording());
        const AnnouncedCall call = announced("setObserver", standIn->number());
        inner()->setObserver(standIn);
    }
    bool hasInstallOptions() const override {
        return call("hasInstallOptions").answer(inner()->hasInstallOptions());
    }
    Status setInstallOptions(const InstallOptions& options) override {
        return call("setInstallOptions", options).answer(inner()->setInstallOptions(options));
    }
    bool hasInitialODRAssetPromises() const override {
        return call("hasInitialODRAssetPromises").answer(inner()->hasInitialODRAssetPromises());
    }
    Status setInitialODRAssetPromises(
        const std::vector<std::shared_ptr<PathTransferPromise>>& promises) override {
        std::vector<std::shared_ptr<PathTransferPromise>> inners;
        std::vector<std::uint64_t> numbers;
        inners.reserve(promises.size());
        numbers.reserve(promises.size());
        for (const auto& each : promises) {
            inners.push_back(innerOf(each));
            numbers.push_back(numberOf(each));
        }
        return call("setInitialODRAssetPromises", numbers)
            .answer(inner()->setInitialODRAssetPromises(inners));
    }
    std::shared_ptr<PathTransferPromise> appAssetPromise() const override {
        CallRecord record = call("appAssetPromise");
        std::shared_ptr<PathTransferPromise> promise = inner()->appAssetPromise();
        if (promise != nullptr) {
            promise = std::make_shared<RecordedPathPromise>(std::move(promise), recording());
        }
        static_cast<void>(record.answer(numberOf(promise)));
        return promise;
    }
    Status setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise) override {
        return call("setAppAssetPromise", numberOf(promise))
            .answer(inner()->setAppAssetPromise(innerOf(promise)));
    }
    std::optional<CoordinationClient> appAssetPromiseResponsibleClient() const override {
        return call("appAssetPromiseResponsibleClient")
            .answer(inner()->appAssetPromiseResponsibleClient());
    }
    Status setAppAssetPromiseResponsibleClient(CoordinationClient client) override {
        return call("setAppAssetPromiseResponsibleClient", client)
            .answer(inner()->setAppAssetPromiseResponsibleClient(client));
    }
    bool hasUserDataPromise() const override {
        return call("hasUserDataPromise").answer(inner()->hasUserDataPromise());
    }
    Status setUserDataPromise(const std::shared_ptr<OutOfBandPromise>& promise) override {
        return call("setUserDataPromise", numberOf(promise))
            .answer(inner()->setUserDataPromise(innerOf(promise)));
    }
    bool hasPlaceholderPromise() const override {
        return call("hasPlaceholderPromise").answer(inner()->hasPlaceholderPromise());
    }
    Status setPlaceholderPromise(const std::shared_ptr<InstallPlaceholder>& placeholder) override {
        return call("setPlaceholderPromise", numberOf(placeholder))
            .answer(inner()->setPlaceholderPromise(innerOf(placeholder)));
    }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        const AnnouncedCall call = announced("cancelForReason", reason, client);
        inner()->cancelForReason(reason, client);
    }

  private:
    template <typename... Arguments>
    CallRecord call(const char* method, const Arguments&... arguments) const {
        return CallRecord(recording(), CallName("InstallCoordinator.", method), number(),
                          arguments...);
    }
    template <typename... Arguments>
    AnnouncedCall announced(const char* method, const Arguments&... arguments) const {
        return AnnouncedCall(recording(), CallName("InstallCoordinator.", method), number(),
                             arguments...);
    }

    const Observers observers_;
};

class RecordedInstallObserver : public AppInstallObserver {
  public:
    RecordedInstallObserver(std::shared_ptr<AppInstallObserver> inner, std::uint64_t number,
                            Recording& recording)
        : inner_(std::move(inner)), number_(number), recording_(recording) {}
    RecordedInstallObserver(const RecordedInstallObserver&) = delete;
    RecordedInstallObserver& operator=(const RecordedInstallObserver&) = delete;
    ~RecordedInstallObserver() override {
        const CallRecord record(recording_, "AppInstallObserver.release", number_);
        inner_.reset();
    }

  private:
    std::shared_ptr<AppInstallObserver> inner_;
    const std::uint64_t number_;
    Recording& recording_;
};

}  // namespace

InstallCoordinatorPointer RecordedCoordinatorObserver::handleOn(
    const InstallCoordinatorPointer& inner) const {
    return std::make_shared<RecordedCoordinator>(inner, observers_.lock(), *recording_);
}

/// Hands on what is told of a coordinator.
template <auto Method, typename... Arguments>
void RecordedCoordinatorObserver::pass(std::string_view callback,
                                       const InstallCoordinatorPointer& coordinator,
                                       const Arguments&... arguments) const {
    const InstallCoordinatorPointer handle = handleOn(coordinator);
    const SpanRecord span(*recording_, "callback", callback, number_, numberOf(handle),
                          arguments...);
    const auto plugIn = plugIn_.lock();
    if (plugIn != nullptr) (plugIn.get()->*Method)(handle, arguments...);
}

void RecordedCoordinatorObserver::coordinatorDidInstallPlaceholder(
    const InstallCoordinatorPointer& coordinator) {
    pass<&InstallCoordinatorObserver::coordinatorDidInstallPlaceholder>(
        "InstallCoordinatorObserver.coordinatorDidInstallPlaceholder", coordinator);
}

void RecordedCoordinatorObserver::coordinatorDidCompleteSuccessfully(
    const InstallCoordinatorPointer& coordinator) {
    pass<&InstallCoordinatorObserver::coordinatorDidCompleteSuccessfully>(
        "InstallCoordinatorObserver.coordinatorDidCompleteSuccessfully", coordinator);
}

void RecordedCoordinatorObserver::coordinatorCanceledWithReason(
    const InstallCoordinatorPointer& coordinator, const ErrorRecord& reason,
    CoordinationClient client) {
    pass<&InstallCoordinatorObserver::coordinatorCanceledWithReason>(
        "InstallCoordinatorObserver.coordinatorCanceledWithReason", coordinator, reason, client);
}

void RecordedCoordinatorObserver::coordinatorShouldPrioritize(
    const InstallCoordinatorPointer& coordinator) {
    pass<&InstallCoordinatorObserver::coordinatorShouldPrioritize>(
        "InstallCoordinatorObserver.coordinatorShouldPrioritize", coordinator);
}

RecordedCoordination::RecordedCoordination(InstallCoordinatorService& inner, Recording& recording)
    : inner_(inner),
      recording_(recording),
      observers_(std::make_shared<RecordedCoordinatorObservers>()) {}

RecordedCoordination::~RecordedCoordination() = default;

bool RecordedCoordination::isCoordinationEnabled() {
    return CallRecord(recording_, "InstallCoordinatorService.isCoordinationEnabled", 0)
        .answer(inner_.isCoordinationEnabled());
}

InstallCoordinatorService::Coordinator RecordedCoordination::coordinator(
    CoordinatorKind kind, const std::string& identifier, CoordinationClient client,
    Creation creation) {
    CallRecord record(recording_, "InstallCoordinatorService.coordinator", 0, kind, identifier,
                      client, creation);
    Coordinator found = inner_.coordinator(kind, identifier, client, creation);
    if (found.coordinator != nullptr) {
        found.coordinator = std::make_shared<RecordedCoordinator>(std::move(found.coordinator),
                                                                  observers_, recording_);
    }
    RecordText answer = recording_.newText();
    answer.begin('[');
    answer.add(numberOf(found.coordinator));
    answer.add(found.wasCreated);
    answer.add(found.error);
    answer.end(']');
    static_cast<void>(record.answer(std::move(answer)));
    return found;
}

InstallCoordinatorPointer RecordedCoordination::existingCoordinator(const std::string& identifier,
                                                                    CoordinationClient client) {
    CallRecord record(recording_, "InstallCoordinatorService.existingCoordinator", 0, identifier,
                      client);
    InstallCoordinatorPointer found = inner_.existingCoordinator(identifier, client);
    if (found != nullptr) {
        found = std::make_shared<RecordedCoordinator>(std::move(found), observers_, recording_);
    }
    static_cast<void>(record.answer(numberOf(found)));
    return found;
}

std::shared_ptr<PathTransferPromise> RecordedCoordination::makePathTransferPromise(
    const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
    std::uint64_t diskSpaceNeeded) {
    CallRecord record(recording_, "InstallCoordinatorService.makePathTransferPromise", 0, name,
                      client, path, diskSpaceNeeded);
    auto promise = inner_.makePathTransferPromise(name, client, path, diskSpaceNeeded);
    if (promise != nullptr) {
        promise = std::make_shared<RecordedPathPromise>(std::move(promise), recording_);
    }
    static_cast<void>(record.answer(numberOf(promise)));
    return promise;
}

std::shared_ptr<OutOfBandPromise> RecordedCoordination::makeOutOfBandPromise(
    const std::string& name, CoordinationClient client, std::uint64_t diskSpaceNeeded) {
    CallRecord record(recording_, "InstallCoordinatorService.makeOutOfBandPromise", 0, name, client,
                      diskSpaceNeeded);
    auto promise = inner_.makeOutOfBandPromise(name, client, diskSpaceNeeded);
    if (promise != nullptr) {
        promise = std::make_shared<RecordedOutOfBandPromise>(std::move(promise), recording_);
    }
    static_cast<void>(record.answer(numberOf(promise)));
    return promise;
}

std::shared_ptr<InstallPlaceholder> RecordedCoordination::makeAppPlaceholder(
    const std::string& name, const std::string& identifier, std::uint64_t installType,
    CoordinationClient client) {
    CallRecord record(recording_, "InstallCoordinatorService.makeAppPlaceholder", 0, name,
                      identifier, installType, client);
    auto placeholder = inner_.makeAppPlaceholder(name, identifier, installType, client);
    if (placeholder != nullptr) {
        placeholder = std::make_shared<RecordedPlaceholder>(std::move(placeholder), recording_);
    }
    static_cast<void>(record.answer(numberOf(placeholder)));
    return placeholder;
}

void RecordedCoordination::uninstallApp(const std::string& identifier,
                                        UninstallCompletion completion) {
    const std::uint64_t number = recording_.newNumber();
    const AnnouncedCall call(recording_, "InstallCoordinatorService.uninstallApp", 0, identifier,
                             number);
    inner_.uninstallApp(
        identifier, [recording = recording_.shared_from_this(), number,
                     completion = std::move(completion)](const ErrorRecord* error) mutable {
            const SpanRecord span(*recording, "callback",
                                  "InstallCoordinatorService.UninstallCompletion", number, error);
            const UninstallCompletion own = std::move(completion);
            if (own) own(error);
        });
}

ErrorRecord RecordedCoordination::userPresentableError(
    std::int64_t code, const std::optional<ErrorRecord>& underlying) {
    return CallRecord(recording_, "InstallCoordinatorService.userPresentableError", 0, code,
                      underlying)
        .answer(inner_.userPresentableError(code, underlying));
}

std::shared_ptr<AppInstallObserver> RecordedCoordination::makeAppInstallObserver(
    const std::string& serviceName, const std::set<CoordinationClient>& clients,
    std::weak_ptr<InstallCoordinatorObserver> delegate) {
    const auto standIn = standInFor(observers_, delegate, recording_);
    const std::uint64_t number = recording_.newNumber();
    CallRecord record(recording_, "InstallCoordinatorService.makeAppInstallObserver", 0,
                      serviceName, clients, standIn->number());
    auto observer = inner_.makeAppInstallObserver(serviceName, clients, standIn);
    static_cast<void>(record.answer(observer != nullptr ? number : 0));
    if (observer == nullptr) return nullptr;
    return std::make_shared<RecordedInstallObserver>(std::move(observer), number, recording_);
}

}  // namespace appsync
