#include "simulation/services/SimulatedAppRegistry.h"

#include <algorithm>
#include <cerrno>
#include <utility>

#include "platform/LegalIdentifier.h"
#include "platform/PropertyListSerialization.h"
#include "simulation/files/SimulatedFileSystem.h"
#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {

constexpr std::string_view kAppRegistry = "AppRegistry";
constexpr std::string_view kRegistryObserver = "AppRegistryObserver";
constexpr std::int64_t kRegistryRefused = 1;
constexpr std::int64_t kNotFound = 2;
constexpr std::int64_t kPackageRefused = 1;
constexpr const char* kPlaceholders = "/var/containers/Bundle/Placeholder";
constexpr const char* kApplications = "/var/containers/Bundle/Application";

ErrorRecord registryRefused(const std::string& why) {
    return ErrorRecord::make(kRegistryErrorDomain, kRegistryRefused, why);
}

ErrorRecord packageRefused(const std::string& why) {
    return ErrorRecord::make(kInstallerErrorDomain, kPackageRefused, why);
}

bool isDemoted(std::uint64_t installType) {
    return installType == kInstallTypeDowngrade || installType == kInstallTypeIntentionalDowngrade;
}

/// The identifier of install options, after they were checked.
Result<std::string> checkedIdentifier(const PropertyList& options, std::string_view packageType) {
    const std::string* type = options.findString(PackageTypeKey);
    if (type == nullptr || *type != packageType) {
        return registryRefused("the package type is not " + std::string(packageType));
    }
    const std::string* identifier = options.findString(BundleIdentifierKey);
    if (identifier == nullptr) return registryRefused("the options name no bundle identifier");
    if (!isLegalIdentifier(*identifier))
        return registryRefused("'" + *identifier + "' is no identifier");
    return *identifier;
}

/// The values once the phase that they are in has ended.
SimulatedProgressRecord::Values afterPhase(SimulatedProgressRecord::Values values) {
    if (values.phase == kInstallPhaseInstalling) {
        values.state = kInstallStateFinished;
    } else if (values.phase == kInstallPhaseInstallingPlaceholder) {
        values.phase = kInstallPhaseLoading;
    } else {
        values.phase = kInstallPhaseInstalling;
    }
    return values;
}

std::vector<std::string> identifiersOf(const std::vector<AppProxy>& proxies) {
    std::vector<std::string> identifiers;
    identifiers.reserve(proxies.size());
    for (const AppProxy& proxy : proxies) identifiers.push_back(proxy.applicationIdentifier);
    return identifiers;
}

AppProxy proxyWithUsualPaths(const std::string& identifier, bool placeholder) {
    AppProxy proxy;
    proxy.applicationIdentifier = identifier;
    proxy.bundleContainerPath = std::string("/var/containers/Bundle/") +
                                (placeholder ? "Placeholder/" : "Application/") + identifier;
    proxy.bundlePath = proxy.bundleContainerPath + "/" + identifier + ".app";
    proxy.state.installed = !placeholder;
    proxy.state.placeholder = placeholder;
    return proxy;
}

}  // namespace

/// An observer and what it has not heard yet.
struct SimulatedAppRegistry::Subscription {
    std::weak_ptr<AppRegistryObserver> observer;
    const AppRegistryObserver* address = nullptr;
    std::deque<std::vector<AppProxy>> cancels;
    using Lists = std::pair<std::vector<std::string>, std::vector<std::string>>;
    std::optional<Lists> heard;  // the identifiers of the last report
    bool reportDue = true;
    bool delivering = false;
    bool removed = false;
};

SimulatedAppRegistry::SimulatedAppRegistry(Recorder& recorder, SimulatedFileSystem& files,
                                           PropertyListSerialization& codec)
    : recorder_(recorder), files_(files), codec_(codec) {}

SimulatedAppRegistry::~SimulatedAppRegistry() = default;

// Look-ups.

std::optional<AppProxy> SimulatedAppRegistry::proxyForIdentifier(const std::string& identifier,
                                                                 Placeholders placeholders) {
    const bool included = placeholders == Placeholders::Included;
    RecordedCall call(recorder_, kAppRegistry, "proxyForIdentifier", identifier,
                      included ? "placeholders included" : "placeholders excluded");
    std::optional<AppProxy> proxy = included ? placeholder(identifier) : std::nullopt;
    if (!proxy) proxy = installed(identifier);
    return call.result(std::move(proxy));
}

bool SimulatedAppRegistry::isApplicationInstalled(const std::string& identifier) {
    RecordedCall call(recorder_, kAppRegistry, "isApplicationInstalled", identifier);
    return call.result(find(identifier) != nullptr);
}

void SimulatedAppRegistry::enumerateBundles(BundleType type, const ProxyCallback& callback) {
    const RecordedCall call(recorder_, kAppRegistry, "enumerateBundles",
                            static_cast<unsigned>(type));
    bool stop = false;
    for (const AppProxy& proxy : bundles(type)) {
        callback(proxy, stop);
        if (stop) return;
    }
}

std::vector<AppProxy> SimulatedAppRegistry::bundles(BundleType type) const {
    if (type != kEveryBundle && type != kUserBundles && type != kSystemBundles) {
        throw SimulationFailure("the registry knows no bundle type " + std::to_string(type));
    }
    std::vector<AppProxy> result;
    const auto collect = [&](const std::optional<AppProxy>& proxy) {
        if (!proxy) return;
        const bool system = proxy->applicationType == kApplicationTypeSystem;
        if (type == kEveryBundle || system == (type == kSystemBundles)) result.push_back(*proxy);
    };
    for (const auto& [identifier, application] : applications_) {
        collect(application.installed);
        collect(application.placeholder);
    }
    return result;
}

std::shared_ptr<InstallProgressRecord> SimulatedAppRegistry::installProgress(const AppProxy& proxy,
                                                                             std::uint64_t phase) {
    RecordedCall call(recorder_, kAppRegistry, "installProgress", proxy, phase);
    const Application* application = find(proxy.applicationIdentifier);
    const bool found = application != nullptr && application->progress != nullptr;
    std::shared_ptr<SimulatedProgressRecord> record = found ? application->progress : nullptr;
    const std::string text = found ? record->text() : "(null)";
    return call.result(std::move(record), text);
}

void SimulatedAppRegistry::finishInstallPhase(InstallProgressRecord& record) {
    auto* simulated = dynamic_cast<SimulatedProgressRecord*>(&record);
    if (simulated == nullptr) throw SimulationFailure("the record is of another registry");
    const RecordedCall call(recorder_, kAppRegistry, "finishInstallPhase", simulated->identifier());
    if (simulated->isOver()) return;
    simulated->setValues(afterPhase(simulated->values()));
    recorder_.recordsChanged("the progress of " + simulated->identifier(), Persistence::Soon);
    reportChange();
}

// Changes.

Status SimulatedAppRegistry::installPackage(const FileURL& package, const PropertyList& options) {
    RecordedCall call(recorder_, kAppRegistry, "installPackage", package, options);
    return call.result(installPackageNow(package, options));
}

Status SimulatedAppRegistry::installPackageNow(const FileURL& package,
                                               const PropertyList& options) {
    const Result<std::string> identifier = checkedIdentifier(options, PackageTypeCustomer);
    if (!identifier) return identifier.error();
    Status status = install(*identifier, package.path());
    if (status) {
        recorder_.recordsChanged("the install of " + *identifier, Persistence::OnDisk);
    }
    return status;
}

Status SimulatedAppRegistry::install(const std::string& identifier, const std::string& path) {
    if (installDuration_ > SimulatedTime::zero()) {
        recorder_.scheduler().waitFor("the install of " + identifier, installDuration_,
                                      [] { return false; });
    }
    Status status = takeFailure(installFailures_, identifier);
    if (status) status = checkPackage(identifier, path);
    if (status) {
        commitPackage(identifier, path);
    } else {
        markFailed(identifier);
    }
    return status;
}

/// A package whose bytes are a property list says itself what it holds.
Status SimulatedAppRegistry::checkPackage(const std::string& identifier, const std::string& path) {
    const std::optional<Bytes> bytes = files_.contents(path);
    if (!bytes) return ErrorRecord::make(kPosixErrorDomain, ENOENT, "no package at '" + path + "'");
    const std::optional<SimulatedProgressRecord::Values> values = progress(identifier);
    if (values && values->state == kInstallStateCanceled) {
        return packageRefused("the install of " + identifier + " was cancelled");
    }
    const Result<PropertyList> info = codec_.parse(*bytes);
    if (!info) return {};
    const std::string* found = info->findString(BundleIdentifierKey);
    if (found == nullptr || *found != identifier) {
        return packageRefused("the package is not that of " + identifier);
    }
    const std::string* version = info->findString(BundleVersionKey);
    const std::string* name = info->findString(BundleDisplayNameKey);
    setPackage(identifier, version != nullptr ? *version : "1.0",
               name != nullptr ? *name : identifier);
    return {};
}

void SimulatedAppRegistry::markFailed(const std::string& identifier) {
    Application* application = find(identifier);
    if (application == nullptr || application->progress == nullptr) return;
    SimulatedProgressRecord::Values values = application->progress->values();
    if (values.state == kInstallStateCanceled) return;
    values.state = kInstallStateFailed;
    application->progress->setValues(values);
    reportChange();
}

void SimulatedAppRegistry::commitPackage(const std::string& identifier, const std::string& path) {
    Application& application = applications_[identifier];
    AppProxy proxy = proxyWithUsualPaths(identifier, false);
    const std::optional<AppProxy> before =
        application.placeholder ? application.placeholder : application.installed;
    if (before) {
        proxy.installType = before->installType;
        proxy.applicationType = before->applicationType;
    }
    proxy.bundleVersion = "1.0";
    proxy.displayName = before ? before->displayName : identifier;
    if (const auto package = packages_.find(identifier); package != packages_.end()) {
        proxy.bundleVersion = package->second.version;
        proxy.displayName = package->second.displayName;
    }
    if (const auto bytes = files_.contents(path)) proxy.staticDiskUsage = bytes->size();
    files_.addDirectory(proxy.bundlePath);
    files_.sync();
    application.installed = std::move(proxy);
    removePlaceholder(application, kInstallStateFinished);
}

Status SimulatedAppRegistry::installPlaceholderBundle(const FileURL& directory,
                                                      const PropertyList& options) {
    RecordedCall call(recorder_, kAppRegistry, "installPlaceholderBundle", directory, options);
    return call.result(installPlaceholderNow(directory, options));
}

Status SimulatedAppRegistry::installPlaceholderNow(const FileURL& directory,
                                                   const PropertyList& options) {
    const Result<std::string> identifier = checkedIdentifier(options, PackageTypePlaceholder);
    if (!identifier) return identifier.error();
    const PropertyList* type = options.find(InstallTypeKey);
    const std::optional<std::uint64_t> installType =
        type != nullptr ? type->asUnsigned() : std::nullopt;
    if (!installType) return registryRefused("the options name no install type");
    if (Status failure = takeFailure(placeholderFailures_, *identifier); !failure) return failure;
    AppProxy proxy = proxyWithUsualPaths(*identifier, true);
    proxy.installType = *installType;
    if (Status status = describeFromBundle(directory.path(), proxy); !status) return status;
    files_.copyTree(directory.path(), proxy.bundlePath);
    const PropertyList* metadata = options.find(StoreMetadataKey);
    if (const Bytes* bytes = metadata != nullptr ? metadata->asData() : nullptr) {
        files_.addFile(proxy.bundleContainerPath + "/VessikMetadata.plist", *bytes);
    }
    Application& application = applications_[*identifier];
    if (application.installed) proxy.applicationType = application.installed->applicationType;
    application.placeholderOptions = options;
    const Persistence persistence = beginPlaceholder(*identifier, std::move(proxy));
    recorder_.recordsChanged("the placeholder of " + *identifier, persistence);
    return {};
}

/// Its files are there. Those of a sync's new one are not waited for: the next sync makes it again.
Persistence SimulatedAppRegistry::beginPlaceholder(const std::string& identifier, AppProxy proxy) {
    Application& application = applications_[identifier];
    application.isUnsynced = proxy.installType == kInstallTypeSync && !application.placeholder;
    if (!application.isUnsynced) files_.sync();
    application.placeholder = std::move(proxy);
    endProgress(application, kInstallStateCanceled);  // that of a placeholder before this one
    if (!isDemoted(application.placeholder->installType)) startProgress(identifier, application);
    return application.isUnsynced ? Persistence::Committed : Persistence::OnDisk;
}

/// Takes what the Info.plist in the directory says; refuses one that is not of this identifier.
Status SimulatedAppRegistry::describeFromBundle(const std::string& directory,
                                                AppProxy& proxy) const {
    const std::string path = directory + "/Info.plist";
    const std::optional<Bytes> bytes = files_.contents(path);
    if (!bytes) return registryRefused("there is no '" + path + "'");
    const Result<PropertyList> info = codec_.parse(*bytes);
    if (!info) return registryRefused("'" + path + "' cannot be read");
    const std::string* identifier = info->findString(BundleIdentifierKey);
    if (identifier == nullptr || *identifier != proxy.applicationIdentifier) {
        return registryRefused("'" + path + "' is not that of " + proxy.applicationIdentifier);
    }
    if (const std::string* version = info->findString(BundleVersionKey)) {
        proxy.bundleVersion = *version;
    }
    if (const std::string* name = info->findString(BundleDisplayNameKey)) {
        proxy.displayName = *name;
    }
    return {};
}

Status SimulatedAppRegistry::uninstallApplication(const std::string& identifier,
                                                  const PropertyList& options) {
    RecordedCall call(recorder_, kAppRegistry, "uninstallApplication", identifier, options);
    return call.result(uninstallNow(identifier, options));
}

Status SimulatedAppRegistry::uninstallNow(const std::string& identifier,
                                          const PropertyList& options) {
    if (!isLegalIdentifier(identifier))
        return registryRefused("'" + identifier + "' is no identifier");
    if (!options.isNull() && !options.isMap()) return registryRefused("the options are no map");
    if (Status failure = takeFailure(uninstallFailures_, identifier); !failure) return failure;
    const PropertyList* only = options.find(UninstallPlaceholderOnlyKey);
    const bool placeholderOnly = only != nullptr && only->booleanConversion().value_or(false);
    Application* application = find(identifier);
    const bool nothing = application == nullptr || (placeholderOnly && !application->placeholder);
    if (nothing) {
        return ErrorRecord::make(kRegistryErrorDomain, kNotFound,
                                 "there is no '" + identifier + "' to remove");
    }
    if (application->placeholder) {
        removePlaceholder(*application, kInstallStateCanceled);
    } else {
        files_.remove(application->installed->bundleContainerPath);
        application->installed.reset();
        endProgress(*application, kInstallStateCanceled);
    }
    dropIfEmpty(identifier);
    recorder_.recordsChanged("the removal of " + identifier, Persistence::OnDisk);
    return {};
}

void SimulatedAppRegistry::removePlaceholder(Application& application, std::uint64_t finalState) {
    if (application.placeholder) {
        files_.remove(application.placeholder->bundleContainerPath);
        application.placeholder.reset();
    }
    endProgress(application, finalState);
}

void SimulatedAppRegistry::startProgress(const std::string& identifier, Application& application) {
    if (application.progress != nullptr) return;
    application.progress = std::make_shared<SimulatedProgressRecord>(recorder_, identifier,
                                                                     [this] { reportChange(); });
    application.installNumber = ++installsBegun_;
    installs_.emplace(application.installNumber, identifier);
    reportChange();
}

void SimulatedAppRegistry::endProgress(Application& application, std::uint64_t state) {
    if (application.progress == nullptr) return;
    application.progress->end(state);
    installs_.erase(application.installNumber);
    application.progress.reset();
    reportChange();
}

void SimulatedAppRegistry::dropIfEmpty(const std::string& identifier) {
    const auto found = applications_.find(identifier);
    if (found == applications_.end()) return;
    if (!found->second.installed && !found->second.placeholder) applications_.erase(found);
}

// Observers.

void SimulatedAppRegistry::addObserver(std::weak_ptr<AppRegistryObserver> observer) {
    const RecordedCall call(recorder_, kAppRegistry, "addObserver");
    auto subscription = std::make_shared<Subscription>();
    subscription->address = observer.lock().get();
    subscription->observer = std::move(observer);
    if (subscription->address == nullptr) throw SimulationFailure("the observer has gone already");
    subscriptions_.push_back(subscription);
    enqueue(subscription);
}

void SimulatedAppRegistry::removeObserver(const AppRegistryObserver* observer) {
    const RecordedCall call(recorder_, kAppRegistry, "removeObserver");
    const auto found = std::find_if(subscriptions_.begin(), subscriptions_.end(),
                                    [&](const auto& each) { return each->address == observer; });
    if (found == subscriptions_.end()) return;
    (*found)->removed = true;
    subscriptions_.erase(found);
}

void SimulatedAppRegistry::enqueue(const std::shared_ptr<Subscription>& subscription) {
    if (subscription->delivering) return;
    subscription->delivering = true;
    recorder_.scheduler().spawn("registry", [this, subscription] { deliver(subscription); });
}

void SimulatedAppRegistry::deliver(const std::shared_ptr<Subscription>& subscription) {
    while (!subscription->removed) {
        const std::shared_ptr<AppRegistryObserver> observer = subscription->observer.lock();
        if (observer == nullptr) break;
        if (subscription->reportDue && !reportsWithheld_) {
            subscription->reportDue = false;
            deliverReport(*subscription, *observer);
        } else if (!subscription->cancels.empty()) {
            deliverCancel(*subscription, *observer);
        } else {
            break;
        }
    }
    subscription->delivering = false;
}

void SimulatedAppRegistry::deliverReport(Subscription& subscription,
                                         AppRegistryObserver& observer) const {
    const Report now = report();
    Subscription::Lists lists{identifiersOf(now.prioritized), identifiersOf(now.paused)};
    if (subscription.heard == lists) return;
    subscription.heard = std::move(lists);
    const RecordedCall call(recorder_, kRegistryObserver, "applicationInstallsArePrioritized",
                            now.prioritized, now.paused);
    if (subscription.removed) return;
    observer.applicationInstallsArePrioritized(now.prioritized, now.paused);
}

void SimulatedAppRegistry::deliverCancel(Subscription& subscription,
                                         AppRegistryObserver& observer) const {
    const std::vector<AppProxy> cancelled = std::move(subscription.cancels.front());
    subscription.cancels.pop_front();
    const RecordedCall call(recorder_, kRegistryObserver, "applicationInstallsDidCancel",
                            cancelled);
    if (subscription.removed) return;
    observer.applicationInstallsDidCancel(cancelled);
}

SimulatedAppRegistry::Report SimulatedAppRegistry::report() const {
    if (scriptedReport_) return *scriptedReport_;
    Report result;
    for (const auto& [number, identifier] : installs_) {
        const Application* application = find(identifier);
        if (application == nullptr || application->progress == nullptr) continue;
        const std::uint64_t state = application->progress->values().state;
        if (state == kInstallStatePaused) {
            result.paused.push_back(preferred(*application));
        } else if (state < kInstallStateCanceled) {
            result.prioritized.push_back(preferred(*application));
        }
    }
    return result;
}

void SimulatedAppRegistry::reportChange() {
    for (const std::shared_ptr<Subscription>& subscription : subscriptions_) {
        subscription->reportDue = true;
        enqueue(subscription);
    }
}

void SimulatedAppRegistry::reportCancel(const std::vector<AppProxy>& cancelled) {
    for (const std::shared_ptr<Subscription>& subscription : subscriptions_) {
        subscription->cancels.push_back(cancelled);
        enqueue(subscription);
    }
}

void SimulatedAppRegistry::setReport(std::vector<AppProxy> prioritized,
                                     std::vector<AppProxy> paused) {
    scriptedReport_ = Report{std::move(prioritized), std::move(paused)};
    reportChange();
}

void SimulatedAppRegistry::withholdReports(bool withheld) {
    reportsWithheld_ = withheld;
    if (!withheld) reportChange();
}

void SimulatedAppRegistry::cancelInstalls(const std::vector<std::string>& identifiers) {
    std::vector<AppProxy> cancelled;
    for (const std::string& identifier : identifiers) {
        Application* application = find(identifier);
        if (application == nullptr || application->progress == nullptr) {
            throw SimulationFailure("there is no install of " + identifier + " to cancel");
        }
        SimulatedProgressRecord::Values values = application->progress->values();
        values.state = kInstallStateCanceled;
        application->progress->setValues(values);
        cancelled.push_back(preferred(*application));
    }
    reportChange();
    reportCancel(cancelled);
}

// Crashes.

SimulatedAppRegistry::Records SimulatedAppRegistry::records() const {
    Records result{{}, packages_};
    for (const auto& [identifier, application] : applications_) {
        Record record{application.installed, application.placeholder, std::nullopt,
                      application.installNumber, application.isUnsynced};
        if (application.progress != nullptr) record.progress = application.progress->values();
        result.applications.emplace(identifier, std::move(record));
    }
    return result;
}

void SimulatedAppRegistry::reopen(const Records& records, bool powerWasLost) {
    packages_ = records.packages;
    for (const auto& [identifier, record] : records.applications) {
        Application& application = applications_[identifier];
        if (hasContainer(record.installed)) application.installed = record.installed;
        const bool isLost = record.isUnsynced && powerWasLost;
        if (!isLost && hasContainer(record.placeholder)) {
            application.placeholder = record.placeholder;
            application.isUnsynced = record.isUnsynced;
        }
        if (application.placeholder && record.progress) {
            startProgress(identifier, application);
            SimulatedProgressRecord::Values values = *record.progress;
            if (values.state == kInstallStateActive) values.state = kInstallStateWaiting;
            if (values.phase == kInstallPhaseInstalling) values.phase = kInstallPhaseLoading;
            application.progress->setValues(values);
        }
        dropIfEmpty(identifier);
    }
    removeStrayContainers();
}

bool SimulatedAppRegistry::hasContainer(const std::optional<AppProxy>& proxy) const {
    return proxy && (proxy->bundlePath.empty() || files_.exists(proxy->bundlePath));
}

void SimulatedAppRegistry::removeStrayContainers() {
    for (const char* directory : {kPlaceholders, kApplications}) {
        for (const std::string& name : files_.names(directory)) {
            const bool isHeld = directory == kPlaceholders ? placeholder(name).has_value()
                                                           : installed(name).has_value();
            if (!isHeld) files_.remove(std::string(directory) + "/" + name);
        }
    }
}

// Other services.

Result<Persistence> SimulatedAppRegistry::showPlaceholder(AppProxy proxy) {
    const std::string identifier = proxy.applicationIdentifier;
    const Status failure = takeFailure(placeholderFailures_, identifier);
    if (!failure) return failure.error();
    const AppProxy usual = proxyWithUsualPaths(identifier, true);
    proxy.bundlePath = usual.bundlePath;
    proxy.bundleContainerPath = usual.bundleContainerPath;
    proxy.state = usual.state;
    if (const auto application = installed(identifier)) {
        proxy.applicationType = application->applicationType;
    }
    files_.addDirectory(proxy.bundlePath);
    return beginPlaceholder(identifier, std::move(proxy));
}

void SimulatedAppRegistry::hidePlaceholder(const std::string& identifier) {
    Application* application = find(identifier);
    if (application == nullptr || !application->placeholder) return;
    removePlaceholder(*application, kInstallStateCanceled);
    dropIfEmpty(identifier);
}

Status SimulatedAppRegistry::uninstall(const std::string& identifier) {
    return uninstallNow(identifier, {});
}

// The test's side.

SimulatedAppRegistry::Application* SimulatedAppRegistry::find(const std::string& identifier) {
    const auto found = applications_.find(identifier);
    return found == applications_.end() ? nullptr : &found->second;
}

const SimulatedAppRegistry::Application* SimulatedAppRegistry::find(
    const std::string& identifier) const {
    const auto found = applications_.find(identifier);
    return found == applications_.end() ? nullptr : &found->second;
}

const AppProxy& SimulatedAppRegistry::preferred(const Application& application) {
    return application.placeholder ? *application.placeholder : *application.installed;
}

void SimulatedAppRegistry::addApplication(const std::string& identifier,
                                          const std::string& version) {
    AppProxy proxy = proxyWithUsualPaths(identifier, false);
    proxy.bundleVersion = version;
    proxy.displayName = identifier;
    add(std::move(proxy));
}

void SimulatedAppRegistry::addPlaceholder(const std::string& identifier, std::uint64_t installType,
                                          const std::string& version) {
    AppProxy proxy = proxyWithUsualPaths(identifier, true);
    proxy.bundleVersion = version;
    proxy.displayName = identifier;
    proxy.installType = installType;
    add(std::move(proxy));
    startProgress(identifier, applications_[identifier]);
}

void SimulatedAppRegistry::add(AppProxy proxy) {
    if (!proxy.bundlePath.empty()) files_.addDirectory(proxy.bundlePath);
    Application& application = applications_[proxy.applicationIdentifier];
    (proxy.state.placeholder ? application.placeholder : application.installed) = std::move(proxy);
}

void SimulatedAppRegistry::setPackage(const std::string& identifier, const std::string& version,
                                      const std::string& displayName) {
    packages_[identifier] = PackageContents{version, displayName};
}

void SimulatedAppRegistry::setProgress(const std::string& identifier,
                                       const SimulatedProgressRecord::Values& values) {
    Application* application = find(identifier);
    if (application == nullptr) throw SimulationFailure("there is no " + identifier);
    startProgress(identifier, *application);
    application->progress->setValues(values);
    reportChange();
}

void SimulatedAppRegistry::removeProgress(const std::string& identifier) {
    Application* application = find(identifier);
    if (application == nullptr) throw SimulationFailure("there is no " + identifier);
    endProgress(*application, kInstallStateFinished);
}

std::optional<AppProxy> SimulatedAppRegistry::installed(const std::string& identifier) const {
    const Application* application = find(identifier);
    return application == nullptr ? std::nullopt : application->installed;
}

std::optional<AppProxy> SimulatedAppRegistry::placeholder(const std::string& identifier) const {
    const Application* application = find(identifier);
    return application == nullptr ? std::nullopt : application->placeholder;
}

PropertyList SimulatedAppRegistry::placeholderOptions(const std::string& identifier) const {
    const Application* application = find(identifier);
    return application == nullptr ? PropertyList() : application->placeholderOptions;
}

std::optional<SimulatedProgressRecord::Values> SimulatedAppRegistry::progress(
    const std::string& identifier) const {
    const Application* application = find(identifier);
    if (application == nullptr || application->progress == nullptr) return std::nullopt;
    return application->progress->values();
}

std::vector<std::string> SimulatedAppRegistry::installedIdentifiers() const {
    std::vector<std::string> result;
    for (const auto& [identifier, application] : applications_) {
        if (application.installed) result.push_back(identifier);
    }
    return result;
}

std::vector<std::string> SimulatedAppRegistry::placeholderIdentifiers() const {
    std::vector<std::string> result;
    for (const auto& [identifier, application] : applications_) {
        if (application.placeholder) result.push_back(identifier);
    }
    return result;
}

void SimulatedAppRegistry::failNextInstall(const std::string& identifier, ErrorRecord error) {
    installFailures_[identifier].push_back(std::move(error));
}

void SimulatedAppRegistry::failNextPlaceholderInstall(const std::string& identifier,
                                                      ErrorRecord error) {
    placeholderFailures_[identifier].push_back(std::move(error));
}

void SimulatedAppRegistry::failNextUninstall(const std::string& identifier, ErrorRecord error) {
    uninstallFailures_[identifier].push_back(std::move(error));
}

Status SimulatedAppRegistry::takeFailure(Failures& failures, const std::string& identifier) {
    const auto found = failures.find(identifier);
    if (found == failures.end() || found->second.empty()) return {};
    ErrorRecord error = std::move(found->second.front());
    found->second.pop_front();
    return error;
}

}  // namespace appsync
