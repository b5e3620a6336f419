#include "device/install/KeptBundles.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <limits>
#include <optional>
#include <system_error>
#include <utility>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/KeptTable.h"
#include "device/install/Containers.h"
#include "device/install/InstallContext.h"
#include "device/values/DevicePaths.h"
#include "platform/Error.h"
#include "system/file/PosixError.h"
#include "system/file/RootDirectory.h"
#include "system/file/RootedFileSystem.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;

constexpr mode_t kKeptMode = 0755;
// The log and the log's index of a database that is opened and changed, with room.
constexpr std::uint64_t kRoomOfDatabase = std::uint64_t{128} << 10U;

std::optional<std::uint64_t> freeBytesAt(int directory) {
    struct statvfs space = {};
    if (::fstatvfs(directory, &space) != 0) return std::nullopt;
    return std::uint64_t{space.f_bavail} * space.f_frsize;
}

bool isFullAt(const std::string& devicePath) {
    const UniqueFd device(::open(devicePath.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return device.valid() && freeBytesAt(device.get()).value_or(kRoomOfDatabase) < kRoomOfDatabase;
}

// `path` is what an error names.
Status renameBetween(int from, int to, const std::string& name, const std::string& path) {
    if (::renameat2(from, name.c_str(), to, name.c_str(), RENAME_NOREPLACE) == 0) return {};
    const int error = errno;
    if (error != EACCES && error != EPERM) return posixError(error, "move", path);
    return posixError(error, "move", path,
                      "permission denied; let the device's owner write there, and try again");
}

std::string pathOfKept(const std::string& devicePath) {
    return devicePath + "/" + std::string(kKeptDirectoryName);
}

/// The kept containers, the one first that was put there first.
std::vector<std::string> containersByArrival(const std::string& directory) {
    std::vector<std::pair<std::int64_t, std::string>> found;
    std::error_code error;
    if (!fs::is_directory(fs::symlink_status(directory, error))) return {};
    for (fs::directory_iterator entry(directory, error), end; !error && entry != end;
         entry.increment(error)) {
        struct stat status = {};
        if (::lstat(entry->path().c_str(), &status) != 0) continue;
        found.emplace_back(status.st_ctim.tv_sec, entry->path().string());
    }
    std::sort(found.begin(), found.end());
    std::vector<std::string> paths;
    paths.reserve(found.size());
    for (auto& [time, path] : found) paths.push_back(std::move(path));
    return paths;
}

Status forgetAllKept(const InstallContext& context, const std::vector<std::string>& containers) {
    return context.database.change(Durability::Soon, [&](Database& database) -> Status {
        for (const std::string& container : containers) {
            if (Status status = forgetKept(database, container); !status) return status;
        }
        return {};
    });
}

}  // namespace

Status KeptBundles::keep(const std::string& container) {
    if (!isSingleName(container)) return posixError(EINVAL, "keep", container);
    const Result<ItemPlace> from = files_.root().place(containerPath(container), "keep");
    if (!from) return from.error();
    const Result<UniqueFd> to = madeDirectory();
    if (!to) return to.error();
    return renameBetween(from->directory.get(), to->get(), container, keptPath(container));
}

Status KeptBundles::bringBack(const std::string& container) {
    if (!isSingleName(container)) return posixError(EINVAL, "bring back", container);
    const Result<UniqueFd> from = directory();
    if (!from) return from.error();
    const Result<ItemPlace> to = files_.root().place(containerPath(container), "bring back");
    if (!to) return to.error();
    return renameBetween(from->get(), to->directory.get(), container, keptPath(container));
}

void KeptBundles::remove(const std::string& container) {
    if (!isSingleName(container)) return;
    const Result<UniqueFd> from = directory();
    const std::string path = std::string(kTemporaryDirectory) + "/" + container;
    const Result<ItemPlace> to = files_.root().place(path, "remove");
    if (!from || !to) return;
    const Status moved =
        renameBetween(from->get(), to->directory.get(), container, keptPath(container));
    if (moved) files_.removeItem(path).ignore();
}

Result<std::vector<std::string>> KeptBundles::names() const {
    const Result<UniqueFd> opened = directory();
    if (opened) return namesIn(opened->get(), kKeptDirectoryName);
    const std::int64_t code = opened.error().code;
    if (code == ENOENT || code == ENOTDIR || code == ELOOP) return std::vector<std::string>();
    return opened.error();
}

std::string KeptBundles::keptPath(const std::string& container) const {
    return pathOfKept(devicePath_) + "/" + container;
}

Result<UniqueFd> KeptBundles::directory() const {
    const std::string path = pathOfKept(devicePath_);
    const int flags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
    UniqueFd opened(::open(path.c_str(), flags));
    if (!opened) return posixError(errno, "open", path);
    return opened;
}

Result<UniqueFd> KeptBundles::madeDirectory() const {
    Result<UniqueFd> opened = directory();
    if (opened || opened.error().code != ENOENT) return opened;
    const std::string path = pathOfKept(devicePath_);
    if (::mkdir(path.c_str(), kKeptMode) != 0 && errno != EEXIST) {
        return posixError(errno, "create", path);
    }
    return directory();
}

void putAway(const InstallContext& context, const FreedContainers& freed) {
    context.containers.remove(freed.application);
    context.containers.remove(freed.placeholder);
    context.kept.remove(freed.kept);
    if (freed.replaced.empty()) return;
    // Where the call alone has failed, the next session does it.
    const Status kept = context.kept.keep(freed.replaced);
    if (kept || !isInTheWay(kept.error())) return;
    context.containers.remove(freed.replaced);
    forgetAllKept(context, {freed.replaced}).ignore();
}

void makeRoomFor(const InstallContext& context, std::uint64_t bytes) {
    const int directory = context.files.root().descriptor();
    if (freeBytesAt(directory).value_or(bytes) >= bytes) return;
    std::vector<BundleRow> kept;
    const Status read = context.database.read([&](Database& database) -> Status {
        Result<std::vector<BundleRow>> rows = allKept(database);
        if (!rows) return rows.error();
        kept = std::move(*rows);
        return {};
    });
    if (!read) return;
    // The files go first: where no byte is free the database cannot be written.
    std::vector<std::string> givenUp;
    for (const BundleRow& row : kept) {
        if (freeBytesAt(directory).value_or(bytes) >= bytes) break;
        context.kept.remove(row.container);
        givenUp.push_back(row.container);
    }
    if (givenUp.empty()) return;
    context.kept.noteGivenUp();
    forgetAllKept(context, givenUp).ignore();
}

bool isFullWithKept(const std::string& devicePath) noexcept {
    try {
        return isFullAt(devicePath) && !containersByArrival(pathOfKept(devicePath)).empty();
    } catch (const std::exception&) {
        return false;
    }
}

void giveUpKeptIfFull(const std::string& devicePath) noexcept {
    try {
        if (!isFullAt(devicePath)) return;
        std::error_code error;
        for (const std::string& container : containersByArrival(pathOfKept(devicePath))) {
            fs::remove_all(container, error);
            if (!isFullAt(devicePath)) return;
        }
    } catch (const std::exception&) {
        return;  // what comes next tells that the disk is full
    }
}

bool makesRoomAfter(const InstallContext& context, const ErrorRecord& failure) {
    const bool isLack = failure.code == ENOSPC || failure.code == EDQUOT;
    if (!isLack || failure.domain != kPosixErrorDomain) return false;
    makeRoomFor(context, std::numeric_limits<std::uint64_t>::max());
    return context.kept.gaveUp();
}

}  // namespace appsync
