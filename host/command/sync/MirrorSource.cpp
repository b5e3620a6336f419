#include "host/command/sync/MirrorSource.h"

#include <filesystem>
#include <string>
#include <string_view>
#include <system_error>

#include "host/backup/Backup.h"
#include "host/console/Problem.h"
#include "host/plan/Library.h"

namespace appsync {
namespace {

constexpr std::string_view kNameALibrary = "name the folder of packages, which is LIBRARY";

bool hasItem(const Library& library, std::string_view name) {
    std::error_code code;
    return std::filesystem::exists(std::filesystem::path(library.folder) / name, code);
}

ErrorRecord noMirror(const Library& library, std::string_view what, std::string_view whatToDo) {
    return unusable(
        "the device cannot become a mirror of " + library.folder + ", which " + std::string(what),
        whatToDo);
}

}  // namespace

Status checkMirrorSource(const Library& library, bool mayBeEmpty) {
    if (hasItem(library, "device.db")) return noMirror(library, "is a device", kNameALibrary);
    // The manifest is written last; a backup that was cut off has this one.
    if (hasItem(library, kBackupRestoreInfo))
        return noMirror(library, "is a backup", kNameALibrary);
    // What cannot be read keeps everything from being removed.
    if (mayBeEmpty || !library.packages.empty() || !library.faults.empty()) return {};
    return noMirror(library, "holds no package",
                    "put packages into it, or say --mirror=empty to remove every application");
}

}  // namespace appsync
