#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "host/backup/Backup.h"
#include "platform/Result.h"

namespace appsync {

class BackupFolder;
class Device;

/// Something of an application's data that is not in its backup.
struct LeftOutData {
    std::string identifier;
    /// The file, relative to the data; empty when it is all of them.
    std::string file;
    std::string error;
};

/// What came of a backup.
struct BackupResult {
    BackupManifest manifest;
    std::vector<std::string> demoted;
    std::vector<LeftOutData> leftOut;
    std::uint64_t bytes = 0;
};

/// Whether a path lies in the directory of the device.
[[nodiscard]] bool liesInDevice(const Device& device, const std::string& path);

/// Refuses a folder that lies in the device: a backup there would be part of what it backs up.
[[nodiscard]] Status checkBackupPlace(const Device& device, const std::string& backup);

/// Hears of which application data is packed, and the size of each piece that was read of it. May
/// be empty.
using BackupProgress = std::function<void(const std::string& identifier, std::uint64_t bytes)>;

/// Writes what a restore needs of a device into the folder, and finishes it. The device is open for
/// a session, and the plug-in has prepared it. What of an application's data cannot be read is left
/// out and named; an error when the backup as a whole does not become one.
[[nodiscard]] Result<BackupResult> makeBackup(Device& device, BackupFolder& folder,
                                              const BackupProgress& progress = {});

}  // namespace appsync
