#include "host/backup/BackupFolder.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <filesystem>
#include <string_view>
#include <system_error>
#include <utility>

#include "device/values/PackageIdentifier.h"
#include "host/backup/Backup.h"
#include "host/console/Problem.h"
#include "host/file/HostFile.h"
#include "system/file/DescriptorIO.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

std::string unfinishedManifest(const std::string& folder) {
    return (fs::path(folder) / kBackupManifest).native() + ".part";
}

ErrorRecord cannotMake(const std::string& path, const std::string& why) {
    return unusable("cannot make the folder " + path + ": " + why,
                    "name one in a directory that can be written");
}

bool isRegular(const fs::path& path) {
    std::error_code code;
    return fs::is_regular_file(fs::symlink_status(path, code));
}

// Whether an item of the folder is what a backup leaves that was cut off.
bool isLeftover(const fs::path& item) {
    constexpr std::array kNames = {kBackupRestoreInfo, kBackupDemotedApps, kBackupIconOrder};
    const std::string name = item.filename().native();
    std::error_code code;
    if (name == kBackupData && fs::is_directory(fs::symlink_status(item, code))) {
        const fs::directory_iterator archives(item, code);
        return !code && std::all_of(begin(archives), end(archives), [](const auto& each) {
            const std::string archive = each.path().filename().native();
            return isRegular(each.path()) &&
                   (archive.find(".zip") != std::string::npos || identifierOfArchive(archive));
        });
    }
    if (!isRegular(item)) return false;
    return item.native() == unfinishedManifest(item.parent_path().native()) ||
           std::any_of(kNames.begin(), kNames.end(), [&](std::string_view list) {
               return name == list || (name.starts_with(list) && name.ends_with(".new"));
           });
}

bool isCutOff(const std::string& path) {
    std::error_code code;
    const fs::directory_iterator items(path, code);
    return !code && isRegular(unfinishedManifest(path)) &&
           std::all_of(begin(items), end(items),
                       [](const auto& item) { return isLeftover(item.path()); });
}

// Everything but the unfinished manifest, which is the last to change.
Status clearLeftovers(const std::string& path) {
    std::error_code code;
    for (const fs::directory_entry& item : fs::directory_iterator(path, code)) {
        if (item.path().native() == unfinishedManifest(path)) continue;
        fs::remove_all(item.path(), code);
        if (code) return systemError(code.value(), "cannot remove " + item.path().native());
    }
    return {};
}

Status makeFolder(const std::string& path) {
    if (::mkdir(path.c_str(), 0777) == 0) return {};
    const int error = errno;
    std::error_code code;
    if (error != EEXIST) return cannotMake(path, std::generic_category().message(error));
    const bool isFolder = fs::is_directory(path, code);
    if (isFolder && ((fs::is_empty(path, code) && !code) || isCutOff(path))) return {};
    return unusable(path + " exists and is not an empty folder",
                    "name a folder that does not exist");
}

// Puts everything that was written into the folder on disk.
Status makeDurable(const std::string& folder) {
    const UniqueFd opened(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (opened && ::syncfs(opened.get()) == 0) return {};
    return systemError(errno, "cannot make " + folder + " durable");
}

}  // namespace

Result<BackupFolder> BackupFolder::make(const std::string& path) {
    fs::path plain(path);
    if (plain.filename().empty()) plain = plain.parent_path();  // a slash at the end
    if (Status made = makeFolder(plain.native()); !made) return made.error();
    const std::string name = unfinishedManifest(plain.native());
    UniqueFd manifest(::open(name.c_str(), O_WRONLY | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0666));
    if (!manifest) return cannotMake(path, std::generic_category().message(errno));
    if (::flock(manifest.get(), LOCK_EX | LOCK_NB) != 0) {
        return unusable("another backup is being written to " + path,
                        "wait until it is done, or name another folder");
    }
    if (Status cleared = clearLeftovers(plain.native()); !cleared) return cleared.error();
    return BackupFolder(plain.native(), std::move(manifest));
}

Status BackupFolder::finish(ByteView manifest) {
    if (Status durable = makeDurable(path_); !durable) return durable;
    const std::string unfinished = unfinishedManifest(path_);
    const std::string path = (fs::path(path_) / kBackupManifest).native();
    if (::ftruncate(manifest_.get(), 0) != 0) return cannotWriteFile(errno, path);
    const int error = writeWhole(manifest_.get(), manifest).error;
    if (error != 0) return cannotWriteFile(error, path);
    if (::fsync(manifest_.get()) != 0) return cannotWriteFile(errno, path);
    if (::rename(unfinished.c_str(), path.c_str()) != 0) return cannotWriteFile(errno, path);
    return makeDurable(path_);
}

}  // namespace appsync
