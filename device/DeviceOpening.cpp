#include "device/DeviceOpening.h"

#include <signal.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>

#include "device/SpaceReserve.h"
#include "device/database/Database.h"
#include "device/database/DatabaseCopy.h"
#include "device/database/DeviceSchema.h"
#include "device/install/Containers.h"
#include "device/install/KeptBundles.h"
#include "device/values/DeviceError.h"
#include "device/values/DevicePaths.h"
#include "system/ActingAccount.h"
#include "system/file/PosixError.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;

enum class Found { Nothing, File, Directory, Other };

Result<Found> look(const fs::path& path, bool followLink) {
    struct stat status = {};
    const int result = followLink ? ::stat(path.c_str(), &status) : ::lstat(path.c_str(), &status);
    if (result != 0 && (errno == ENOENT || errno == ENOTDIR)) return Found::Nothing;
    if (result != 0) return posixError(errno, "open", path.string());
    if (S_ISREG(status.st_mode)) return Found::File;
    return S_ISDIR(status.st_mode) ? Found::Directory : Found::Other;
}

std::string shown(const fs::path& path) { return displayPath(path.string()); }

Status missing(const fs::path& device) {
    return deviceError(DeviceErrorCode::Missing, "there is no device at " + shown(device) +
                                                     "; create one there, or give its path");
}

Status notADevice(const fs::path& device, std::string_view reason) {
    return deviceError(DeviceErrorCode::NotADevice, shown(device) +
                                                        " is not a device: " + std::string(reason) +
                                                        "; give the directory of a device");
}

Status halfCreated(const fs::path& device, std::string_view absent) {
    return deviceError(DeviceErrorCode::HalfCreated,
                       "the device " + shown(device) + " is not whole: it has no " +
                           std::string(absent) + "; save what you want to keep of its " +
                           std::string(kRootName) +
                           ", remove the directory and create the device again");
}

Status checkRoot(const fs::path& device) {
    const std::string containers = std::string(kRootName).append(kContainersDirectory);
    for (const std::string& directory : {std::string(kRootName), containers}) {
        const Result<Found> found = look(device / directory, false);
        if (!found) return found.error();
        if (*found != Found::Directory) return halfCreated(device, directory);
    }
    return {};
}

Status checkDirectory(const fs::path& device) {
    const Result<Found> found = look(device, true);
    if (!found) return found.error();
    if (*found == Found::Nothing) return missing(device);
    if (*found != Found::Directory) return notADevice(device, "it is not a directory");
    const Result<Found> database = look(device / kDatabaseName, false);
    if (!database) return database.error();
    if (*database == Found::Nothing) {
        const Result<Found> root = look(device / kRootName, false);
        if (root && *root == Found::Directory) return halfCreated(device, kDatabaseName);
        return notADevice(device, "it holds no device.db");
    }
    if (*database != Found::File) return notADevice(device, "its device.db is not a file");
    return checkRoot(device);
}

// The process that holds the device, as far as its database can tell.
std::int64_t holderOf(const fs::path& device) {
    const auto database =
        Database::open((device / kDatabaseName).string(), Database::Mode::Existing);
    if (!database) return 0;
    const Result<std::int64_t> process = (*database)->integer("SELECT process FROM session");
    if (!process || *process <= 0) return 0;
    const bool lives = ::kill(static_cast<pid_t>(*process), 0) == 0 || errno == EPERM;
    return lives ? *process : 0;
}

ErrorRecord inUse(const fs::path& device) {
    const std::int64_t holder = holderOf(device);
    const std::string who = holder == 0 ? "" : " (process " + std::to_string(holder) + ")";
    return deviceError(DeviceErrorCode::InUse, "the device " + shown(device) +
                                                   " is in use by another session" + who +
                                                   "; try again when that one has ended");
}

// Else root would leave files behind that the device's owner cannot write.
void actAsOwnerOf(const fs::path& device) {
    struct stat status = {};
    if (::stat(device.c_str(), &status) == 0) actAs(status.st_uid, status.st_gid);
}

// A session writes in any case: who may not is told before anything is touched, whoever holds it.
Status requireWritable(const fs::path& device) {
    if (const auto refused = whyNotWritable((device / kDatabaseName).string())) return *refused;
    return {};
}

Status takeLock(const fs::path& device, std::optional<SessionLock>& lock) {
    Result<std::optional<SessionLock>> taken = SessionLock::take(device.string());
    if (!taken) return taken.error();
    if (!*taken) return inUse(device);
    lock = std::move(*taken);
    return {};
}

bool hasRoom(const fs::path& device, std::uint64_t bytes) {
    std::error_code error;
    const fs::space_info space = fs::space(device, error);
    return error || space.available >= bytes;
}

// What a full disk keeps from being brought up to date serves on as it is.
Status readyForSession(const fs::path& device, DeviceDatabase& database) {
    std::uint64_t room = 0;
    const Status checked = database.read([&](Database& whole) -> Status {
        if (Status status = checkDeviceDatabase(whole); !status) return status;
        const Result<std::uint64_t> needed = roomToBringSchemaUpToDate(whole);
        if (!needed) return needed.error();
        room = *needed;
        return {};
    });
    if (!checked || room == 0) return checked;
    return database.change(Durability::OnDisk,
                           hasRoom(device, room) ? bringSchemaUpToDate : makeSchemaUsable);
}

Status openDatabase(const fs::path& device, bool session, OpenedDevice& opened) {
    using Sharing = DeviceDatabase::Sharing;
    auto database = DeviceDatabase::open((device / kDatabaseName).string(),
                                         session ? Sharing::Always : Sharing::IfPossible);
    if (!database) return database.error();
    opened.database = std::move(*database);
    if (!session) return {};
    return readyForSession(device, *opened.database);
}

Status openFiles(const fs::path& device, OpenedDevice& opened) {
    RootedFileSystemOptions options;
    options.temporaryDirectory = kTemporaryDirectory;
    auto files = RootedFileSystem::open((device / kRootName).string(), std::move(options));
    if (!files) return files.error();
    opened.files = std::move(*files);
    return {};
}

// Nothing is known yet of what a session needs: one that turns out to need nothing makes the
// reserve again at its end, while what is kept would be gone.
void makeRoomToOpen(const OpeningNeeds& needs, OpenedDevice& opened) {
    const bool couldGiveUpKept = needs.session && !needs.sparesKept && isFullWithKept(opened.path);
    if (needs.makesRoom || needs.borrowsRoom || couldGiveUpKept) {
        opened.givenUpReserve = giveUpSpaceReserveIfFull(opened.path);
    }
    if (couldGiveUpKept) giveUpKeptIfFull(opened.path);
}

std::string whatToDoAbout(const ErrorRecord& cause) {
    if (isInTheWay(cause)) return "; remove what stands there in its place";
    const bool isForbidden = cause.domain == kPosixErrorDomain && cause.code == EACCES;
    return isForbidden ? "; run the command as the account that owns the device" : "";
}

}  // namespace

ErrorRecord cannotUseDevice(const std::string& path, const ErrorRecord& cause) {
    if (cause.domain == kDeviceErrorDomain) return cause;
    return deviceError(DeviceErrorCode::CannotUse, "cannot use the device " + displayPath(path) +
                                                       ": " + cause.description() +
                                                       whatToDoAbout(cause));
}

Result<OpenedDevice> openDevice(const std::string& path, const OpeningNeeds& needs) {
    std::error_code error;
    const fs::path device = fs::absolute(path, error);
    if (path.empty() || path.find('\0') != path.npos || error) return missing(path).error();
    OpenedDevice opened;
    opened.path = device.string();
    Status status = checkDirectory(device);
    if (status) actAsOwnerOf(device);
    if (status && needs.session) status = requireWritable(device);
    if (status && needs.session) status = takeLock(device, opened.lock);
    if (status) makeRoomToOpen(needs, opened);
    if (status) status = openDatabase(device, needs.session, opened);
    if (status) status = openFiles(device, opened);
    if (status) return opened;
    opened.database.reset();
    if (opened.givenUpReserve != 0) keepSpaceReserve(opened.path, opened.givenUpReserve);
    return cannotUseDevice(path, status.error());
}

}  // namespace appsync
