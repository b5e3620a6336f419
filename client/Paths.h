#pragma once

#include <initializer_list>
#include <string>
#include <string_view>

namespace appsync {

/// What the plug-in keeps for syncing. `clearSyncData` removes it whole.
inline constexpr std::string_view kWorkArea = "/var/mobile/Library/ApplicationSync";
/// What the host left in the staging area of the present session; inside the work area.
inline constexpr std::string_view kTodoDirectory =
    "/var/mobile/Library/ApplicationSync/VessikStuff";
/// Where the host leaves it.
inline constexpr std::string_view kStagingArea = "/var/mobile/Media/PublicStaging/ApplicationSync";
/// Where received files lie whose path is relative.
inline constexpr std::string_view kPublicStaging = "/var/mobile/Media/PublicStaging";

inline constexpr std::string_view kTodoListPath =
    "/var/mobile/Library/ApplicationSync/VessikStuff/ApplicationsSync.plist";
inline constexpr std::string_view kTodoListDebugPath =
    "/var/mobile/Library/ApplicationSync/VessikStuff/ApplicationsSync.plist-debug.plist";
inline constexpr std::string_view kIconOrderPath =
    "/var/mobile/Library/ApplicationSync/AssetSortOrder.plist";
inline constexpr std::string_view kLastSyncAppStatePath =
    "/var/mobile/Library/ApplicationSync/LastSyncAppState.plist";
inline constexpr std::string_view kRestoreStatePath =
    "/var/mobile/Library/ApplicationSync/RestoreState.plist";
/// Where icons for the host are rendered; emptied by each `outstandingAssetTransfers`.
inline constexpr std::string_view kIconDirectory = "/var/mobile/Library/ApplicationSync/Icons";

/// What a restore from a backup has left: which applications to bring back.
inline constexpr std::string_view kRestoreInfoPath =
    "/var/mobile/Media/VessikRestore/RestoreApplications.plist";
/// Where it goes once it has been looked at.
inline constexpr std::string_view kProcessedRestoreInfoPath =
    "/var/mobile/Library/Logs/MediaServices/RestoreApplications.plist";
/// Which of them had been demoted; the backup service keeps it.
inline constexpr std::string_view kDemotedAppsPath =
    "/var/mobile/Library/Preferences/com.korvu.Bakvia.DemotedApps.plist";

// Formats of paths, for `formatPath`.
inline constexpr std::string_view kIconLayoutFormat = "%@/DeskoraIconState.plist";
inline constexpr std::string_view kStoreMetadataFormat = "%@/VessikMetadata.plist";
inline constexpr std::string_view kInfoFormat = "%@/Info.plist";
inline constexpr std::string_view kArtworkFormat = "%@/VessikArtwork";
inline constexpr std::string_view kInDirectoryFormat = "%s/%@";
inline constexpr std::string_view kIconFormat = "%s/%@.png";

/// The format with each "%s" and "%@" replaced by the next part. A place-holder without a part, and
/// a part without a place-holder, leave nothing.
[[nodiscard]] std::string formatPath(std::string_view format,
                                     std::initializer_list<std::string_view> parts);

/// Where a received file lies: a path that does not begin with "/" is relative to the public
/// staging directory.
[[nodiscard]] std::string receivedFilePath(const std::string& path);

}  // namespace appsync
