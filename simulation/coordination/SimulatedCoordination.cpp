#include "simulation/coordination/SimulatedCoordination.h"

#include <algorithm>
#include <array>
#include <string_view>

#include "platform/AppRegistry.h"
#include "platform/LegalIdentifier.h"
#include "simulation/coordination/SimulatedCoordinator.h"
#include "simulation/coordination/SimulatedPlaceholder.h"
#include "simulation/coordination/SimulatedPromises.h"
#include "simulation/files/SimulatedFileSystem.h"
#include "simulation/recording/RecordedCall.h"
#include "simulation/services/SimulatedAppRegistry.h"

namespace appsync {
namespace {

constexpr std::string_view kCoordinationService = "InstallCoordinatorService";
constexpr std::string_view kCoordinatorObserver = "InstallCoordinatorObserver";
constexpr std::string_view kDomain = "InstallCoordination";
// 1 to 9 are codes of errors that a person may see.
constexpr std::int64_t kOtherKind = 10;
constexpr std::int64_t kNotInstalled = 12;
constexpr std::int64_t kAlreadySet = 15;
constexpr std::int64_t kCoordinationRefused = 16;
constexpr std::int64_t kOver = 17;

ErrorRecord failureOf(std::int64_t code, const std::string& why) {
    return ErrorRecord::make(kDomain, code, why);
}

ErrorRecord coordinationRefused(const std::string& why) {
    return failureOf(kCoordinationRefused, why);
}

std::string_view kindName(CoordinatorKind kind) {
    constexpr std::array<std::string_view, 4> kNames{"initiating", "updating", "restoring",
                                                     "restoring demoted"};
    return kNames.at(static_cast<std::size_t>(kind));
}

std::string coordinatorText(const InstallCoordinatorService::Coordinator& result,
                            const std::string& identifier) {
    if (result.error) return callText(*result.error);
    if (result.coordinator == nullptr) return "(null)";
    return identifier + (result.wasCreated ? ", created" : ", existing");
}

std::string clientsText(const std::set<CoordinationClient>& clients) {
    std::string text = "{";
    for (const CoordinationClient client : clients) {
        text += (text.size() > 1 ? ", " : "") + callText(client);
    }
    return text + "}";
}

/// Whether its placeholder is to be shown and is not yet.
bool wantsPlaceholder(const SimulatedCoordinatorState& state) {
    return state.placeholder != nullptr && state.placeholder->configurationComplete &&
           !state.placeholder->cancelled && !state.placeholderShown;
}

bool awaitsInitialAssets(const SimulatedCoordinatorState& state) {
    return state.initialODRAssets &&
           std::any_of(state.initialODRAssets->begin(), state.initialODRAssets->end(),
                       [](const auto& promise) { return promise->isAwaited(); });
}

/// Whether it has the pieces that its kind needs, and waits for none.
bool isReady(const SimulatedCoordinatorState& state) {
    if (state.placeholder == nullptr || wantsPlaceholder(state)) return false;
    if (state.userData != nullptr && state.userData->isAwaited()) return false;
    if (awaitsInitialAssets(state)) return false;
    if (state.kind == CoordinatorKind::RestoringDemoted) return state.placeholderShown;
    if (state.appAsset == nullptr || !state.appAsset->complete) return false;
    if (state.kind == CoordinatorKind::Restoring) return true;
    return state.installOptions.has_value() && state.initialODRAssets.has_value();
}

AppProxy proxyOf(const SimulatedPlaceholderState& placeholder) {
    AppProxy proxy;
    proxy.applicationIdentifier = placeholder.identifier;
    proxy.displayName = placeholder.name;
    proxy.installType = placeholder.installType;
    if (placeholder.attributes) proxy.bundleVersion = placeholder.attributes->bundleVersion;
    return proxy;
}

using PromiseState = std::shared_ptr<SimulatedPromiseState>;
using CoordinatorState = std::shared_ptr<SimulatedCoordinatorState>;

PromiseState copyOf(const PromiseState& promise, const CoordinatorState& coordinator) {
    if (promise == nullptr) return nullptr;
    auto copy = std::make_shared<SimulatedPromiseState>(*promise);
    copy->coordinator = coordinator;
    return copy;
}

/// A copy with pieces of its own, as no process has touched it.
CoordinatorState copyOf(const SimulatedCoordinatorState& state) {
    auto copy = std::make_shared<SimulatedCoordinatorState>(state);
    copy->observer.reset();
    copy->before.reset();
    copy->scheduled = false;
    copy->appAsset = copyOf(state.appAsset, copy);
    copy->userData = copyOf(state.userData, copy);
    if (copy->initialODRAssets) {
        for (PromiseState& each : *copy->initialODRAssets) each = copyOf(each, copy);
    }
    if (state.placeholder != nullptr) {
        copy->placeholder = std::make_shared<SimulatedPlaceholderState>(*state.placeholder);
        copy->placeholder->coordinator = copy;
        copy->placeholder->icon = copyOf(state.placeholder->icon, nullptr);
    }
    return copy;
}

/// Nothing but a restore brings back what stands there.
bool restores(const SimulatedCoordinatorState& state) {
    return state.kind == CoordinatorKind::Restoring && state.placeholderShown;
}

/// What waits for its package again after an install that failed.
CoordinatorState withoutPackage(const SimulatedCoordinatorState& state) {
    CoordinatorState copy = copyOf(state);
    copy->appAsset.reset();
    return copy;
}

void endPromise(const std::shared_ptr<SimulatedPromiseState>& promise) {
    if (promise != nullptr) promise->over = true;
}

void endPromises(const SimulatedCoordinatorState& state) {
    endPromise(state.appAsset);
    endPromise(state.userData);
    if (state.placeholder != nullptr) endPromise(state.placeholder->icon);
    if (!state.initialODRAssets) return;
    for (const auto& promise : *state.initialODRAssets) endPromise(promise);
}

}  // namespace

/// Whose delegate hears of what.
struct SimulatedCoordination::Registration {
    std::string serviceName;
    std::set<CoordinationClient> clients;
    std::weak_ptr<InstallCoordinatorObserver> delegate;
    bool ended = false;
};

/// Who hears of a coordinator; of a delegate its registration.
struct SimulatedCoordination::Listener {
    std::shared_ptr<InstallCoordinatorObserver> observer;
    std::shared_ptr<Registration> registration;

    [[nodiscard]] bool hears() const { return registration == nullptr || !registration->ended; }
};

/// The registration lasts as long as this.
class SimulatedCoordination::Observer : public AppInstallObserver {
  public:
    explicit Observer(std::shared_ptr<Registration> registration)
        : registration_(std::move(registration)) {}
    ~Observer() override { registration_->ended = true; }

    Observer(const Observer&) = delete;
    Observer& operator=(const Observer&) = delete;

  private:
    const std::shared_ptr<Registration> registration_;
};

SimulatedCoordination::SimulatedCoordination(Recorder& recorder, SimulatedAppRegistry& registry,
                                             SimulatedFileSystem& files)
    : recorder_(recorder), registry_(registry), files_(files) {}

SimulatedCoordination::~SimulatedCoordination() = default;

// The interface.

bool SimulatedCoordination::isCoordinationEnabled() {
    RecordedCall call(recorder_, kCoordinationService, "isCoordinationEnabled");
    return call.result(enabled_);
}

SimulatedCoordination::Coordinator SimulatedCoordination::coordinator(CoordinatorKind kind,
                                                                      const std::string& identifier,
                                                                      CoordinationClient client,
                                                                      Creation creation) {
    RecordedCall call(
        recorder_, kCoordinationService, "coordinator", kindName(kind), identifier, client,
        creation == Creation::OnlyExisting ? "only existing" : "create if not existing");
    Coordinator result = lookUp(kind, identifier, client, creation);
    std::string text = coordinatorText(result, identifier);
    return call.result(std::move(result), std::move(text));
}

SimulatedCoordination::Coordinator SimulatedCoordination::lookUp(CoordinatorKind kind,
                                                                 const std::string& identifier,
                                                                 CoordinationClient client,
                                                                 Creation creation) {
    const auto failure = [](ErrorRecord error) { return Coordinator{nullptr, false, error}; };
    if (takeNone(CoordinationObject::Coordinator, identifier)) return {};
    if (const Status status = takeFailure(CoordinationStep::LookUp, identifier); !status) {
        return failure(status.error());
    }
    if (!isLegalIdentifier(identifier)) {
        return failure(coordinationRefused("'" + identifier + "' is no identifier"));
    }
    if (const State found = find(identifier)) {
        if (found->kind == kind) return {handle(found), false, std::nullopt};
        return failure(ErrorRecord::make(
            kDomain, kOtherKind,
            "the coordinator of '" + identifier + "' is " + std::string(kindName(found->kind))));
    }
    if (creation == Creation::OnlyExisting) return {};
    if (kind == CoordinatorKind::Updating && !registry_.installed(identifier)) {
        return failure(failureOf(kNotInstalled, "'" + identifier + "' is not installed"));
    }
    return {handle(create(kind, identifier, client)), true, std::nullopt};
}

std::shared_ptr<InstallCoordinator> SimulatedCoordination::existingCoordinator(
    const std::string& identifier, CoordinationClient client) {
    RecordedCall call(recorder_, kCoordinationService, "existingCoordinator", identifier, client);
    const bool none = takeNone(CoordinationObject::ExistingCoordinator, identifier);
    const State found = none ? nullptr : find(identifier);
    if (found == nullptr) return call.result(std::shared_ptr<InstallCoordinator>(), "(null)");
    return call.result(handle(found), identifier);
}

std::shared_ptr<PathTransferPromise> SimulatedCoordination::makePathTransferPromise(
    const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
    std::uint64_t diskSpaceNeeded) {
    RecordedCall call(recorder_, kCoordinationService, "makePathTransferPromise", name, client,
                      path, diskSpaceNeeded);
    std::shared_ptr<PathTransferPromise> promise;
    if (!takeNone(CoordinationObject::PathTransferPromise, name)) {
        const auto state = newPromise(name, client, diskSpaceNeeded);
        state->path = path;
        promise = std::make_shared<SimulatedPathTransferPromise>(*this, state);
    }
    std::string text = promise != nullptr ? "a promise" : "(null)";
    return call.result(std::move(promise), std::move(text));
}

std::shared_ptr<OutOfBandPromise> SimulatedCoordination::makeOutOfBandPromise(
    const std::string& name, CoordinationClient client, std::uint64_t diskSpaceNeeded) {
    RecordedCall call(recorder_, kCoordinationService, "makeOutOfBandPromise", name, client,
                      diskSpaceNeeded);
    std::shared_ptr<OutOfBandPromise> promise;
    if (!takeNone(CoordinationObject::OutOfBandPromise, name)) {
        const auto state = newPromise(name, client, diskSpaceNeeded);
        promise = std::make_shared<SimulatedOutOfBandPromise>(*this, state);
    }
    std::string text = promise != nullptr ? "a promise" : "(null)";
    return call.result(std::move(promise), std::move(text));
}

std::shared_ptr<SimulatedPromiseState> SimulatedCoordination::newPromise(
    const std::string& name, CoordinationClient client, std::uint64_t diskSpaceNeeded) {
    auto state = std::make_shared<SimulatedPromiseState>();
    state->name = name;
    state->client = client;
    state->diskSpaceNeeded = diskSpaceNeeded;
    promises_[name] = state;
    return state;
}

std::shared_ptr<InstallPlaceholder> SimulatedCoordination::makeAppPlaceholder(
    const std::string& name, const std::string& identifier, std::uint64_t installType,
    CoordinationClient client) {
    RecordedCall call(recorder_, kCoordinationService, "makeAppPlaceholder", name, identifier,
                      installType, client);
    if (takeNone(CoordinationObject::Placeholder, identifier)) {
        return call.result(std::shared_ptr<InstallPlaceholder>(), "(null)");
    }
    auto state = std::make_shared<SimulatedPlaceholderState>();
    state->name = name;
    state->identifier = identifier;
    state->installType = installType;
    state->client = client;
    placeholders_[identifier] = state;
    std::shared_ptr<InstallPlaceholder> placeholder =
        std::make_shared<SimulatedPlaceholder>(*this, std::move(state));
    return call.result(std::move(placeholder), "a placeholder");
}

void SimulatedCoordination::uninstallApp(const std::string& identifier,
                                         UninstallCompletion completion) {
    const RecordedCall call(recorder_, kCoordinationService, "uninstallApp", identifier);
    submit([this, identifier, completion = std::move(completion)] {
        const Status status = registry_.uninstall(identifier);
        completion(status ? nullptr : &status.error());
    });
}

ErrorRecord SimulatedCoordination::userPresentableError(
    std::int64_t code, const std::optional<ErrorRecord>& underlying) {
    RecordedCall call(recorder_, kCoordinationService, "userPresentableError", code, underlying);
    ErrorRecord error = ErrorRecord::make(kDomain, code, "the application could not be installed");
    if (underlying) {
        error.userInfo.set("underlying", PropertyList::map({{"domain", underlying->domain},
                                                            {"code", underlying->code},
                                                            {"userInfo", underlying->userInfo}}));
    }
    return call.result(std::move(error));
}

std::shared_ptr<AppInstallObserver> SimulatedCoordination::makeAppInstallObserver(
    const std::string& serviceName, const std::set<CoordinationClient>& clients,
    std::weak_ptr<InstallCoordinatorObserver> delegate) {
    RecordedCall call(recorder_, kCoordinationService, "makeAppInstallObserver", serviceName,
                      clientsText(clients));
    if (takeNone(CoordinationObject::AppInstallObserver, serviceName)) {
        return call.result(std::shared_ptr<AppInstallObserver>(), "(null)");
    }
    auto registration =
        std::make_shared<Registration>(Registration{serviceName, clients, std::move(delegate)});
    registrations_.push_back(registration);
    std::shared_ptr<AppInstallObserver> observer =
        std::make_shared<Observer>(std::move(registration));
    resume();
    return call.result(std::move(observer), "an observer");
}

// For the handles.

Status SimulatedCoordination::takeFailure(CoordinationStep step, const std::string& identifier) {
    if (failures_.empty()) return {};
    const auto found = failures_.find({step, identifier});
    if (found == failures_.end()) return {};
    ErrorRecord error = std::move(found->second.front());
    found->second.pop_front();
    if (found->second.empty()) failures_.erase(found);
    return error;
}

bool SimulatedCoordination::takeNone(CoordinationObject object, const std::string& key) {
    if (nones_.empty()) return false;
    const auto found = nones_.find({object, key});
    if (found == nones_.end()) return false;
    if (--found->second == 0) nones_.erase(found);
    return true;
}

bool SimulatedCoordination::has(CoordinationStep piece, const SimulatedCoordinatorState& state,
                                bool truth) const {
    if (answers_.empty() || !state.identifier) return truth;
    const auto found = answers_.find({piece, *state.identifier});
    return found == answers_.end() ? truth : found->second;
}

Status SimulatedCoordination::checkSet(CoordinationStep piece,
                                       const SimulatedCoordinatorState& state, bool there) {
    if (Status failure = takeFailure(piece, state.identifier.value_or("")); !failure) {
        return failure;
    }
    if (state.ended) return failureOf(kOver, "the coordinator has ended");
    if (there) return failureOf(kAlreadySet, "the coordinator has this piece already");
    return {};
}

Status SimulatedCoordination::checkChange(CoordinationStep piece,
                                          const SimulatedPlaceholderState& state) {
    if (Status failure = takeFailure(piece, state.identifier); !failure) return failure;
    if (state.cancelled) return coordinationRefused("the placeholder was cancelled");
    if (state.configurationComplete)
        return coordinationRefused("the placeholder's configuration is complete");
    return {};
}

Status SimulatedCoordination::checkPlaceholder(const SimulatedCoordinatorState& state,
                                               const SimulatedPlaceholderState* placeholder) {
    if (placeholder == nullptr) return nothingGiven();
    if (placeholder->identifier != state.identifier) {
        return coordinationRefused("the placeholder is that of '" + placeholder->identifier + "'");
    }
    return {};
}

ErrorRecord SimulatedCoordination::nothingGiven() {
    return coordinationRefused("there is nothing to set");
}

void SimulatedCoordination::cancelPromise(SimulatedPromiseState& promise, const ErrorRecord& reason,
                                          CoordinationClient client) {
    if (promise.over || !promise.isAwaited()) return;
    promise.cancelled = SimulatedCancel{reason, client};
    tell("a promise given up", promise.name, Persistence::Soon);
    if (const State coordinator = promise.coordinator.lock()) advance(coordinator);
}

void SimulatedCoordination::cancelNow(const State& state, const ErrorRecord& reason,
                                      CoordinationClient client) {
    if (state->ended) return;
    state->cancelled = SimulatedCancel{reason, client};
    end(state, reason);
    takePlaceholderAway(*state);
    tell("the cancel", *state->identifier, Persistence::Committed);
    submit([this, state, reason, client] { reportCancel(state, reason, client); });
}

// Crashes.

SimulatedCoordination::Records SimulatedCoordination::records() const {
    Records result;
    for (const auto& [identifier, state] : coordinators_) {
        const bool isOnItsWay = wantsPlaceholder(*state) && state->before != nullptr;
        result[identifier] = copyOf(isOnItsWay ? *state->before : *state);
    }
    return result;
}

void SimulatedCoordination::reopen(const Records& records) {
    for (const auto& [identifier, state] : records) {
        const bool stood = state->placeholderShown;
        if (!enabled_) {
            if (stood) registry_.hidePlaceholder(identifier);
        } else if (!stood || registry_.placeholder(identifier)) {
            coordinators_[identifier] = copyOf(*state);
        }
    }
    isReopened_ = enabled_;
    if (!enabled_) return;
    for (const std::string& identifier : registry_.placeholderIdentifiers()) {
        const bool isOfSync = registry_.placeholder(identifier)->installType == kInstallTypeSync;
        if (isOfSync && !coordinators_.contains(identifier)) registry_.hidePlaceholder(identifier);
    }
}

/// The device shows a placeholder before the call that hands it in returns, in one step with it.
void SimulatedCoordination::willHandPlaceholder(SimulatedCoordinatorState& state) const {
    if (recorder_.isChangeListening()) state.before = copyOf(state);
}

void SimulatedCoordination::resume() {
    if (!std::exchange(isReopened_, false)) return;
    for (const auto& [identifier, state] : Records(coordinators_)) advance(state);
}

void SimulatedCoordination::tell(std::string_view what, const std::string& identifier,
                                 Persistence persistence) const {
    if (!recorder_.isChangeListening()) return;
    recorder_.recordsChanged(std::string(what) + " of " + identifier, persistence);
}

// What the service does by itself.

void SimulatedCoordination::submit(Work work) {
    work_.push_back(std::move(work));
    if (workers_ == kThreads) return;
    ++workers_;
    recorder_.scheduler().spawn("coordination", [this] { workerLoop(); });
}

void SimulatedCoordination::workerLoop() {
    while (!work_.empty()) {
        const Work work = std::move(work_.front());
        work_.pop_front();
        work();
    }
    --workers_;
}

void SimulatedCoordination::advance(const State& state) {
    if (state->ended || state->scheduled) return;
    if (!wantsPlaceholder(*state) && !isReady(*state)) return;
    state->scheduled = true;
    submit([this, state] { goOn(state); });
}

void SimulatedCoordination::goOn(const State& state) {
    if (!state->ended && wantsPlaceholder(*state)) showPlaceholder(state);
    if (!state->ended && isReady(*state)) install(state);
    state->scheduled = false;
    advance(state);
}

void SimulatedCoordination::showPlaceholder(const State& state) {
    if (placeholderDuration_ > SimulatedTime::zero()) {
        recorder_.scheduler().waitFor("the placeholder of " + *state->identifier,
                                      placeholderDuration_, [] { return false; });
        if (state->ended) return;  // cancelled meanwhile
    }
    const Result<Persistence> shown = registry_.showPlaceholder(proxyOf(*state->placeholder));
    state->placeholderShown = shown.ok();
    if (!shown) end(state, shown.error());
    tell("the placeholder", *state->identifier, shown ? *shown : Persistence::Committed);
    reportPlaceholder(state);
    if (!shown) reportCompletion(state);
}

void SimulatedCoordination::install(const State& state) {
    Status status;
    if (state->kind != CoordinatorKind::RestoringDemoted) status = installPackage(*state);
    if (state->ended) return;  // cancelled meanwhile
    const State again = !status && restores(*state) ? withoutPackage(*state) : nullptr;
    end(state, status ? std::nullopt : std::optional(status.error()));
    if (again != nullptr) coordinators_[*again->identifier] = again;
    if (!status && again == nullptr) takePlaceholderAway(*state);
    const bool isInstalled = status.ok() && state->kind != CoordinatorKind::RestoringDemoted;
    tell("the end", *state->identifier, isInstalled ? Persistence::OnDisk : Persistence::Committed);
    reportCompletion(state);
}

Status SimulatedCoordination::installPackage(const SimulatedCoordinatorState& state) {
    if (!state.appAsset->path) {
        return coordinationRefused("the package has no path");
    }
    return registry_.install(*state.identifier, state.appAsset->path->path());
}

void SimulatedCoordination::end(const State& state, std::optional<ErrorRecord> error) {
    state->ended = true;
    if (error) state->error = std::move(error);
    endPromises(*state);
    const auto& asset = state->appAsset;
    if (asset != nullptr && asset->complete && asset->path) files_.remove(asset->path->path());
    coordinators_.erase(*state->identifier);
    ended_[*state->identifier] = state;
}

void SimulatedCoordination::takePlaceholderAway(SimulatedCoordinatorState& state) {
    if (state.placeholderShown) registry_.hidePlaceholder(*state.identifier);
    state.placeholderShown = false;
}

// Reports.

SimulatedCoordination::Listeners SimulatedCoordination::listeners(
    const SimulatedCoordinatorState& state) {
    if (auto observer = state.observer.lock()) return {{std::move(observer), nullptr}};
    return delegates(state.creator);
}

SimulatedCoordination::Listeners SimulatedCoordination::delegates(CoordinationClient client) {
    std::erase_if(registrations_, [](const auto& each) { return each.expired(); });
    Listeners result;
    for (const auto& each : registrations_) {
        const std::shared_ptr<Registration> registration = each.lock();
        if (registration == nullptr || registration->clients.count(client) == 0) continue;
        if (auto delegate = registration->delegate.lock()) {
            result.push_back({std::move(delegate), registration});
        }
    }
    return result;
}

void SimulatedCoordination::report(const State& state, std::string_view method,
                                   const std::string& arguments, const Call& call) {
    const std::string identifier = state->identifier.value_or("(null)");
    for (const Listener& listener : listeners(*state)) {
        const RecordedCall recorded(recorder_, kCoordinatorObserver, method,
                                    identifier + arguments);
        if (listener.hears()) call(*listener.observer, handle(state));
    }
}

void SimulatedCoordination::reportPlaceholder(const State& state) {
    report(state, "coordinatorDidInstallPlaceholder", {}, [](auto& observer, const auto& which) {
        observer.coordinatorDidInstallPlaceholder(which);
    });
}

void SimulatedCoordination::reportCompletion(const State& state) {
    report(state, "coordinatorDidCompleteSuccessfully", {}, [](auto& observer, const auto& which) {
        observer.coordinatorDidCompleteSuccessfully(which);
    });
}

void SimulatedCoordination::reportCancel(const State& state, const ErrorRecord& reason,
                                         CoordinationClient client) {
    report(state, "coordinatorCanceledWithReason",
           ", " + callText(reason) + ", " + callText(client),
           [&](auto& observer, const auto& which) {
               observer.coordinatorCanceledWithReason(which, reason, client);
           });
}

void SimulatedCoordination::reportPriority(const State& state) {
    report(state, "coordinatorShouldPrioritize", {},
           [](auto& observer, const auto& which) { observer.coordinatorShouldPrioritize(which); });
}

// The test's side.

SimulatedCoordination::State SimulatedCoordination::create(CoordinatorKind kind,
                                                           const std::string& identifier,
                                                           CoordinationClient client) {
    auto state = std::make_shared<SimulatedCoordinatorState>();
    state->kind = kind;
    state->identifier = identifier;
    state->creator = client;
    coordinators_[identifier] = state;
    tell("a coordinator", identifier, Persistence::Committed);
    return state;
}

std::shared_ptr<InstallCoordinator> SimulatedCoordination::handle(const State& state) {
    return std::make_shared<SimulatedCoordinator>(*this, state);
}

SimulatedCoordination::State SimulatedCoordination::find(const std::string& identifier) const {
    const auto found = coordinators_.find(identifier);
    return found == coordinators_.end() ? nullptr : found->second;
}

std::shared_ptr<InstallCoordinator> SimulatedCoordination::addCoordinator(
    CoordinatorKind kind, const std::string& identifier, CoordinationClient client) {
    if (find(identifier) != nullptr) {
        throw SimulationFailure("there is a coordinator of " + identifier + " already");
    }
    return handle(create(kind, identifier, client));
}

void SimulatedCoordination::cancel(const std::string& identifier, const ErrorRecord& reason,
                                   CoordinationClient client) {
    const State found = find(identifier);
    if (found == nullptr) throw SimulationFailure("there is no coordinator of " + identifier);
    cancelNow(found, reason, client);
}

const SimulatedCoordinatorState* SimulatedCoordination::state(const std::string& identifier) const {
    return find(identifier).get();
}

const SimulatedCoordinatorState* SimulatedCoordination::ended(const std::string& identifier) const {
    const auto found = ended_.find(identifier);
    return found == ended_.end() ? nullptr : found->second.get();
}

const SimulatedPromiseState* SimulatedCoordination::promise(const std::string& name) const {
    const auto found = promises_.find(name);
    return found == promises_.end() ? nullptr : found->second.get();
}

const SimulatedPlaceholderState* SimulatedCoordination::placeholder(
    const std::string& identifier) const {
    const auto found = placeholders_.find(identifier);
    return found == placeholders_.end() ? nullptr : found->second.get();
}

bool SimulatedCoordination::isComplete(const std::string& identifier) const {
    const State found = find(identifier);
    return found != nullptr && isReady(*found);
}

std::set<std::string> SimulatedCoordination::deliveredPackages() const {
    std::set<std::string> paths;
    for (const auto& [identifier, state] : coordinators_) {
        const PromiseState& asset = state->appAsset;
        if (asset != nullptr && asset->complete && asset->path) paths.insert(asset->path->path());
    }
    return paths;
}

std::vector<std::string> SimulatedCoordination::identifiers() const {
    std::vector<std::string> result;
    for (const auto& [identifier, state] : coordinators_) result.push_back(identifier);
    return result;
}

std::vector<std::string> SimulatedCoordination::appInstallObservers() const {
    std::vector<std::string> result;
    for (const auto& each : registrations_) {
        if (const auto registration = each.lock()) result.push_back(registration->serviceName);
    }
    return result;
}

void SimulatedCoordination::failNext(CoordinationStep step, const std::string& identifier,
                                     ErrorRecord error) {
    failures_[{step, identifier}].push_back(std::move(error));
}

void SimulatedCoordination::makeNoneNext(CoordinationObject object, const std::string& key) {
    ++nones_[{object, key}];
}

void SimulatedCoordination::setHas(CoordinationStep piece, const std::string& identifier,
                                   std::optional<bool> answer) {
    if (answer) {
        answers_[{piece, identifier}] = *answer;
    } else {
        answers_.erase({piece, identifier});
    }
}

void SimulatedCoordination::setError(const std::string& identifier,
                                     std::optional<ErrorRecord> error) {
    const State found = find(identifier);
    if (found == nullptr) throw SimulationFailure("there is no coordinator of " + identifier);
    found->error = std::move(error);
}

/// The coordinator that a report by hand is of.
SimulatedCoordination::State SimulatedCoordination::reported(const Identifier& identifier,
                                                             std::optional<ErrorRecord> error) {
    State state = identifier ? find(*identifier) : nullptr;
    if (state == nullptr) {
        state = std::make_shared<SimulatedCoordinatorState>();
        state->identifier = identifier;
        state->creator = SyncClientID;
        state->ended = true;
    }
    if (error) state->error = std::move(error);
    return state;
}

void SimulatedCoordination::postDidBeginFulfillment(std::uint64_t promise) {
    submit([this, promise] {
        for (const Listener& delegate : delegates(SyncClientID)) {
            const RecordedCall call(recorder_, kCoordinatorObserver,
                                    "promiseDidBeginFulfillmentWithIdentifier", promise);
            if (!delegate.hears()) continue;
            delegate.observer->promiseDidBeginFulfillmentWithIdentifier(promise);
        }
    });
}

void SimulatedCoordination::postDidInstallPlaceholder(const Identifier& identifier,
                                                      std::optional<ErrorRecord> error) {
    submit([this, state = reported(identifier, std::move(error))] { reportPlaceholder(state); });
}

void SimulatedCoordination::postDidComplete(const Identifier& identifier,
                                            std::optional<ErrorRecord> error) {
    submit([this, state = reported(identifier, std::move(error))] { reportCompletion(state); });
}

void SimulatedCoordination::postCanceled(const Identifier& identifier, const ErrorRecord& reason,
                                         CoordinationClient client) {
    submit([this, state = reported(identifier, std::nullopt), reason, client] {
        reportCancel(state, reason, client);
    });
}

void SimulatedCoordination::postShouldPrioritize(const Identifier& identifier) {
    submit([this, state = reported(identifier, std::nullopt)] { reportPriority(state); });
}

}  // namespace appsync
