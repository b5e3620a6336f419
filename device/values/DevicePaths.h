#pragma once

#include <array>
#include <string>
#include <string_view>

namespace appsync {

// Where things stand in a device directory.
inline constexpr std::string_view kDatabaseName = "device.db";
inline constexpr std::string_view kRootName = "root";
inline constexpr std::string_view kReserveName = "space.reserve";
// The containers of versions that a rollback brings back.
inline constexpr std::string_view kKeptDirectoryName = "kept";
inline constexpr std::string_view kLogDirectoryName = "log";
inline constexpr std::string_view kLogName = "log/system.log";

// Device paths.
// The containers of all bundles.
inline constexpr std::string_view kContainersDirectory = "/var/containers/Bundle/Application";
/// The device path of the container of that name.
[[nodiscard]] inline std::string containerPath(std::string_view name) {
    return std::string(kContainersDirectory).append("/").append(name);
}
inline constexpr std::string_view kTemporaryDirectory = "/var/mobile/tmp";
// Where the plug-in makes the files of placeholders, one directory <identifier>.app each.
inline constexpr std::string_view kPlaceholderFilesDirectory = "/var/mobile/tmp/com.korvu.trd.Apps";
inline constexpr std::string_view kWorkAreaDirectory = "/var/mobile/Library/ApplicationSync";
inline constexpr std::string_view kPublicStagingDirectory = "/var/mobile/Media/PublicStaging";
// What a restore is told by; the backup service's lists.
inline constexpr std::string_view kRestoreDirectory = "/var/mobile/Media/VessikRestore";
inline constexpr std::string_view kPreferencesDirectory = "/var/mobile/Library/Preferences";
// Where the backup service finds the data that a restore has left: <identifier>.zip.
inline constexpr std::string_view kRestoreDataDirectory = "/var/mobile/Media/VessikRestore/Data";
// Where such data is unpacked before it comes to its place.
inline constexpr std::string_view kUnpackedDataDirectory = "/var/mobile/tmp/RestoredData";
// Where the plug-in puts the restore information that it has used.
inline constexpr std::string_view kRestoreLogDirectory = "/var/mobile/Library/Logs/MediaServices";
inline constexpr std::string_view kDataDirectory = "/var/mobile/Containers/Data";

// What a device always has: it is made with these, and each session remakes those that are lost.
inline constexpr std::array<std::string_view, 7> kStandingDirectories = {
    kTemporaryDirectory,   kPublicStagingDirectory, kDataDirectory,      kContainersDirectory,
    "/var/mobile/Library", kPreferencesDirectory,   kRestoreLogDirectory};

}  // namespace appsync
