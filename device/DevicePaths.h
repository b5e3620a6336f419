#pragma once

#include <string_view>

namespace appsync {

// Where things stand in a device directory.
inline constexpr std::string_view kDatabaseName = "device.db";
inline constexpr std::string_view kRootName = "root";
inline constexpr std::string_view kLogDirectoryName = "log";
inline constexpr std::string_view kLogName = "log/system.log";

// Device paths.
inline constexpr std::string_view kTemporaryDirectory = "/var/mobile/tmp";
// Where the plug-in makes the files of placeholders, one directory <identifier>.app each.
inline constexpr std::string_view kPlaceholderFilesDirectory = "/var/mobile/tmp/com.korvu.trd.Apps";
inline constexpr std::string_view kWorkAreaDirectory = "/var/mobile/Library/ApplicationSync";
inline constexpr std::string_view kPublicStagingDirectory = "/var/mobile/Media/PublicStaging";
// Where the backup service finds the data that a restore has left: <identifier>.zip.
inline constexpr std::string_view kRestoreDataDirectory = "/var/mobile/Media/VessikRestore/Data";
// Where such data is unpacked before it comes to its place.
inline constexpr std::string_view kUnpackedDataDirectory = "/var/mobile/tmp/RestoredData";
inline constexpr std::string_view kDataDirectory = "/var/mobile/Containers/Data";

}  // namespace appsync
