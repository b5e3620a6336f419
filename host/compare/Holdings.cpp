#include "host/compare/Holdings.h"

#include <array>
#include <filesystem>
#include <system_error>
#include <utility>

#include "device/Device.h"
#include "device/values/DevicePaths.h"
#include "host/console/Problem.h"
#include "host/file/HostFile.h"
#include "host/plan/LibraryReader.h"
#include "platform/AppRegistry.h"
#include "platform/InstallProgressRecord.h"
#include "platform/PropertyListSerialization.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t kLargestHeldList = std::uint64_t{64} << 20U;

bool hasPart(const std::string& path, std::string_view name) {
    std::error_code code;
    return fs::exists(fs::symlink_status(fs::path(path) / name, code));
}

Result<HoldingsKind> kindOf(const std::string& path) {
    if (hasPart(path, kDatabaseName) || hasPart(path, kRootName)) return HoldingsKind::Device;
    const std::string unfinished = std::string(kBackupManifest) + ".part";
    if (hasPart(path, kBackupManifest) || hasPart(path, unfinished)) return HoldingsKind::Backup;
    const Result<std::vector<std::string>> packages = packageNamesIn(path);
    if (!packages) {
        std::error_code code;
        if (fs::is_directory(path, code)) return packages.error();
        return unusable("there is no folder '" + path + "'",
                        "name a device, a backup or a library");
    }
    if (!packages->empty()) return HoldingsKind::Library;
    return unusable(path + " is no device and no backup, and holds no package",
                    "name a device, a backup or a library");
}

// The identifiers of a list, as far as it is one.
std::optional<std::vector<std::string>> identifiersIn(const Bytes& bytes,
                                                      PropertyListSerialization& propertyLists) {
    const Result<PropertyList> list = propertyLists.parse(bytes);
    if (!list || !list->isArray()) return std::nullopt;
    std::vector<std::string> identifiers;
    for (const PropertyList& each : list->elements()) {
        if (const std::string* identifier = each.asString()) identifiers.push_back(*identifier);
    }
    return identifiers;
}

HeldState stateOf(const ApplicationRecord& record) {
    if (!record.isPlaceholder) return HeldState::Installed;
    switch (record.installType) {
        case kInstallTypeDowngrade:
        case kInstallTypeIntentionalDowngrade:
            return HeldState::Offloaded;
        case kInstallTypeRestore:
            return HeldState::Restored;
        default:
            return HeldState::Arriving;
    }
}

Status readDevice(Holdings& holdings) {
    Result<std::unique_ptr<Device>> device = Device::open(holdings.path);
    if (!device) return unusable(device.error());
    const Result<std::vector<ApplicationRecord>> records = (*device)->applicationsOnDisk();
    if (!records) return unusable(records.error());
    const Result<std::vector<ApplicationRecord>> shown = (*device)->homeScreenApplications();
    if (!shown) return unusable(shown.error());
    // An application stands before the placeholder that covers it.
    for (const ApplicationRecord& each : *records) {
        const bool isOfSystem = each.type == kApplicationTypeSystem;
        holdings.applications.try_emplace(
            each.identifier, HeldApplication{each.version.value_or(""), stateOf(each), isOfSystem});
    }
    holdings.order.emplace();
    for (const ApplicationRecord& each : *shown) holdings.order->push_back(each.identifier);
    holdings.device = *std::move(device);
    return {};
}

/// The lists of a backup; one that cannot be used is named.
class BackupLists {
  public:
    BackupLists(Holdings& holdings, PropertyListSerialization& propertyLists)
        : holdings_(holdings), propertyLists_(propertyLists) {}

    void read() {
        const std::optional<Bytes> order = bytesOf(kBackupIconOrder);
        if (order) holdings_.order = identifiersIn(*order, propertyLists_);
        if (order && !holdings_.order) note(kBackupIconOrder, "it is no list");
        if (const std::optional<Bytes> demoted = bytesOf(kBackupDemotedApps)) offload(*demoted);
    }

  private:
    std::optional<Bytes> bytesOf(std::string_view name) {
        const std::string path = (fs::path(holdings_.path) / name).native();
        Result<Bytes> bytes = readHostFile(path, kLargestHeldList);
        if (bytes) return *std::move(bytes);
        note(name, bytes.error().description());
        return std::nullopt;
    }

    void offload(const Bytes& bytes) {
        const Result<PropertyList> lists = propertyLists_.parse(bytes);
        if (!lists || !lists->isMap()) {
            note(kBackupDemotedApps, "it is no map of lists");
            return;
        }
        for (const auto& [key, list] : lists->entries()) {
            for (const PropertyList& each : list.elements()) {
                const std::string* identifier = each.asString();
                if (identifier == nullptr) continue;
                const auto found = holdings_.applications.find(*identifier);
                if (found == holdings_.applications.end()) continue;
                found->second.state = HeldState::BackedUpOffloaded;
            }
        }
    }

    void note(std::string_view name, const std::string& error) {
        holdings_.unreadable.push_back({(fs::path(holdings_.path) / name).native(), error});
    }

    Holdings& holdings_;
    PropertyListSerialization& propertyLists_;
};

Status readBackup(Holdings& holdings, PropertyListSerialization& propertyLists) {
    Result<BackupManifest> manifest = readBackupManifest(holdings.path);
    if (!manifest) return manifest.error();
    for (const BackedUpApplication& each : manifest->applications) {
        holdings.applications.try_emplace(
            each.identifier, HeldApplication{each.version.value_or(""), HeldState::BackedUp});
    }
    holdings.manifest = *std::move(manifest);
    BackupLists(holdings, propertyLists).read();
    return {};
}

Status readPackages(Holdings& holdings, PropertyListSerialization& propertyLists) {
    const Result<Library> library = readLibrary(holdings.path, propertyLists);
    if (!library) return library.error();
    for (const LibraryPackage& each : library->packages) {
        holdings.applications.try_emplace(each.identifier,
                                          HeldApplication{each.version, HeldState::Package});
    }
    if (library->iconOrder) holdings.order = identifiersIn(*library->iconOrder, propertyLists);
    for (const LibraryFault& each : library->faults) {
        holdings.unreadable.push_back(
            {(fs::path(holdings.path) / each.fileName).native(), each.error});
    }
    return {};
}

}  // namespace

Holdings::Holdings() = default;
Holdings::Holdings(Holdings&&) noexcept = default;
Holdings& Holdings::operator=(Holdings&&) noexcept = default;
Holdings::~Holdings() = default;

std::string_view kindName(HoldingsKind kind) {
    constexpr std::array<std::string_view, 3> kNames = {"device", "backup", "library"};
    return kNames.at(static_cast<std::size_t>(kind));
}

std::string_view stateName(HeldState state) {
    constexpr std::array<std::string_view, 7> kNames = {
        "installed", "offloaded", "restored", "arriving", "backed up", "offloaded", "package"};
    return kNames.at(static_cast<std::size_t>(state));
}

Result<Holdings> readHoldings(const std::string& path, PropertyListSerialization& propertyLists) {
    const Result<HoldingsKind> kind = kindOf(path);
    if (!kind) return kind.error();
    Holdings holdings;
    holdings.path = path;
    holdings.kind = *kind;
    Status status;
    if (*kind == HoldingsKind::Device) status = readDevice(holdings);
    if (*kind == HoldingsKind::Backup) status = readBackup(holdings, propertyLists);
    if (*kind == HoldingsKind::Library) status = readPackages(holdings, propertyLists);
    if (!status) return status.error();
    return holdings;
}

}  // namespace appsync
