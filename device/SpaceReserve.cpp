#include "device/SpaceReserve.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <limits>

#include "device/values/DevicePaths.h"
#include "system/UniqueFd.h"

namespace appsync {

namespace {

// What the removal of an application writes to the database's log, and the log's index, with room.
constexpr off_t kReserve = off_t{256} << 10U;
// A disk that is nearly full is needed for better things.
constexpr off_t kPlenty = 4 * kReserve;

UniqueFd openDevice(const std::string& path) {
    return UniqueFd(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

off_t freeSpaceAt(int directory) {
    struct statvfs space = {};
    if (::fstatvfs(directory, &space) != 0) return std::numeric_limits<off_t>::max();
    return static_cast<off_t>(space.f_bavail * space.f_frsize);
}

bool holdsReserve(int directory) {
    struct stat status = {};
    return ::fstatat(directory, kReserveName.data(), &status, AT_SYMLINK_NOFOLLOW) == 0;
}

// Gives an errno value, or 0.
int makeReserveIn(int directory) {
    const char* name = kReserveName.data();
    const int flags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
    const UniqueFd file(::openat(directory, name, flags, 0600));
    if (!file) return errno;
    // fallocate fails where posix_fallocate would write every block of a file that compresses.
    if (::fallocate(file.get(), 0, 0, kReserve) == 0) return 0;
    const int error = errno;
    ::unlinkat(directory, name, 0);
    return error;
}

}  // namespace

bool makeSpaceReserve(const std::string& devicePath) noexcept {
    const UniqueFd directory = openDevice(devicePath);
    if (!directory || freeSpaceAt(directory.get()) < off_t{kSpaceOfNewDevice}) return !directory;
    const int error = makeReserveIn(directory.get());
    return error != ENOSPC && error != EDQUOT;
}

void keepSpaceReserve(const std::string& devicePath) noexcept {
    const UniqueFd directory = openDevice(devicePath);
    if (!directory || holdsReserve(directory.get())) return;
    if (freeSpaceAt(directory.get()) >= kPlenty) makeReserveIn(directory.get());
}

void giveUpSpaceReserveIfFull(const std::string& devicePath) noexcept {
    const UniqueFd directory = openDevice(devicePath);
    if (!directory || freeSpaceAt(directory.get()) >= kReserve) return;
    if (spaceReserveOf(devicePath) != 0) ::unlinkat(directory.get(), kReserveName.data(), 0);
}

std::uint64_t spaceReserveOf(const std::string& devicePath) noexcept {
    const UniqueFd directory = openDevice(devicePath);
    struct stat status = {};
    const bool isReserve =
        directory &&
        ::fstatat(directory.get(), kReserveName.data(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
        S_ISREG(status.st_mode) && status.st_size == kReserve;
    return isReserve ? static_cast<std::uint64_t>(kReserve) : 0;
}

}  // namespace appsync
