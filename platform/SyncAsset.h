#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/FileURL.h"
#include "platform/PropertyList.h"

namespace appsync {

/// The one dataclass that the plug-in owns.
inline constexpr std::string_view kApplicationDataclass = "Application";

/// Bits of a SyncAsset's "AssetParts" and of its completed parts.
enum AssetParts : unsigned {
    kAssetPartApplication = 1,
    kAssetPartApplicationData = 2,
    kAssetPartBoth = 3,
};

/// The SyncHost's record of one asset to transfer. The plug-in makes it and fills in what it wants;
/// the host fills in what came. Used by one thread at a time: the host's until it reports the end
/// of the transfer, then the install's.
struct SyncAsset {
    /// The asset's identity within its dataclass; for applications the bundle identifier.
    std::string identifier;
    /// `kApplicationDataclass` for everything of this plug-in.
    std::string dataclass;
    /// The name to show to a person.
    std::optional<std::string> prettyName;

    /// The icon's file; it may not exist.
    std::optional<FileURL> icon;
    /// A map: "AssetParts" (integer), "Version" (string, only when known).
    PropertyList variantOptions = PropertyList::map();
    /// Absolute device paths of the application's side files; they may not exist.
    std::optional<std::string> storeMetadataPath;
    std::optional<std::string> infoPath;
    /// The asset belongs to a restore.
    bool isRestore = false;
    /// The store's product number; 0 when there is none.
    std::int64_t storeProductID = 0;
    /// The person in whose name the store sold it.
    std::optional<std::uint64_t> storePersonID;

    /// Where the received file lies: absolute, or relative to the public staging directory.
    std::optional<std::string> path;
    /// True for a transfer from the host to the device, false for an upload.
    bool isDownload = true;
    /// The parts that have come, see AssetParts.
    unsigned completedParts = kAssetPartApplication;
    /// Fractions from 0.0 to 1.0.
    double downloadProgress = 0;
    double installProgress = 0;

    /// The string at "Version" of the variant options; null when there is none.
    [[nodiscard]] const std::string* version() const {
        return variantOptions.findString("Version");
    }
};

using SyncAssetPointer = std::shared_ptr<SyncAsset>;

}  // namespace appsync
