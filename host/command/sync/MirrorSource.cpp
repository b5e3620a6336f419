#include "host/command/sync/MirrorSource.h"

#include <filesystem>
#include <string_view>
#include <system_error>

#include "host/backup/Backup.h"
#include "host/command/argument/OpenDevice.h"
#include "host/console/Problem.h"
#include "host/plan/Library.h"
#include "system/file/PosixError.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view kNameALibrary = "name the folder of packages, which is LIBRARY";

bool hasItem(const fs::path& folder, std::string_view name) {
    std::error_code code;
    return fs::exists(folder / name, code);
}

// "a device", "a backup", or nothing.
std::string_view ownerOf(const fs::path& folder) {
    if (looksLikeDevice(folder)) return "a device";
    // The manifest is written last; a backup that was cut off has this one.
    return hasItem(folder, kBackupRestoreInfo) ? "a backup" : "";
}

// Of what stands above the folder.
std::string_view ownerAround(const std::string& folder) {
    std::error_code code;
    const fs::path whole = fs::canonical(folder, code);
    if (code) return "";
    fs::path each = whole.parent_path();
    while (ownerOf(each).empty() && each != each.root_path()) each = each.parent_path();
    return ownerOf(each);
}

ErrorRecord noMirror(const Library& library, const std::string& what, std::string_view whatToDo) {
    return unusable(
        "the device cannot become a mirror of " + displayPath(library.folder) + ", which " + what,
        whatToDo);
}

}  // namespace

Status checkLibraryFolder(const std::string& folder) {
    const std::string owner(ownerOf(folder));
    if (owner.empty()) return {};
    return unusable(displayPath(folder) + " is " + owner + " and no library", kNameALibrary);
}

Status checkMirrorSource(const Library& library, bool mayBeEmpty) {
    const std::string owner(ownerAround(library.folder));
    if (!owner.empty()) return noMirror(library, "stands in " + owner, kNameALibrary);
    // What cannot be read keeps everything from being removed.
    if (mayBeEmpty || !library.packages.empty() || !library.faults.empty()) return {};
    return noMirror(library, "holds no package",
                    "put packages into it, or say --mirror=empty to remove every application");
}

}  // namespace appsync
