#include "device/DeviceCreation.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <optional>
#include <utility>

#include "device/SpaceReserve.h"
#include "device/database/Database.h"
#include "device/database/DeviceSchema.h"
#include "device/install/Containers.h"
#include "device/values/DeviceError.h"
#include "device/values/DevicePaths.h"
#include "device/values/PackageText.h"
#include "system/file/PosixError.h"
#include "system/file/UniqueFd.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;

ErrorRecord cannotCreate(const fs::path& device, const ErrorRecord& cause) {
    return deviceError(
        DeviceErrorCode::CannotUse,
        "cannot create the device " + displayPath(device.string()) + ": " + cause.description());
}

ErrorRecord noPath(const std::string& path) {
    return deviceError(DeviceErrorCode::CannotUse,
                       "cannot create a device at " + quotedName(path) +
                           ": it is no path of a directory; give that of a new one");
}

// Why nothing can be made in the directory that the device is to stand in.
ErrorRecord parentRefuses(const fs::path& device, int error) {
    const ErrorRecord refused = posixError(error, "create", device.string());
    const char* advice = nullptr;
    switch (error) {
        case ENOENT:
        case ENOTDIR:
            advice = "; its parent is no directory: create that first, or give another path";
            break;
        case EACCES:
        case EPERM:
        case EROFS:
            advice = "; its parent cannot be written: make it writable, or give another path";
            break;
        default:
            return refused;
    }
    return ErrorRecord::make(refused.domain, refused.code, refused.description() + advice);
}

ErrorRecord alreadyExists(const fs::path& device) {
    return deviceError(DeviceErrorCode::AlreadyExists,
                       displayPath(device.string()) +
                           " exists already; give the path of a new directory, or remove it first");
}

// The reserve is for the day when the disk is full; a device without it could not even remove
// something then.
ErrorRecord noRoom(const fs::path& device) {
    return deviceError(
        DeviceErrorCode::NoSpace,
        "cannot create the device " + displayPath(device.string()) + ": a device needs " +
            std::to_string(kSpaceOfNewDevice / 1024) +
            " KiB of free space beside its first files, and there is less; free some, or "
            "give a path on another disk");
}

ErrorRecord liesInside(const fs::path& path, const fs::path& device) {
    return deviceError(DeviceErrorCode::CannotUse,
                       "cannot create the device " + displayPath(path.string()) +
                           ": it would lie inside the device " + displayPath(device.string()) +
                           "; give a path outside of it");
}

bool isDevice(const fs::path& directory) {
    std::error_code ignored;
    return fs::is_regular_file(directory / kDatabaseName, ignored) &&
           fs::is_directory(directory / kRootName, ignored);
}

// The device in whose directory the path lies, if it lies in one.
std::optional<fs::path> deviceAround(const fs::path& path) {
    std::error_code error;
    fs::path each = fs::weakly_canonical(path.parent_path(), error);
    for (; !error && each.has_relative_path(); each = each.parent_path()) {
        if (isDevice(each)) return each;
    }
    return std::nullopt;
}

/// A directory in the making: locked while it is, and removed unless it was put in its place.
class Scaffold {
  public:
    explicit Scaffold(const fs::path& device)
        : device_(device), prefix_("." + device.filename().string() + ".creating-") {}
    Scaffold(const Scaffold&) = delete;
    Scaffold& operator=(const Scaffold&) = delete;
    ~Scaffold() { discard(path_); }

    /// Removes what crashed creations left, and makes the directory.
    Status make() {
        constexpr int kMostAttempts = 100;
        clearStale();
        for (int attempt = 0; attempt < kMostAttempts; ++attempt) {
            std::string pattern = (device_.parent_path() / (prefix_ + "XXXXXX")).string();
            if (::mkdtemp(pattern.data()) == nullptr) return parentRefuses(device_, errno);
            path_ = pattern;
            if (hold()) return {};
            discard(std::exchange(path_, {}));
        }
        return posixError(errno, "create", device_.string());
    }

    /// Makes it durable, and the device.
    Status putInPlace() {
        if (::syncfs(lock_.get()) != 0) return posixError(errno, "sync", device_.string());
        if (::renameat2(AT_FDCWD, path_.c_str(), AT_FDCWD, device_.c_str(), RENAME_NOREPLACE) !=
            0) {
            if (errno == EEXIST) return alreadyExists(device_);
            return posixError(errno, "create", device_.string());
        }
        path_.clear();
        const UniqueFd parent = openDirectory(device_.parent_path());
        if (!parent || ::fsync(parent.get()) != 0) {
            return posixError(errno, "sync", device_.parent_path().string());
        }
        return {};
    }

    [[nodiscard]] const fs::path& path() const { return path_; }
    /// What it is to become.
    [[nodiscard]] const fs::path& device() const { return device_; }

  private:
    static UniqueFd openDirectory(const fs::path& path) {
        return UniqueFd(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NOFOLLOW));
    }

    // Another creation, at the same moment, may take the directory for one that a crash left, as
    // long as it is not locked.
    bool hold() {
        lock_ = openDirectory(path_);
        struct stat attributes {};
        return lock_ && ::flock(lock_.get(), LOCK_EX | LOCK_NB) == 0 &&
               ::fstat(lock_.get(), &attributes) == 0 && attributes.st_nlink > 0 &&
               ::fchmod(lock_.get(), 0755) == 0;
    }

    static void discard(const fs::path& path) {
        std::error_code ignored;
        if (!path.empty()) fs::remove_all(path, ignored);
    }

    void clearStale() const {
        std::error_code error;
        for (fs::directory_iterator entry(device_.parent_path(), error), end;
             !error && entry != end; entry.increment(error)) {
            if (!entry->path().filename().string().starts_with(prefix_)) continue;
            const UniqueFd directory = openDirectory(entry->path());
            const bool stale = directory && ::flock(directory.get(), LOCK_EX | LOCK_NB) == 0;
            if (stale) discard(entry->path());
        }
    }

    const fs::path device_;
    const std::string prefix_;
    fs::path path_;
    UniqueFd lock_;
};

Status makeDirectories(const fs::path& device) {
    for (const std::string_view directory : kStandingDirectories) {
        const fs::path path = device / kRootName / directory.substr(1);
        std::error_code error;
        fs::create_directories(path, error);
        if (error) return posixError(error.value(), "create", path.string());
    }
    std::error_code error;
    fs::create_directory(device / kLogDirectoryName, error);
    if (error) return posixError(error.value(), "create", (device / kLogDirectoryName).string());
    return {};
}

Status makeDatabase(const fs::path& device, bool coordination) {
    const std::string path = (device / kDatabaseName).string();
    const Result<std::unique_ptr<Database>> database = Database::open(path, Database::Mode::Create);
    if (!database) return database.error();
    if (Status status = createDeviceSchema(**database); !status) return status;
    return (*database)
        ->query("INSERT INTO settings (name, value) VALUES ('coordination', ?)")
        .bind(coordination)
        .run();
}

Status build(Scaffold& scaffold, bool coordination) {
    Status status = scaffold.make();
    if (status) status = makeDirectories(scaffold.path());
    if (status) status = makeDatabase(scaffold.path(), coordination);
    if (!status) return status;
    if (!makeSpaceReserve(scaffold.path().string())) return noRoom(scaffold.device());
    return scaffold.putInPlace();
}

}  // namespace

Status createDevice(const std::string& path, bool coordination) {
    std::error_code error;
    fs::path device = fs::absolute(path, error).lexically_normal();
    if (device.filename().empty()) device = device.parent_path();
    if (path.empty() || path.find('\0') != path.npos || error || device.filename().empty()) {
        return noPath(path);
    }
    if (fs::symlink_status(device, error).type() != fs::file_type::not_found && !error) {
        return alreadyExists(device);
    }
    if (const auto around = deviceAround(device)) return liesInside(device, *around);
    Scaffold scaffold(device);
    Status status = build(scaffold, coordination);
    if (status || status.error().domain == kDeviceErrorDomain) return status;
    return cannotCreate(device, status.error());
}

}  // namespace appsync
