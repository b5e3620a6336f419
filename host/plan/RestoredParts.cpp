#include "host/plan/RestoredParts.h"

#include "device/Device.h"
#include "platform/FileSystem.h"
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

}  // namespace appsync
