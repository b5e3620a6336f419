#include "host/watch/SessionWatch.h"

#include <chrono>
#include <utility>

#include "device/Device.h"
#include "device/values/DeviceError.h"
#include "host/plan/TransferError.h"
#include "host/watch/SessionFacts.h"
#include "host/watch/SyncDaemon.h"
#include "host/watch/SyncEvents.h"
#include "host/watch/WatchedCoordination.h"
#include "platform/Platform.h"
#include "platform/PropertyList.h"

namespace appsync {
namespace {

constexpr std::chrono::milliseconds kPollInterval{100};
// Denials are looked for in the device's database, so less often.
constexpr int kPollsForDenials = 2;
constexpr std::chrono::seconds kUsualRetryInterval{30};

std::string identifierOf(const PropertyList& options) {
    const std::string* identifier = options.findString(BundleIdentifierKey);
    return identifier != nullptr ? *identifier : std::string();
}

// Hands every call on, and tells the watch of those that change something.
class WatchedRegistry : public AppRegistry {
  public:
    WatchedRegistry(AppRegistry& registry, SessionWatch& watch)
        : registry_(registry), watch_(watch) {}

    std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                               Placeholders placeholders) override {
        return registry_.proxyForIdentifier(identifier, placeholders);
    }
    bool isApplicationInstalled(const std::string& identifier) override {
        return registry_.isApplicationInstalled(identifier);
    }
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        registry_.enumerateBundles(type, callback);
    }
    std::shared_ptr<InstallProgressRecord> installProgress(const AppProxy& proxy,
                                                           std::uint64_t phase) override {
        return registry_.installProgress(proxy, phase);
    }
    void finishInstallPhase(InstallProgressRecord& record) override {
        registry_.finishInstallPhase(record);
    }
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        const std::string identifier = identifierOf(options);
        watch_.installBegins(identifier);
        Status status = registry_.installPackage(package, options);
        watch_.installEnded(identifier, status);
        return status;
    }
    Status installPlaceholderBundle(const FileURL& directory,
                                    const PropertyList& options) override {
        watch_.placeholderAsked();
        Status status = registry_.installPlaceholderBundle(directory, options);
        if (!status) watch_.placeholderRefused(identifierOf(options), status.error());
        return status;
    }
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override {
        Status status = registry_.uninstallApplication(identifier, options);
        watch_.uninstallEnded(identifier, status);
        return status;
    }
    void addObserver(std::weak_ptr<AppRegistryObserver> observer) override {
        registry_.addObserver(std::move(observer));
    }
    void removeObserver(const AppRegistryObserver* observer) override {
        registry_.removeObserver(observer);
    }

  private:
    AppRegistry& registry_;
    SessionWatch& watch_;
};

class WatchedHomeScreen : public HomeScreenService {
  public:
    WatchedHomeScreen(HomeScreenService& homeScreen, SessionWatch& watch)
        : homeScreen_(homeScreen), watch_(watch) {}

    std::shared_ptr<HomeScreenConnection> blockableConnection() override {
        return homeScreen_.blockableConnection();
    }
    TerminationAssertionResult takeTerminationAssertion(const std::string& identifier,
                                                        std::uint64_t reason) override {
        TerminationAssertionResult result =
            homeScreen_.takeTerminationAssertion(identifier, reason);
        if (result.outcome == TerminationAssertionResult::kDenied) {
            watch_.terminationDenied(identifier);
        }
        return result;
    }

  private:
    HomeScreenService& homeScreen_;
    SessionWatch& watch_;
};

class WatchedPolicy : public DevicePolicyService {
  public:
    WatchedPolicy(DevicePolicyService& policy, SessionFacts& facts)
        : policy_(policy), facts_(facts) {}

    PolicyAnswer effectiveValue(PolicyFeature feature) override {
        const PolicyAnswer answer = policy_.effectiveValue(feature);
        facts_.policyAnswered(feature, answer);
        return answer;
    }

  private:
    DevicePolicyService& policy_;
    SessionFacts& facts_;
};

}  // namespace

SessionWatch::SessionWatch(Device& device, const Platform& platform, SyncEvents& events,
                           SessionFacts& facts)
    : device_(device),
      events_(events),
      facts_(facts),
      registry_(std::make_unique<WatchedRegistry>(platform.registry, *this)),
      homeScreen_(std::make_unique<WatchedHomeScreen>(platform.homeScreen, *this)),
      policy_(std::make_unique<WatchedPolicy>(platform.policy, facts)),
      gate_(std::make_shared<CallGate>()),
      coordination_(watchCoordination(platform.coordination, *this, gate_)),
      poller_([this] { poll(); }) {}

void SessionWatch::closeCoordination() { gate_->close(); }

SessionWatch::~SessionWatch() {
    closeCoordination();
    {
        const std::lock_guard guard(mutex_);
        isOver_ = true;
    }
    ended_.notify_all();
    poller_.join();
}

void SessionWatch::setSize(const std::string& identifier, std::uint64_t bytes) {
    const std::lock_guard guard(mutex_);
    sizes_[identifier] = bytes;
}

std::uint64_t SessionWatch::sizeOf(const std::string& identifier) const {
    const std::lock_guard guard(mutex_);
    const auto found = sizes_.find(identifier);
    return found != sizes_.end() ? found->second : 0;
}

void SessionWatch::limitWait(std::chrono::milliseconds longest, std::function<void()> leave) {
    leave_ = std::move(leave);
    waitLimit_.set(longest);
}

void SessionWatch::placeholderAsked() const {
    if (asking_) asking_();
}

void SessionWatch::placeholderRefused(const std::string& identifier, const ErrorRecord& error) {
    facts_.failed(identifier, error.description());
}

void SessionWatch::terminationDenied(const std::string& identifier) {
    const Result<ApplicationStatus> status = device_.status(identifier);
    const bool isKnown = status && status->denial;
    const auto nextTry =
        isKnown ? status->denial->nextTry : std::chrono::system_clock::now() + kUsualRetryInterval;
    reportWaiting(identifier, nextTry);
}

void SessionWatch::reportWaiting(const std::string& identifier,
                                 std::chrono::system_clock::time_point nextTry) {
    waitLimit_.waits(identifier);
    events_.report({SyncEventKind::Waiting, SyncPhase::Install, identifier, 0, sizeOf(identifier),
                    SyncState::Waiting, nextTry, identifier + " is running"});
}

void SessionWatch::installBegins(const std::string& identifier) {
    const std::uint64_t size = sizeOf(identifier);
    reportBegin(identifier, size);
    waitLimit_.goesOn(identifier);
    const std::lock_guard guard(mutex_);
    installing_[identifier] = size;
    concluded_.erase(identifier);
}

void SessionWatch::reportBegin(const std::string& identifier, std::uint64_t size) {
    events_.report({SyncEventKind::Started, SyncPhase::Install, identifier, 0, size,
                    SyncState::Active, std::nullopt, ""});
}

void SessionWatch::installEnded(const std::string& identifier, const Status& status) {
    const std::uint64_t size = sizeOf(identifier);
    const std::string cause = status ? "" : causeOf(identifier, status.error());
    bool hasBegun = false;
    {
        const std::lock_guard guard(mutex_);
        hasBegun = installing_.erase(identifier) > 0;
        delivered_.erase(identifier);
        concluded_.insert(identifier);
    }
    waitLimit_.hasEnded(identifier);
    if (!hasBegun) reportBegin(identifier, size);
    if (status) {
        facts_.installed(identifier);
    } else {
        facts_.failed(identifier, cause);
    }
    events_.report({SyncEventKind::Ended, SyncPhase::Install, identifier, status ? size : 0, size,
                    status ? SyncState::Finished : SyncState::Failed, std::nullopt, cause});
}

// The device names the place where it had the package, which goes with the failure.
std::string SessionWatch::causeOf(const std::string& identifier, const ErrorRecord& error) const {
    std::string text = error.description();
    const std::lock_guard guard(mutex_);
    const auto found = sent_.find(identifier);
    if (found == sent_.end()) return text;
    const auto& [received, file] = found->second;
    const std::size_t position = text.find(received);
    return position == std::string::npos ? text : text.replace(position, received.size(), file);
}

void SessionWatch::uninstallEnded(const std::string& identifier, const Status& status) {
    if (!removing_) return;
    // What is not there is as it was to be: nothing has happened.
    if (!status && isRegistryError(status.error(), RegistryErrorCode::NothingInstalled)) return;
    if (status) {
        facts_.removed(identifier);
    } else {
        facts_.failed(identifier, status.error().description());
    }
    events_.report({SyncEventKind::Ended, SyncPhase::Remove, identifier, status ? 1U : 0U, 1,
                    status ? SyncState::Finished : SyncState::Failed, std::nullopt,
                    status ? "" : status.error().description()});
}

void SessionWatch::packageSent(const std::string& identifier, const std::string& received,
                               const std::string& file) {
    waitLimit_.isUnderWay(identifier);
    const std::lock_guard guard(mutex_);
    sent_[identifier] = {received, file};
}

void SessionWatch::packageDelivered(const std::string& identifier) {
    {
        const std::lock_guard guard(mutex_);
        delivered_.try_emplace(identifier);
    }
    installBegins(identifier);
}

void SessionWatch::takeUpDelivered(const std::string& identifier) {
    const std::uint64_t size = sizeOf(identifier);
    const std::lock_guard guard(mutex_);
    if (concluded_.contains(identifier)) return;  // meanwhile
    if (!delivered_.try_emplace(identifier).second) return;
    installing_[identifier] = size;
    waitLimit_.isUnderWay(identifier);
    reportBegin(identifier, size);  // before anything else is told of it
}

void SessionWatch::coordinatorRefused(const std::string& identifier, const ErrorRecord& error) {
    facts_.failed(identifier, error.description());
}

void SessionWatch::coordinatorIsOf(const std::string& identifier, CoordinationClient client) {
    facts_.heldByClient(identifier, client);
}

void SessionWatch::installCancelled(const std::string& identifier, const ErrorRecord& reason,
                                    CoordinationClient client) {
    // The plug-in's own cancels follow from something that is known here already.
    if (client != SyncClientID) facts_.failed(identifier, reason.description());
    bool wasDelivered = false;
    {
        const std::lock_guard guard(mutex_);
        wasDelivered = delivered_.contains(identifier);
    }
    if (wasDelivered) installEnded(identifier, reason);
}

void SessionWatch::settleDelivered() {
    for (const std::string& identifier : deliveredIdentifiers()) {
        installEnded(identifier, ErrorRecord::make(kTransferErrorDomain, kTransferNotTaken,
                                                   "the device did not take its package: appsync "
                                                   "log tells why"));
    }
}

std::vector<std::string> SessionWatch::deliveredIdentifiers() const {
    const std::lock_guard guard(mutex_);
    std::vector<std::string> identifiers;
    identifiers.reserve(delivered_.size());
    for (const auto& [identifier, told] : delivered_) identifiers.push_back(identifier);
    return identifiers;
}

void SessionWatch::uninstallBegins() {
    const std::lock_guard guard(mutex_);
    ++uninstalls_;
}

void SessionWatch::coordinatedUninstallEnded(const std::string& identifier, const Status& status) {
    uninstallEnded(identifier, status);
    {
        const std::lock_guard guard(mutex_);
        --uninstalls_;
    }
    ended_.notify_all();
}

bool SessionWatch::waitForUninstalls(const std::atomic<bool>& stopRequested) {
    std::unique_lock lock(mutex_);
    while (!stopRequested &&
           !ended_.wait_for(lock, kPollInterval, [this] { return uninstalls_ == 0; })) {
    }
    return uninstalls_ == 0;
}

void SessionWatch::poll() {
    int polls = 0;
    std::unique_lock lock(mutex_);
    while (!ended_.wait_for(lock, kPollInterval, [this] { return isOver_; })) {
        lock.unlock();
        reportProgress();
        if (++polls % kPollsForDenials == 0) reportDenials();
        checkWait();
        lock.lock();
    }
}

void SessionWatch::checkWait() {
    const std::vector<std::string> waiting = waitLimit_.givenUpAt(std::chrono::steady_clock::now());
    if (waiting.empty()) return;
    for (const std::string& identifier : waiting) giveUpWaiting(identifier);
    isWaitOver_ = true;
    if (!isCoordinated_) leave_();
}

// It may have ended meanwhile; on the direct path the next try comes when it comes.
void SessionWatch::giveUpWaiting(const std::string& identifier) {
    const Result<ApplicationStatus> status = device_.status(identifier);
    const bool hasEnded = status && !status->isRunning;
    const std::string cause = identifier +
                              (hasEnded ? " was running: " : " is running: quit it, and ") +
                              "run the same command again to bring it in step";
    facts_.failed(identifier, cause);
    const std::uint64_t size = sizeOf(identifier);
    events_.report({SyncEventKind::Ended, SyncPhase::Install, identifier, 0, size,
                    SyncState::Failed, std::nullopt, cause});
}

void SessionWatch::reportDenials() {
    for (const std::string& identifier : deliveredIdentifiers()) reportDenial(identifier);
}

void SessionWatch::reportDenial(const std::string& identifier) {
    const Result<ApplicationStatus> status = device_.status(identifier);
    if (!status) return;
    if (!status->denial) return waitLimit_.goesOn(identifier);
    {
        const std::lock_guard guard(mutex_);
        const auto found = delivered_.find(identifier);
        if (found == delivered_.end() || found->second.toldTry == status->denial->nextTry) return;
        found->second.toldTry = status->denial->nextTry;
    }
    reportWaiting(identifier, status->denial->nextTry);
}

void SessionWatch::reportProgress() {
    std::map<std::string, std::uint64_t> installing;
    {
        const std::lock_guard guard(mutex_);
        installing = installing_;
    }
    for (const auto& [identifier, size] : installing) {
        const std::optional<InstallProgress> progress = device_.installProgress(identifier);
        if (!progress) continue;
        const auto done =
            static_cast<std::uint64_t>(progress->unpacked * static_cast<double>(size));
        events_.report({SyncEventKind::Progress, SyncPhase::Install, identifier, done, size,
                        SyncState::Active, std::nullopt, ""});
    }
}

}  // namespace appsync
