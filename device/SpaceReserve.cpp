#include "device/SpaceReserve.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <limits>
#include <optional>

#include "device/values/DevicePaths.h"
#include "system/file/UniqueFd.h"

namespace appsync {

namespace {

// What the removal of an application writes to the database's log, and the log's index, with room.
constexpr off_t kReserve = off_t{256} << 10U;
// A disk that is nearly full is needed for better things.
constexpr off_t kPlenty = 4 * kReserve;
// What still does for a removal, of a device that is not large.
constexpr off_t kSmallReserve = kReserve / 2;
constexpr off_t kLeastReserve = off_t{96} << 10U;
constexpr off_t kBlock = off_t{4} << 10U;

UniqueFd openDevice(const std::string& path) {
    return UniqueFd(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

off_t freeSpaceAt(int directory) {
    struct statvfs space = {};
    if (::fstatvfs(directory, &space) != 0) return std::numeric_limits<off_t>::max();
    return static_cast<off_t>(space.f_bavail * space.f_frsize);
}

// What is kept back of so much: all that is left rather than nothing, as it gives back what it
// takes when it is needed.
off_t reserveOf(off_t space) {
    if (space >= kPlenty) return kReserve;
    return space < kLeastReserve ? 0 : std::min(space, kSmallReserve) / kBlock * kBlock;
}

// What the file takes; 0 where there is none, nothing where something else has its name.
std::optional<off_t> reserveIn(int directory) {
    struct stat status = {};
    if (::fstatat(directory, kReserveName.data(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
        return errno == ENOENT ? std::optional<off_t>(0) : std::nullopt;
    }
    const bool isReserve = S_ISREG(status.st_mode) && status.st_size <= kReserve;
    return isReserve ? std::optional<off_t>(status.st_size) : std::nullopt;
}

// Makes the file, or lets one grow. Gives an errno value, or 0.
int makeReserveIn(int directory, off_t size) {
    const char* name = kReserveName.data();
    const int flags = O_WRONLY | O_CREAT | O_NOFOLLOW | O_CLOEXEC;
    const UniqueFd file(::openat(directory, name, flags, 0600));
    if (!file) return errno;
    // fallocate fails where posix_fallocate would write every block of a file that compresses.
    if (::fallocate(file.get(), 0, 0, size) == 0) return 0;
    const int error = errno;
    if (reserveIn(directory) == off_t{0}) ::unlinkat(directory, name, 0);
    return error;
}

}  // namespace

bool makeSpaceReserve(const std::string& devicePath) noexcept {
    const UniqueFd directory = openDevice(devicePath);
    if (!directory || freeSpaceAt(directory.get()) < off_t{kSpaceOfNewDevice}) return !directory;
    const int error = makeReserveIn(directory.get(), kReserve);
    return error != ENOSPC && error != EDQUOT;
}

void keepSpaceReserve(const std::string& devicePath, std::uint64_t borrowed) noexcept {
    const UniqueFd directory = openDevice(devicePath);
    const std::optional<off_t> held = directory ? reserveIn(directory.get()) : std::nullopt;
    if (!held || *held == kReserve) return;
    const off_t space = freeSpaceAt(directory.get());
    const off_t back = std::min({space, static_cast<off_t>(borrowed), kReserve}) / kBlock * kBlock;
    const off_t wanted = std::max(reserveOf(space), back);
    if (wanted > *held) makeReserveIn(directory.get(), wanted);
}

std::uint64_t giveUpSpaceReserveIfFull(const std::string& devicePath) noexcept {
    const UniqueFd directory = openDevice(devicePath);
    if (!directory || freeSpaceAt(directory.get()) >= kReserve) return 0;
    const std::uint64_t held = spaceReserveOf(devicePath);
    if (held == 0 || ::unlinkat(directory.get(), kReserveName.data(), 0) != 0) return 0;
    return held;
}

std::uint64_t spaceReserveOf(const std::string& devicePath) noexcept {
    const UniqueFd directory = openDevice(devicePath);
    const std::optional<off_t> held = directory ? reserveIn(directory.get()) : std::nullopt;
    return static_cast<std::uint64_t>(held.value_or(0));
}

}  // namespace appsync
