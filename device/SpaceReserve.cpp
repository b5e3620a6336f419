#include "device/SpaceReserve.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <limits>

#include "device/values/DevicePaths.h"
#include "system/UniqueFd.h"

namespace appsync {

namespace {

// What the removal of an application writes to the database's log, and the log's index, with room.
constexpr off_t kReserve = off_t{256} << 10U;
// A disk that is nearly full is needed for better things.
constexpr off_t kPlenty = 16 * kReserve;

UniqueFd openDevice(const std::string& path) {
    return UniqueFd(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

off_t freeSpaceAt(int directory) {
    struct statvfs space = {};
    if (::fstatvfs(directory, &space) != 0) return std::numeric_limits<off_t>::max();
    return static_cast<off_t>(space.f_bavail * space.f_frsize);
}

}  // namespace

void keepSpaceReserve(const std::string& devicePath) noexcept {
    const UniqueFd directory = openDevice(devicePath);
    const char* name = kReserveName.data();
    struct stat status = {};
    if (!directory || ::fstatat(directory.get(), name, &status, AT_SYMLINK_NOFOLLOW) == 0) return;
    if (freeSpaceAt(directory.get()) < kPlenty) return;
    const int flags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
    const UniqueFd file(::openat(directory.get(), name, flags, 0600));
    if (!file) return;
    // fallocate fails where posix_fallocate would write every block of a file that compresses.
    if (::fallocate(file.get(), 0, 0, kReserve) != 0) ::unlinkat(directory.get(), name, 0);
}

void giveUpSpaceReserveIfFull(const std::string& devicePath) noexcept {
    const UniqueFd directory = openDevice(devicePath);
    struct stat status = {};
    if (!directory || freeSpaceAt(directory.get()) >= kReserve ||
        ::fstatat(directory.get(), kReserveName.data(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
        return;
    }
    const bool isReserve = S_ISREG(status.st_mode) && status.st_size == kReserve;
    if (isReserve) ::unlinkat(directory.get(), kReserveName.data(), 0);
}

}  // namespace appsync
