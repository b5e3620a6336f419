#include "device/database/DatabaseCopy.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <string_view>
#include <utility>

#include "device/values/DeviceError.h"
#include "system/file/DescriptorIO.h"
#include "system/file/PosixError.h"
#include "system/file/UniqueFd.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;

constexpr const char* kLogSuffix = "-wal";
constexpr int kMostCopies = 20;
constexpr std::string_view kCopyPrefix = "appsync-look-";
constexpr std::array<std::string_view, 3> kCopyNames = {"device.db", "device.db-wal",
                                                        "device.db-shm"};

// Between two equal states of a database nothing that a copy needs is overwritten: a log that
// begins anew has another header, and without a log nobody writes the database unseen.
struct DatabaseState {
    std::string logHeader;
    struct stat database {};

    bool operator==(const DatabaseState& other) const {
        if (logHeader != other.logHeader) return false;
        const struct stat& one = database;
        const struct stat& two = other.database;
        const bool isSameFile = one.st_dev == two.st_dev && one.st_ino == two.st_ino;
        return isSameFile && (!logHeader.empty() || (one.st_size == two.st_size &&
                                                     one.st_mtim.tv_sec == two.st_mtim.tv_sec &&
                                                     one.st_mtim.tv_nsec == two.st_mtim.tv_nsec));
    }
};

Result<UniqueFd> openToRead(const std::string& path) {
    UniqueFd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
    if (!file) return posixError(errno, "open", path);
    return file;
}

bool isAbsent(const ErrorRecord& error) { return error.code == ENOENT; }

Result<std::string> logHeaderOf(const std::string& database) {
    const Result<UniqueFd> log = openToRead(database + kLogSuffix);
    if (!log && isAbsent(log.error())) return std::string();
    if (!log) return log.error();
    std::array<char, 32> header{};
    const ssize_t count = ::pread(log->get(), header.data(), header.size(), 0);
    const bool isWhole = count == static_cast<ssize_t>(header.size());
    return isWhole ? std::string(header.data(), header.size()) : std::string();
}

Result<DatabaseState> stateOf(const std::string& path) {
    DatabaseState state;
    if (::stat(path.c_str(), &state.database) != 0) return posixError(errno, "look at", path);
    Result<std::string> header = logHeaderOf(path);
    if (!header) return header.error();
    state.logHeader = *std::move(header);
    return state;
}

Status copyFile(const std::string& from, const std::string& to) {
    const Result<UniqueFd> source = openToRead(from);
    if (!source) return source.error();
    const int flags = O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW;
    const UniqueFd target(::open(to.c_str(), flags, 0600));
    if (!target) return posixError(errno, "create", to);
    const int error = copyWhole(source->get(), target.get());
    return error == 0 ? Status() : Status(posixError(error, "copy", from));
}

// The log last: what others move from it into the database meanwhile is then in both.
Status copyFiles(const std::string& from, const std::string& to,
                 const DatabaseCopy::Interlude& interlude) {
    if (Status copied = copyFile(from, to); !copied) return copied;
    if (interlude) interlude();
    Status copied = copyFile(from + kLogSuffix, to + kLogSuffix);
    if (copied || !isAbsent(copied.error())) return copied;
    std::error_code ignored;
    fs::remove(to + kLogSuffix, ignored);  // of an earlier attempt
    return {};
}

// False when others have written what it holds meanwhile.
Result<bool> copyUndisturbed(const std::string& from, const std::string& to,
                             const DatabaseCopy::Interlude& interlude) {
    const Result<DatabaseState> before = stateOf(from);
    if (!before) return before.error();
    if (Status copied = copyFiles(from, to, interlude); !copied) return copied.error();
    const Result<DatabaseState> after = stateOf(from);
    if (!after) return after.error();
    return *before == *after;
}

ErrorRecord neverLeftAlone(const std::string& path) {
    return deviceError(DeviceErrorCode::InUse, "the device's database " + displayPath(path) +
                                                   " is being written all the time; try again");
}

ErrorRecord noTemporaryDirectory(int error) {
    return posixError(error, "make", "a temporary directory",
                      posixReason(error) +
                          "; what may only be read is copied there: set TMPDIR to a directory that "
                          "can be written");
}

UniqueFd openCopyDirectory(const fs::path& path) {
    return UniqueFd(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NOFOLLOW));
}

struct LockedDirectory {
    std::string path;
    UniqueFd lock;
};

// Until it is locked, another process may take it for one that was left. Where the file system has
// no locks, none is ever taken for that.
Result<LockedDirectory> makeLockedDirectory(const fs::path& parent) {
    for (int attempt = 0; attempt < kMostCopies; ++attempt) {
        std::string path = (parent / kCopyPrefix).string() + "XXXXXX";
        if (::mkdtemp(path.data()) == nullptr) break;
        UniqueFd lock = openCopyDirectory(path);
        if (!lock) continue;
        ::flock(lock.get(), LOCK_EX);
        struct stat status = {};
        if (::fstat(lock.get(), &status) == 0 && status.st_nlink > 0) {
            return LockedDirectory{std::move(path), std::move(lock)};
        }
    }
    return noTemporaryDirectory(errno);
}

bool holdsCopyOnly(const fs::path& directory) {
    std::error_code code;
    fs::directory_iterator each(directory, code);
    for (; !code && each != fs::directory_iterator(); each.increment(code)) {
        const std::string name = each->path().filename();
        if (std::find(kCopyNames.begin(), kCopyNames.end(), name) == kCopyNames.end()) return false;
    }
    return !code;
}

// Only what this account's own looking has made, and nobody uses.
void clearIfAbandoned(const fs::path& path) {
    const UniqueFd directory = openCopyDirectory(path);
    struct stat status = {};
    if (!directory || ::fstat(directory.get(), &status) != 0) return;
    const bool isOwn = status.st_uid == ::geteuid() && (status.st_mode & 07777U) == 0700;
    if (!isOwn || ::flock(directory.get(), LOCK_EX | LOCK_NB) != 0) return;
    if (!holdsCopyOnly(path)) return;
    for (const std::string_view name : kCopyNames) ::unlinkat(directory.get(), name.data(), 0);
    ::rmdir(path.c_str());
}

void clearAbandonedCopies(const fs::path& parent) {
    std::error_code code;
    fs::directory_iterator each(parent, code);
    for (; !code && each != fs::directory_iterator(); each.increment(code)) {
        const std::string name = each->path().filename();
        const bool isCopy = name.starts_with(kCopyPrefix) && name.size() == kCopyPrefix.size() + 6;
        if (isCopy) clearIfAbandoned(each->path());
    }
}

}  // namespace

std::optional<ErrorRecord> whyNotWritable(const std::string& path) {
    const std::string directory = fs::path(path).parent_path().string();
    for (const std::string& each : {path, path + kLogSuffix, path + "-shm", directory}) {
        if (::faccessat(AT_FDCWD, each.c_str(), W_OK, AT_EACCESS) == 0) continue;
        if (errno != EACCES && errno != EPERM && errno != EROFS) continue;
        return deviceError(
            DeviceErrorCode::CannotUse,
            "the device's database " + displayPath(path) + " cannot be written (" +
                displayPath(each) + ": " + posixReason(errno) +
                "), so that the device can only be looked at; run the command as the account that "
                "owns the device, or use a copy of the device");
    }
    return std::nullopt;
}

DatabaseCopy::DatabaseCopy(std::string directory, UniqueFd lock)
    : directory_(std::move(directory)), lock_(std::move(lock)) {}

DatabaseCopy::DatabaseCopy(DatabaseCopy&& other) noexcept
    : directory_(std::exchange(other.directory_, {})), lock_(std::move(other.lock_)) {}

DatabaseCopy::~DatabaseCopy() {
    std::error_code ignored;
    if (!directory_.empty()) fs::remove_all(directory_, ignored);
}

std::string DatabaseCopy::path() const { return directory_ + "/device.db"; }

Result<DatabaseCopy> DatabaseCopy::make(const std::string& path, const Interlude& interlude) {
    std::error_code code;
    const fs::path parent = fs::temp_directory_path(code);
    if (code) return noTemporaryDirectory(code.value());
    clearAbandonedCopies(parent);
    Result<LockedDirectory> directory = makeLockedDirectory(parent);
    if (!directory) return directory.error();
    DatabaseCopy copy(directory->path, std::move(directory->lock));
    for (int attempt = 0; attempt < kMostCopies; ++attempt) {
        const Result<bool> done = copyUndisturbed(path, copy.path(), interlude);
        if (!done) return done.error();
        if (*done) return copy;
    }
    return neverLeftAlone(path);
}

}  // namespace appsync
