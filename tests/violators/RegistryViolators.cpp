#include <atomic>
#include <chrono>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "contract/forwarding/ForwardingAppRegistry.h"
#include "platform/FileSystem.h"
#include "platform/WorkQueues.h"
#include "tests/violators/Violator.h"

namespace appsync {
namespace {

using Placeholders = AppRegistry::Placeholders;

std::string identifierOf(const PropertyList& options) {
    const std::string* identifier = options.findString(BundleIdentifierKey);
    return identifier == nullptr ? std::string() : *identifier;
}

ErrorRecord inDomain(std::string_view domain, const ErrorRecord& error) {
    return ErrorRecord::make(domain, error.code, error.description());
}

/// A wrapper that has the rest of the platform, too.
class RegistryWithPlatform : public ForwardingAppRegistry {
  public:
    RegistryWithPlatform(AppRegistry& target, const Platform& platform)
        : ForwardingAppRegistry(target), platform_(platform) {}

  protected:
    [[nodiscard]] FileSystem& files() const { return platform_.files; }
    [[nodiscard]] WorkQueues& queues() const { return platform_.queues; }

  private:
    const Platform platform_;
};

/// A wrapper that changes every record on its way to the caller.
struct ChangingProxies : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    virtual void change(AppProxy& proxy) = 0;
    std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                               Placeholders placeholders) override {
        auto proxy = target().proxyForIdentifier(identifier, placeholders);
        if (proxy) change(*proxy);
        return proxy;
    }
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        target().enumerateBundles(type, [&](const AppProxy& proxy, bool& stop) {
            AppProxy changed = proxy;
            change(changed);
            callback(changed, stop);
        });
    }
};

// Look-ups.

struct PlaceholdersAreNeverExcluded : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                               Placeholders) override {
        return target().proxyForIdentifier(identifier, Placeholders::Included);
    }
};
struct ApplicationsArePreferred : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                               Placeholders placeholders) override {
        auto proxy = target().proxyForIdentifier(identifier, Placeholders::Excluded);
        return proxy ? proxy : target().proxyForIdentifier(identifier, placeholders);
    }
};
struct PlaceholdersAreNothing : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    bool isApplicationInstalled(const std::string& identifier) override {
        return target().proxyForIdentifier(identifier, Placeholders::Excluded).has_value();
    }
};
struct EverythingIsInstalled : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    bool isApplicationInstalled(const std::string&) override { return true; }
};
struct CoveringPlaceholdersAreInstalled : ChangingProxies {
    using ChangingProxies::ChangingProxies;
    void change(AppProxy& proxy) override {
        if (proxy.state.placeholder) proxy.state.installed = true;
    }
};
struct ApplicationsHaveNoType : ChangingProxies {
    using ChangingProxies::ChangingProxies;
    void change(AppProxy& proxy) override { proxy.applicationType.clear(); }
};
struct InstallTypesAreForgotten : ChangingProxies {
    using ChangingProxies::ChangingProxies;
    void change(AppProxy& proxy) override { proxy.installType = kInstallTypeNone; }
};
struct BundlesOutsideTheirContainers : ChangingProxies {
    using ChangingProxies::ChangingProxies;
    void change(AppProxy& proxy) override { proxy.bundleContainerPath = "/var/containers/other"; }
};
struct VersionsAreForgotten : ChangingProxies {
    using ChangingProxies::ChangingProxies;
    void change(AppProxy& proxy) override { proxy.bundleVersion.reset(); }
};
struct NamesAreIdentifiers : ChangingProxies {
    using ChangingProxies::ChangingProxies;
    void change(AppProxy& proxy) override { proxy.displayName = proxy.applicationIdentifier; }
};
struct NothingTakesRoom : ChangingProxies {
    using ChangingProxies::ChangingProxies;
    void change(AppProxy& proxy) override { proxy.staticDiskUsage = 0; }
};
struct LookUpsThrow : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                               Placeholders placeholders) override {
        auto proxy = target().proxyForIdentifier(identifier, placeholders);
        if (!proxy) throw std::out_of_range("no " + identifier);
        return proxy;
    }
};

// Walks.

struct WalksDoNotStop : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        target().enumerateBundles(type, [&](const AppProxy& proxy, bool&) {
            bool ignored = false;
            callback(proxy, ignored);
        });
    }
};
struct WalksGoTwice : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        target().enumerateBundles(type, callback);
        target().enumerateBundles(type, callback);
    }
};
struct WalksIgnoreTheType : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    void enumerateBundles(BundleType, const ProxyCallback& callback) override {
        target().enumerateBundles(kEveryBundle, callback);
    }
};
struct WalksPassPlaceholdersOver : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        target().enumerateBundles(type, [&](const AppProxy& proxy, bool& stop) {
            if (!proxy.state.placeholder) callback(proxy, stop);
        });
    }
};
/// Answers from a task of its own, after it has returned.
struct WalksGoOnLater : RegistryWithPlatform {
    using RegistryWithPlatform::RegistryWithPlatform;
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        std::vector<AppProxy> proxies;
        target().enumerateBundles(type,
                                  [&](const AppProxy& proxy, bool&) { proxies.push_back(proxy); });
        queues().runAfter(std::chrono::nanoseconds(0), [proxies, callback] {
            bool stop = false;
            for (const AppProxy& proxy : proxies) {
                if (!stop) callback(proxy, stop);
            }
        });
    }
};
/// Answers before it returns, but from another thread.
struct WalksOnAnotherThread : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        std::thread([&] { target().enumerateBundles(type, callback); }).join();
    }
};
/// Walks under the lock that every other call takes.
struct WalksUnderALock : RegistryWithPlatform {
    WalksUnderALock(AppRegistry& target, const Platform& platform)
        : RegistryWithPlatform(target, platform), lock(queues().makeLock()) {}
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        const std::lock_guard<Lock> held(*lock);
        target().enumerateBundles(type, callback);
    }
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override {
        const std::lock_guard<Lock> held(*lock);
        return target().uninstallApplication(identifier, options);
    }
    const std::unique_ptr<Lock> lock;
};

// Installs.

struct AnyPackageTypeIsTaken : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        PropertyList changed = options;
        changed.set(PackageTypeKey, PackageTypeCustomer);
        return target().installPackage(package, changed);
    }
};
struct AnyPlaceholderTypeIsTaken : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status installPlaceholderBundle(const FileURL& directory,
                                    const PropertyList& options) override {
        PropertyList changed = options;
        changed.set(PackageTypeKey, PackageTypePlaceholder);
        return target().installPlaceholderBundle(directory, changed);
    }
};
/// Installs what is there, whatever it was asked for.
struct IdentifiersAreNotCompared : RegistryWithPlatform {
    using RegistryWithPlatform::RegistryWithPlatform;
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        const Status status = target().installPackage(package, options);
        if (status || status.error().domain != kInstallerErrorDomain) return status;
        return {};
    }
};
struct PackagesAreTaken : RegistryWithPlatform {
    using RegistryWithPlatform::RegistryWithPlatform;
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        Status status = target().installPackage(package, options);
        if (status) files().removeItem(package.path()).ignore();
        return status;
    }
};
struct UpdatesAreRefused : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        if (target().proxyForIdentifier(identifierOf(options), Placeholders::Excluded)) {
            return ErrorRecord::make(kRegistryErrorDomain, 1, "it is there already");
        }
        return target().installPackage(package, options);
    }
};
/// Says that an update has been installed, and keeps the old version.
struct UpdatesKeepTheOldVersion : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                               Placeholders placeholders) override {
        auto proxy = target().proxyForIdentifier(identifier, placeholders);
        const auto first = versions.find(identifier);
        if (proxy && proxy->state.installed && first != versions.end()) {
            proxy->bundleVersion = first->second;
        }
        return proxy;
    }
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        Status status = target().installPackage(package, options);
        const auto now = target().proxyForIdentifier(identifierOf(options), Placeholders::Excluded);
        if (now) versions.emplace(now->applicationIdentifier, now->bundleVersion.value_or(""));
        return status;
    }
    std::map<std::string, std::string> versions;
};
/// Puts the placeholder back that the install has taken away.
struct PlaceholdersStay : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        bool stopped = false;
        target().enumerateBundles(type, [&](const AppProxy& proxy, bool& stop) {
            callback(proxy, stop);
            stopped = stop;
        });
        for (const AppProxy& proxy : left) {
            if (!stopped) callback(proxy, stopped);
        }
    }
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        const auto before =
            target().proxyForIdentifier(identifierOf(options), Placeholders::Included);
        Status status = target().installPackage(package, options);
        if (status && before && before->state.placeholder) left.push_back(*before);
        return status;
    }
    std::vector<AppProxy> left;
};
struct FailedInstallsRemoveTheVersion : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        Status status = target().installPackage(package, options);
        if (status) return status;
        const std::string identifier = identifierOf(options);
        while (target().uninstallApplication(identifier, {})) continue;
        return status;
    }
};
struct FailedInstallsRemoveThePlaceholder : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        Status status = target().installPackage(package, options);
        if (!status) {
            target()
                .uninstallApplication(identifierOf(options),
                                      PropertyList::map({{UninstallPlaceholderOnlyKey, true}}))
                .ignore();
        }
        return status;
    }
};
struct MissingPackagesAreInstalled : RegistryWithPlatform {
    using RegistryWithPlatform::RegistryWithPlatform;
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        if (!files().itemExists(package.path())) return {};
        return target().installPackage(package, options);
    }
};
struct RefusalsOfAnotherDomain : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status installPlaceholderBundle(const FileURL& directory,
                                    const PropertyList& options) override {
        const Status status = target().installPlaceholderBundle(directory, options);
        return status ? status : Status(inDomain(kPosixErrorDomain, status.error()));
    }
};
struct PackageErrorsOfAnotherDomain : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        const Status status = target().installPackage(package, options);
        return status ? status : Status(inDomain(kRegistryErrorDomain, status.error()));
    }
};
struct UninstallErrorsWithoutADomain : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override {
        const Status status = target().uninstallApplication(identifier, options);
        return status ? status : Status(inDomain("", status.error()));
    }
};
/// Refuses while another install is under way.
struct OneInstallAtATime : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        if (busy.exchange(true)) return ErrorRecord::make(kRegistryErrorDomain, 1, "busy");
        Status status = target().installPackage(package, options);
        busy = false;
        return status;
    }
    std::atomic<bool> busy{false};
};

// Placeholders.

struct PlaceholderBundlesAreTaken : RegistryWithPlatform {
    using RegistryWithPlatform::RegistryWithPlatform;
    Status installPlaceholderBundle(const FileURL& directory,
                                    const PropertyList& options) override {
        Status status = target().installPlaceholderBundle(directory, options);
        if (status) files().removeItem(directory.path()).ignore();
        return status;
    }
};
/// Lets the placeholder's record name the directory that it was given.
struct PlaceholderBundlesAreNotCopied : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                               Placeholders placeholders) override {
        auto proxy = target().proxyForIdentifier(identifier, placeholders);
        if (proxy && proxy->state.placeholder) proxy->bundlePath = paths[identifier];
        return proxy;
    }
    Status installPlaceholderBundle(const FileURL& directory,
                                    const PropertyList& options) override {
        paths[identifierOf(options)] = directory.path();
        return target().installPlaceholderBundle(directory, options);
    }
    std::map<std::string, std::string> paths;
};
/// Refuses some placeholders.
struct RefusesPlaceholders : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status installPlaceholderBundle(const FileURL& directory,
                                    const PropertyList& options) override {
        if (refuses(options)) return ErrorRecord::make(kRegistryErrorDomain, 1, "not this one");
        return target().installPlaceholderBundle(directory, options);
    }
    virtual bool refuses(const PropertyList& options) = 0;
};
struct SecondPlaceholdersAreRefused : RefusesPlaceholders {
    using RefusesPlaceholders::RefusesPlaceholders;
    bool refuses(const PropertyList& options) override {
        const auto found =
            target().proxyForIdentifier(identifierOf(options), Placeholders::Included);
        return found && found->state.placeholder;
    }
};
struct StoreMetadataIsRefused : RefusesPlaceholders {
    using RefusesPlaceholders::RefusesPlaceholders;
    bool refuses(const PropertyList& options) override {
        return options.find(StoreMetadataKey) != nullptr;
    }
};
struct NullSinfIsRefused : RefusesPlaceholders {
    using RefusesPlaceholders::RefusesPlaceholders;
    bool refuses(const PropertyList& options) override {
        const PropertyList* sinf = options.find(AppSinfKey);
        return sinf != nullptr && sinf->isNull();
    }
};
struct PlaceholdersReplaceApplications : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status installPlaceholderBundle(const FileURL& directory,
                                    const PropertyList& options) override {
        const std::string identifier = identifierOf(options);
        if (target().proxyForIdentifier(identifier, Placeholders::Excluded)) {
            target().uninstallApplication(identifier, {}).ignore();
        }
        return target().installPlaceholderBundle(directory, options);
    }
};
struct StoreMetadataIsNotWritten : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status installPlaceholderBundle(const FileURL& directory,
                                    const PropertyList& options) override {
        PropertyList changed = options;
        changed.erase(StoreMetadataKey);
        return target().installPlaceholderBundle(directory, changed);
    }
};

// Uninstalls.

struct UninstallsTakeBoth : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override {
        Status status = target().uninstallApplication(identifier, options);
        while (status && target().uninstallApplication(identifier, options)) continue;
        return status;
    }
};
struct PlaceholderOnlyIsIgnored : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status uninstallApplication(const std::string& identifier, const PropertyList&) override {
        return target().uninstallApplication(identifier, {});
    }
};
struct UninstallingNothingSucceeds : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override {
        if (!identifier.empty() && !target().isApplicationInstalled(identifier)) return {};
        return target().uninstallApplication(identifier, options);
    }
};
struct UninstallsNeedOptions : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override {
        if (!options.isMap()) return ErrorRecord::make(kRegistryErrorDomain, 1, "no map");
        return target().uninstallApplication(identifier, options);
    }
};
struct UninstallsLeaveFiles : RegistryWithPlatform {
    using RegistryWithPlatform::RegistryWithPlatform;
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override {
        const auto proxy = target().proxyForIdentifier(identifier, Placeholders::Included);
        Status status = target().uninstallApplication(identifier, options);
        if (status && proxy) files().createDirectory(proxy->bundlePath, true, nullptr).ignore();
        return status;
    }
};

void addLookUps(Violators& v) {
    const std::string record =
        "With placeholders included, one that covers an installed application is preferred to it; "
        "without, only installed applications are looked at.";
    v.device<PlaceholdersAreNeverExcluded>("PlaceholdersAreNeverExcluded", record);
    v.device<ApplicationsArePreferred>("ApplicationsArePreferred", record);
    const std::string anything =
        "Whether there is anything under the identifier: an application or a placeholder.";
    v.device<PlaceholdersAreNothing>("PlaceholdersAreNothing", anything);
    v.device<EverythingIsInstalled>("EverythingIsInstalled", anything);
    v.device<CoveringPlaceholdersAreInstalled>(
        "CoveringPlaceholdersAreInstalled",
        "That of a placeholder is never `installed`, also where it covers an installed "
        "application.");
    v.device<ApplicationsHaveNoType>("ApplicationsHaveNoType", "\"User\" or \"System\".");
    v.device<InstallTypesAreForgotten>("InstallTypesAreForgotten",
                                       "How it came: an `InstallType`.");
    v.device<BundlesOutsideTheirContainers>(
        "BundlesOutsideTheirContainers",
        "The directory that holds the bundle and the store metadata file.");
    const std::string proxy =
        "The registry's record of one installed application or of one placeholder, as it was when "
        "asked for.";
    v.device<VersionsAreForgotten>("VersionsAreForgotten", proxy);
    v.device<NamesAreIdentifiers>("NamesAreIdentifiers", proxy);
    v.device<NothingTakesRoom>("NothingTakesRoom", "Bytes that the bundle takes on disk.",
                               Around::OurDevice);
    v.device<LookUpsThrow>("LookUpsThrow", "Nothing throws.");
    v.device<WalksDoNotStop>("WalksDoNotStop",
                             "Gets each proxy in turn; sets `stop` to end the walk.");
    const std::string walk =
        "Calls back, on the calling thread and before it returns, once for each record of the "
        "type, in no particular order.";
    v.device<WalksGoTwice>("WalksGoTwice", walk);
    v.device<WalksIgnoreTheType>("WalksIgnoreTheType", walk);
    v.device<WalksPassPlaceholdersOver>("WalksPassPlaceholdersOver", walk);
    v.device<WalksGoOnLater>("WalksGoOnLater", walk);
    v.device<WalksOnAnotherThread>("WalksOnAnotherThread", walk, Around::OurDevice);
    v.device<WalksUnderALock>("WalksUnderALock",
                              "The callback may call the registry, and change what it walks.");
}

void addInstalls(Violators& v) {
    const std::string package =
        "`options` is a map: `PackageTypeKey` = `PackageTypeCustomer` (any other is refused), "
        "`BundleIdentifierKey` = the identifier that the package must have.";
    v.device<AnyPackageTypeIsTaken>("AnyPackageTypeIsTaken", package);
    v.device<IdentifiersAreNotCompared>("IdentifiersAreNotCompared", package);
    v.device<PackagesAreTaken>("PackagesAreTaken",
                               "The file is only read: the plug-in removes it afterwards.");
    const std::string replaces =
        "Replaces an installed version and takes the placeholder away; on failure both are as "
        "before.";
    v.device<UpdatesAreRefused>("UpdatesAreRefused", replaces);
    v.device<UpdatesKeepTheOldVersion>("UpdatesKeepTheOldVersion", replaces);
    v.device<PlaceholdersStay>("PlaceholdersStay", replaces);
    v.device<FailedInstallsRemoveTheVersion>("FailedInstallsRemoveTheVersion", replaces);
    v.device<FailedInstallsRemoveThePlaceholder>("FailedInstallsRemoveThePlaceholder", replaces);
    v.device<MissingPackagesAreInstalled>("MissingPackagesAreInstalled",
                                          "An error when there is no package at the path.");
    const std::string legal =
        "It refuses identifiers that are not legal (1 to 255 bytes of letters, digits, '.', '-', "
        "'_'; not \".\" or \"..\") with an error of `kRegistryErrorDomain`; for errors that a "
        "package causes see `kInstallerErrorDomain`.";
    v.device<RefusalsOfAnotherDomain>("RefusalsOfAnotherDomain", legal);
    v.device<PackageErrorsOfAnotherDomain>("PackageErrorsOfAnotherDomain", legal);
    v.device<UninstallErrorsWithoutADomain>("UninstallErrorsWithoutADomain", legal);
    v.device<OneInstallAtATime>("OneInstallAtATime", "Callable on any thread, by several at once.");
}

void addPlaceholders(Violators& v) {
    const std::string copy =
        "Installs a directory as a placeholder; the registry takes its own copy, and leaves the "
        "directory to whoever made it.";
    v.device<PlaceholderBundlesAreTaken>("PlaceholderBundlesAreTaken", copy);
    v.device<PlaceholderBundlesAreNotCopied>("PlaceholderBundlesAreNotCopied", copy);
    const std::string options =
        "`options` is a map: `PackageTypeKey` = `PackageTypePlaceholder` (any other is refused), "
        "`BundleIdentifierKey`, `InstallTypeKey`, and optionally `StoreMetadataKey` and "
        "`AppSinfKey`.";
    v.device<AnyPlaceholderTypeIsTaken>("AnyPlaceholderTypeIsTaken", options);
    v.device<StoreMetadataIsRefused>("StoreMetadataIsRefused", options);
    v.device<NullSinfIsRefused>("NullSinfIsRefused", options);
    v.device<StoreMetadataIsNotWritten>(
        "StoreMetadataIsNotWritten",
        "The store metadata comes to stand in the placeholder's container, as "
        "\"VessikMetadata.plist\".",
        Around::OurDevice);
    const std::string covers =
        "An installed application that the placeholder covers stays usable; a placeholder that "
        "stands already is replaced, and its install begins anew, with a new record.";
    v.device<SecondPlaceholdersAreRefused>("SecondPlaceholdersAreRefused", covers);
    v.device<PlaceholdersReplaceApplications>("PlaceholdersReplaceApplications", covers);
    v.device<UninstallsTakeBoth>(
        "UninstallsTakeBoth",
        "The placeholder goes first: where one covers an installed application, it alone is "
        "removed.");
    v.device<PlaceholderOnlyIsIgnored>(
        "PlaceholderOnlyIsIgnored",
        "With `UninstallPlaceholderOnlyKey` true the application is never touched.");
    v.device<UninstallingNothingSucceeds>("UninstallingNothingSucceeds",
                                          "An error when there is nothing to remove.");
    v.device<UninstallsNeedOptions>("UninstallsNeedOptions",
                                    "`options` is a map or null (no options).");
    v.device<UninstallsLeaveFiles>("UninstallsLeaveFiles",
                                   "What is removed goes with its container.");
}

}  // namespace

std::vector<Violator> registryViolators() {
    Violators v("platform/AppRegistry.h", "*AppRegistry*:*InstallProgress*:*Lasting*");
    addLookUps(v);
    addInstalls(v);
    addPlaceholders(v);
    return v.take();
}

}  // namespace appsync
