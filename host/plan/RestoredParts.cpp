#include "host/plan/RestoredParts.h"

#include "client/Paths.h"
#include "device/Device.h"
#include "platform/FileSystem.h"
#include "platform/PropertyListSerialization.h"
#include "platform/SyncAsset.h"

namespace appsync {

Result<unsigned> partsOfRestored(Device& device, const std::string& identifier) {
    const Result<ApplicationStatus> status = device.status(identifier);
    if (!status) return status.error();
    const bool hasData =
        status->awaitsRestoreData || device.files().itemExists(Device::restoreDataPath(identifier));
    if (hasData) return unsigned{kAssetPartApplication};
    return kAssetPartApplication | unsigned{kAssetPartApplicationData};
}

std::optional<std::string> versionThatWaitsForData(Device& device, const std::string& identifier) {
    const Result<Bytes> bytes = device.files().readFile(std::string(kRestoreStatePath));
    if (!bytes) return std::nullopt;
    const Result<PropertyList> state = device.propertyLists().parse(*bytes);
    if (!state) return std::nullopt;
    const PropertyList* versions = state->find(identifier);
    if (versions == nullptr || versions->entries().empty()) return std::nullopt;
    const PropertyList::Entry& last = versions->entries().back();
    const std::string* path = last.value.findString("path");
    if (path == nullptr || !device.files().itemExists(*path)) return std::nullopt;
    return last.key;
}

std::string howRestoredDataComes(const std::string& identifier, bool packageWaits) {
    const std::string send = "appsync send DEVICE " + identifier;
    const std::string begin =
        packageWaits ? "send it ("
                     : "send its package (" + send + " FILE --restore --parts 1), then its data (";
    return begin + send +
           " DATA --restore --parts 2), or the package alone, to use what the restore has left (" +
           send + " FILE --restore --parts 3)";
}

std::string howRestoredComes(Device& device, const std::string& identifier) {
    const Result<unsigned> parts = partsOfRestored(device, identifier);
    const bool hasData = parts && *parts == kAssetPartApplication;
    if (!hasData) return "send it (appsync send DEVICE " + identifier + " FILE --restore)";
    if (versionThatWaitsForData(device, identifier)) {
        return "its package waits for its data: " + howRestoredDataComes(identifier, true);
    }
    return howRestoredDataComes(identifier, false);
}

}  // namespace appsync
