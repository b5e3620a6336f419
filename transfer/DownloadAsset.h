#pragma once

#include <memory>
#include <string>

#include "platform/SyncAsset.h"

namespace appsync {

/// The download of an application, as the host knows it by the identifier alone: the handle by
/// which it is asked about a transfer.
[[nodiscard]] inline SyncAssetPointer makeDownloadAsset(const std::string& identifier) {
    auto asset = std::make_shared<SyncAsset>();
    asset->identifier = identifier;
    asset->dataclass = kApplicationDataclass;
    asset->isDownload = true;
    return asset;
}

}  // namespace appsync
