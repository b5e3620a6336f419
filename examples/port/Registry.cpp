#include "Device.h"

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <map>
#include <mutex>

#include "platform/LegalIdentifier.h"
#include "system/MemoryProgressRecord.h"
#include "system/RegistryObservers.h"

namespace port {
namespace {

using namespace appsync;

constexpr const char* kBook = "/Applications.plist";
constexpr const char* kContainers = "/var/containers";
constexpr const char* kBundle = "/Bundle.app";  // in its container

// A record of the book holds a bundle under one of these keys, or under both.
constexpr std::string_view kApplication = "Application";
constexpr std::string_view kPlaceholder = "Placeholder";
// What the book says of a bundle, beside its version, its name and its install type.
constexpr std::string_view kContainer = "Container";
constexpr std::string_view kBytes = "Bytes";

std::uint64_t numberAt(const PropertyList& map, std::string_view key) {
    const PropertyList* value = map.find(key);
    return value != nullptr ? value->asUnsigned().value_or(0) : 0;
}

std::optional<std::string> textAt(const PropertyList& map, std::string_view key) {
    const std::string* text = map.findString(key);
    return text != nullptr ? std::optional(*text) : std::nullopt;
}

AppProxy proxyOf(const std::string& identifier, std::string_view kind, const PropertyList& bundle) {
    const std::string container = textAt(bundle, kContainer).value_or("");
    return {.applicationIdentifier = identifier,
            .bundleVersion = textAt(bundle, BundleVersionKey),
            .displayName = textAt(bundle, BundleDisplayNameKey),
            .bundlePath = container + kBundle,
            .bundleContainerPath = container,
            .installType = numberAt(bundle, InstallTypeKey),
            .state = {kind == kApplication, kind == kPlaceholder},
            .staticDiskUsage = numberAt(bundle, kBytes)};
}

class Registry : public AppRegistry {
  public:
    Registry(RootedFileSystem& files, PropertyListSerialization& codec)
        : files_(files), codec_(codec), observers_([this] { return installsUnderWay(); }) {
        if (const auto bytes = files_.readFile(kBook)) book_ = *codec_.parse(*bytes);
        for (const auto& [identifier, record] : book_.entries()) beginInstall(identifier, record);
        removeStrayContainers();
    }

    std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                               Placeholders placeholders) override {
        const std::lock_guard guard(mutex_);
        const PropertyList record = recordOf(identifier);
        const bool covers = placeholders == Placeholders::Included && record.find(kPlaceholder);
        const std::string_view kind = covers ? kPlaceholder : kApplication;
        const PropertyList* bundle = record.find(kind);
        return bundle != nullptr ? std::optional(proxyOf(identifier, kind, *bundle)) : std::nullopt;
    }

    bool isApplicationInstalled(const std::string& identifier) override {
        return proxyForIdentifier(identifier, Placeholders::Included).has_value();
    }

    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        std::vector<AppProxy> proxies;
        std::unique_lock lock(mutex_);
        for (const auto& [identifier, record] : book_.entries())
            for (const auto& [kind, bundle] : record.entries())
                proxies.push_back(proxyOf(identifier, kind, bundle));
        lock.unlock();
        bool stop = type == kSystemBundles;  // there are none
        for (std::size_t i = 0; i < proxies.size() && !stop; ++i) callback(proxies[i], stop);
    }

    std::shared_ptr<InstallProgressRecord> installProgress(const AppProxy& proxy,
                                                           std::uint64_t /*phase*/) override {
        const std::lock_guard guard(mutex_);
        const auto found = installs_.find(proxy.applicationIdentifier);
        return found != installs_.end() ? found->second : nullptr;
    }

    void finishInstallPhase(InstallProgressRecord& record) override {
        record.setInstallPhase(kInstallPhaseInstalling);
    }

    Status installPackage(const FileURL& package, const PropertyList& options) override {
        Status installed = install(kApplication, PackageTypeCustomer, package.path(), options);
        const std::string identifier = textAt(options, BundleIdentifierKey).value_or("");
        const auto proxy = proxyForIdentifier(identifier, Placeholders::Included);
        const auto record = proxy ? installProgress(*proxy, kWholeInstall) : nullptr;
        if (!installed && record != nullptr) record->setInstallState(kInstallStateFailed);
        return installed;
    }
    Status installPlaceholderBundle(const FileURL& directory,
                                    const PropertyList& options) override {
        return install(kPlaceholder, PackageTypePlaceholder, directory.path(), options);
    }

    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override {
        const std::lock_guard change(changing_);
        PropertyList record = recordOf(identifier);
        if (!record.erase(kPlaceholder) &&
            (options.findFlag(UninstallPlaceholderOnlyKey) || !record.erase(kApplication)))
            return ErrorRecord::make(kRegistryErrorDomain, 2, "There is nothing to uninstall");
        return commit(identifier, std::move(record), kInstallStateCanceled);
    }

    void addObserver(std::weak_ptr<AppRegistryObserver> observer) override {
        observers_.add(std::move(observer));
    }
    void removeObserver(const AppRegistryObserver* observer) override {
        observers_.remove(observer);
    }

  private:
    PropertyList recordOf(const std::string& identifier) const {
        const PropertyList* record = book_.find(identifier);
        return record != nullptr ? *record : PropertyList::map();
    }

    Status install(std::string_view kind, std::string_view packageType, const std::string& source,
                   const PropertyList& options) {
        const std::lock_guard change(changing_);
        const auto identifier = textAt(options, BundleIdentifierKey);
        if (textAt(options, PackageTypeKey) != packageType ||
            !isLegalIdentifier(identifier.value_or("")))
            return ErrorRecord::make(kRegistryErrorDomain, 1, "No options for this install");
        const auto now = std::chrono::system_clock::now().time_since_epoch();
        const std::string container = std::string(kContainers) + "/" + std::to_string(now.count());
        const std::string bundle = container + kBundle;
        Status made =
            files_.createDirectory(kind == kPlaceholder ? container : bundle, true, nullptr);
        if (made)
            made = kind == kPlaceholder ? files_.copyDirectory(source, bundle)
                                        : files_.copyItem(source, bundle + "/Info.plist");
        const PropertyList* metadata = options.find(StoreMetadataKey);
        if (made && metadata != nullptr && metadata->asData() != nullptr)
            made = files_.createFile(container + "/VessikMetadata.plist", *metadata->asData(), {});
        if (!made) return made;
        const auto bytes = files_.readFile(bundle + "/Info.plist");
        const Result<PropertyList> info = bytes ? codec_.parse(*bytes) : bytes.error();
        if (!info || textAt(*info, BundleIdentifierKey) != identifier)
            return ErrorRecord::make(kInstallerErrorDomain, 1, "No bundle of " + *identifier);
        PropertyList entry =
            PropertyList::map({{kContainer, container},
                               {kBytes, sizeOf(bundle)},
                               {InstallTypeKey, numberAt(options, InstallTypeKey)}});
        for (const std::string_view key : {BundleVersionKey, BundleDisplayNameKey})
            if (const auto text = textAt(*info, key)) entry.set(key, *text);
        PropertyList record = recordOf(*identifier);
        record.erase(kPlaceholder);
        record.set(kind, std::move(entry));
        return commit(*identifier, std::move(record), kInstallStateFinished);
    }

    std::uint64_t sizeOf(const std::string& path) {
        const auto names = files_.names(path);
        if (!names) return files_.attributes(path)->size;
        std::uint64_t sum = 0;
        for (const std::string& name : *names) sum += sizeOf(path + "/" + name);
        return sum;
    }

    /// The one step in which a change is made: the book is replaced. What it stands on is on the
    /// disk before it, and it is on the disk before anything is removed.
    Status commit(const std::string& identifier, PropertyList record, std::uint64_t endState) {
        PropertyList book = book_;
        record.empty() ? book.erase(identifier) : book.set(identifier, std::move(record));
        const auto bytes = codec_.serialize(book, PropertyListFormat::Binary);
        ::syncfs(files_.root().descriptor());
        Status written = bytes ? files_.writeFileAtomically(kBook, *bytes) : bytes.error();
        if (!written) return written;
        ::syncfs(files_.root().descriptor());
        {
            const std::lock_guard guard(mutex_);
            book_ = std::move(book);
            const auto install = installs_.extract(identifier);
            if (!install.empty()) install.mapped()->end(endState);
            beginInstall(identifier, recordOf(identifier));
        }
        observers_.touch();
        removeStrayContainers();
        return {};
    }

    /// Where a placeholder stands that is no demoted application's.
    void beginInstall(const std::string& identifier, const PropertyList& record) {
        const PropertyList* bundle = record.find(kPlaceholder);
        if (bundle == nullptr || numberAt(*bundle, InstallTypeKey) >= kInstallTypeDowngrade) return;
        installs_[identifier] =
            std::make_shared<MemoryProgressRecord>(identifier, [this] { observers_.touch(); });
    }

    InstallsUnderWay installsUnderWay() {
        InstallsUnderWay lists;
        enumerateBundles(kEveryBundle, [&](const AppProxy& proxy, bool&) {
            const auto record = installProgress(proxy, kWholeInstall);
            if (proxy.state.placeholder && record != nullptr)
                lists.add(proxy, record->installState());
        });
        return lists;
    }

    void removeStrayContainers() {
        std::vector<std::string> kept;
        enumerateBundles(kEveryBundle, [&kept](const AppProxy& proxy, bool&) {
            kept.push_back(proxy.bundleContainerPath);
        });
        const auto isStray = [&kept](const std::string& name) {
            return std::count(kept.begin(), kept.end(), kContainers + ("/" + name)) == 0;
        };
        files_.removeContents(kContainers, isStray).ignore();
    }

    RootedFileSystem& files_;
    PropertyListSerialization& codec_;

    std::mutex changing_;  // held across each change; taken before mutex_
    std::mutex mutex_;
    // Protected by mutex_; the book is changed only with changing_ held too.
    PropertyList book_ = PropertyList::map();
    std::map<std::string, std::shared_ptr<MemoryProgressRecord>> installs_;

    RegistryObservers observers_;  // whose thread asks for all of it
};

}  // namespace

std::unique_ptr<AppRegistry> makeRegistry(RootedFileSystem& files,
                                          PropertyListSerialization& codec) {
    return std::make_unique<Registry>(files, codec);
}

}  // namespace port
