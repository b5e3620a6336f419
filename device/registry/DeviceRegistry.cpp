#include "device/registry/DeviceRegistry.h"

#include <vector>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/RegistryTables.h"
#include "device/install/ApplicationInstall.h"
#include "device/install/BundleRemoval.h"
#include "device/install/PlaceholderInstall.h"
#include "device/install/ProgressBook.h"
#include "device/values/DeviceError.h"
#include "device/values/PackageIdentifier.h"
#include "platform/FileURL.h"

namespace appsync {

namespace {

std::vector<AppProxy> proxiesOf(const std::vector<BundleRow>& rows, BundleTable table) {
    std::vector<AppProxy> proxies;
    proxies.reserve(rows.size());
    for (const BundleRow& row : rows) proxies.push_back(proxyOf(row, table));
    return proxies;
}

Result<std::vector<BundleRow>> rowsOf(Database& database, BundleTable table,
                                      AppRegistry::BundleType type) {
    switch (type) {
        case AppRegistry::kEveryBundle:
            return allBundles(database, table);
        case AppRegistry::kUserBundles:
            return bundlesOfType(database, table, kApplicationTypeUser);
        case AppRegistry::kSystemBundles:
            return bundlesOfType(database, table, kApplicationTypeSystem);
    }
    return std::vector<BundleRow>();
}

Status appendProxies(Database& database, BundleTable table, AppRegistry::BundleType type,
                     std::vector<AppProxy>& proxies) {
    const Result<std::vector<BundleRow>> rows = rowsOf(database, table, type);
    if (!rows) return rows.error();
    for (AppProxy& proxy : proxiesOf(*rows, table)) proxies.push_back(std::move(proxy));
    return {};
}

Status findApplication(Database& database, const std::string& identifier,
                       std::optional<AppProxy>& proxy) {
    const auto row = findBundle(database, BundleTable::Applications, identifier);
    if (!row) return row.error();
    if (*row) proxy = proxyOf(**row, BundleTable::Applications);
    return {};
}

Status findUppermost(Database& database, const std::string& identifier,
                     std::optional<AppProxy>& proxy) {
    const auto found = findUppermost(database, identifier);
    if (!found) return found.error();
    if (*found) proxy = proxyOf((*found)->row, (*found)->table);
    return {};
}

Status optionsRefused(std::string_view what) {
    return registryError(RegistryErrorCode::IllegalOptions,
                         "the options of the install are refused: " + std::string(what));
}

// The identifier that the options name, when they are for that type of package.
Result<std::string> identifierOf(const PropertyList& options, std::string_view packageType) {
    const std::string* type = options.findString(PackageTypeKey);
    if (type == nullptr || *type != packageType) {
        return optionsRefused("the package type is not " + std::string(packageType)).error();
    }
    const std::string* identifier = options.findString(BundleIdentifierKey);
    if (identifier == nullptr) return optionsRefused("they name no identifier").error();
    if (Status status = requireLegalIdentifier(*identifier); !status) return status.error();
    return *identifier;
}

Result<std::optional<Bytes>> dataOf(const PropertyList& options, std::string_view key) {
    const PropertyList* value = options.find(key);
    if (value == nullptr || value->isNull()) return std::optional<Bytes>();
    if (const Bytes* data = value->asData()) return std::optional<Bytes>(*data);
    return optionsRefused(std::string(key) + " is not data").error();
}

std::uint64_t installTypeOf(const PropertyList& options) {
    const PropertyList* value = options.find(InstallTypeKey);
    return value == nullptr ? std::uint64_t{kInstallTypeNone}
                            : value->asUnsigned().value_or(kInstallTypeNone);
}

}  // namespace

DeviceRegistry::DeviceRegistry(const InstallContext& context)
    : context_(context), observers_([this] { return installsUnderWay(); }) {}

std::optional<AppProxy> DeviceRegistry::proxyForIdentifier(const std::string& identifier,
                                                           Placeholders placeholders) {
    std::optional<AppProxy> proxy;
    context_.database
        .read([&](Database& database) -> Status {
            proxy.reset();
            return placeholders == Placeholders::Included
                       ? findUppermost(database, identifier, proxy)
                       : findApplication(database, identifier, proxy);
        })
        .ignore();
    return proxy;
}

bool DeviceRegistry::isApplicationInstalled(const std::string& identifier) {
    bool isThere = false;
    context_.database
        .read([&](Database& database) {
            Query rows = database.query(
                "SELECT 1 FROM applications WHERE identifier = ?"
                " UNION ALL SELECT 1 FROM placeholders WHERE identifier = ?");
            rows.bind(identifier, identifier);
            isThere = rows.next();
            return rows.status();
        })
        .ignore();
    return isThere;
}

void DeviceRegistry::enumerateBundles(BundleType type, const ProxyCallback& callback) {
    std::vector<AppProxy> proxies;
    context_.database
        .read([&](Database& database) -> Status {
            Status status = appendProxies(database, BundleTable::Applications, type, proxies);
            if (!status) return status;
            return appendProxies(database, BundleTable::Placeholders, type, proxies);
        })
        .ignore();
    bool stop = false;
    for (const AppProxy& proxy : proxies) {
        callback(proxy, stop);
        if (stop) return;
    }
}

std::shared_ptr<InstallProgressRecord> DeviceRegistry::installProgress(const AppProxy& proxy,
                                                                       std::uint64_t /*phase*/) {
    return context_.progress.record(proxy.applicationIdentifier);
}

void DeviceRegistry::finishInstallPhase(InstallProgressRecord& record) {
    context_.progress.finishPhase(record);
}

Status DeviceRegistry::installPackage(const FileURL& package, const PropertyList& options) {
    const Result<std::string> identifier = identifierOf(options, PackageTypeCustomer);
    if (!identifier) return identifier.error();
    Status status = installApplication(context_, *identifier, package, installTypeOf(options));
    noteInstall(*identifier, status);
    return status;
}

void DeviceRegistry::noteInstall(const std::string& identifier, const Status& status) {
    const std::lock_guard guard(mutex_);
    if (status) {
        failedInstalls_.erase(identifier);
    } else {
        failedInstalls_.insert(identifier);
    }
}

bool DeviceRegistry::takeFailedInstall(const std::string& identifier) {
    const std::lock_guard guard(mutex_);
    return failedInstalls_.erase(identifier) > 0;
}

Status DeviceRegistry::installPlaceholderBundle(const FileURL& directory,
                                                const PropertyList& options) {
    const Result<std::string> identifier = identifierOf(options, PackageTypePlaceholder);
    if (!identifier) return identifier.error();
    Result<std::optional<Bytes>> metadata = dataOf(options, StoreMetadataKey);
    if (!metadata) return metadata.error();
    Result<std::optional<Bytes>> sinf = dataOf(options, AppSinfKey);
    if (!sinf) return sinf.error();
    PlaceholderSource source;
    source.identifier = *identifier;
    source.bundle = directory.path();
    source.installType = installTypeOf(options);
    source.storeMetadata = std::move(*metadata);
    source.sinf = std::move(*sinf);
    return installPlaceholder(context_, source);
}

Status DeviceRegistry::uninstallApplication(const std::string& identifier,
                                            const PropertyList& options) {
    if (Status status = requireLegalIdentifier(identifier); !status) return status;
    const PropertyList* only = options.find(UninstallPlaceholderOnlyKey);
    const bool placeholderOnly = only != nullptr && only->booleanConversion().value_or(false);
    if (placeholderOnly) return removeBundles(context_, identifier, Removal::PlaceholderOnly);
    const bool clearsUp = takeFailedInstall(identifier);
    return removeBundles(context_, identifier,
                         clearsUp ? Removal::SyncPlaceholderOnly : Removal::PlaceholderFirst);
}

void DeviceRegistry::addObserver(std::weak_ptr<AppRegistryObserver> observer) {
    observers_.add(std::move(observer));
}

void DeviceRegistry::removeObserver(const AppRegistryObserver* observer) {
    observers_.remove(observer);
}

InstallsUnderWay DeviceRegistry::installsUnderWay() {
    std::vector<BundleRow> placeholders;
    context_.database
        .read([&](Database& database) -> Status {
            Result<std::vector<BundleRow>> rows = placeholdersWithProgress(database);
            if (!rows) return rows.error();
            placeholders = *std::move(rows);
            return {};
        })
        .ignore();
    InstallsUnderWay lists;
    for (const BundleRow& row : placeholders) {
        AppProxy proxy = proxyOf(row, BundleTable::Placeholders);
        const auto record = context_.progress.record(proxy.applicationIdentifier);
        if (record == nullptr) continue;
        const std::uint64_t state = record->installState();
        if (state == kInstallStatePaused) {
            lists.paused.push_back(std::move(proxy));
        } else if (state == kInstallStateWaiting || state == kInstallStateActive) {
            lists.prioritized.push_back(std::move(proxy));
        }
    }
    return lists;
}

}  // namespace appsync
