#pragma once

// host/backup: `appsync backup` and `appsync restore`, without their printing. Backup.h is the
// format of the folder: its manifest (read by BackupManifestReader.h, its words in
// BackupManifestKeys.h) and the check of it against its files. BackupFolder.h makes a folder that
// is a whole backup or known to be none; BackupMaking.h fills it from a device; Restoring.h places
// it on a device, has the plug-in make the placeholders, and says what came of it, RestoreDefects.h
// what of it a device would refuse, RestoredData.h what space its data takes. The format:
// docs/device-format.md. Includes session (a restore is one), plan, file, console, device, system/,
// client/ (paths) and restore/ (what the plug-in reads of a backup); called by the commands.

#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/file/Checksum.h"
#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

// What a backup folder consists of (docs/device-format.md).
inline constexpr std::string_view kBackupManifest = "manifest.json";
inline constexpr std::string_view kBackupRestoreInfo = "RestoreApplications.plist";
inline constexpr std::string_view kBackupDemotedApps = "DemotedApps.plist";
inline constexpr std::string_view kBackupIconOrder = "IconOrder.plist";
inline constexpr std::string_view kBackupData = "data";

/// One application of a backup, as its manifest has it.
struct BackedUpApplication {
    std::string identifier;
    std::optional<std::string> version;
    std::string name;
    bool hasData = false;
};

/// What a backup says of itself.
struct BackupManifest {
    std::string made;  // when, ISO 8601
    std::vector<BackedUpApplication> applications;
    std::map<std::string, FileSum> files;  // by name, relative to the folder

    [[nodiscard]] bool holds(std::string_view file) const {
        return files.contains(std::string(file));
    }
};

/// A file of a backup that is not as the manifest says.
struct BackupFault {
    std::string file;
    std::string error;
    /// The manifest does not know the file, so a restore does not miss it.
    bool isSurplus = false;
};

/// The name of an application's archive, relative to the folder.
[[nodiscard]] std::string dataArchiveName(const std::string& identifier);

/// Whose archive the file is; nothing when it is none.
[[nodiscard]] std::optional<std::string> identifierOfData(std::string_view file);

/// Whether the folder holds a backup, be it cut off or without its manifest: with nothing of one it
/// is something else.
[[nodiscard]] bool isBackup(const std::string& folder);

/// Reads the manifest. Without a good one, a folder is no backup that can be used: the error says
/// which it is, none or a damaged one.
[[nodiscard]] Result<BackupManifest> readBackupManifest(const std::string& backup);

/// Reads what the manifest at a path holds.
[[nodiscard]] Result<BackupManifest> parseBackupManifest(ByteView text, const std::string& path);

/// The manifest as it stands in its file.
[[nodiscard]] Bytes manifestText(const BackupManifest& manifest);

/// Compares every file with its sum, and the parts of the manifest with each other, and reads the
/// archives of data as a device does that unpacks them. Files that the
/// manifest does not name are faults, too. One fault a file, sorted by its name; a link is a fault
/// wherever it leads.
[[nodiscard]] std::vector<BackupFault> checkBackup(const std::string& backup,
                                                   const BackupManifest& manifest);

}  // namespace appsync
