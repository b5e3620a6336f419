#include "device/SessionLock.h"

#include <fcntl.h>
#include <sys/file.h>

#include <cerrno>
#include <chrono>
#include <thread>

#include "system/file/PosixError.h"

namespace appsync {

namespace {

// Whoever only asks (`isHeld`) holds the lock for an instant; that must not turn a session away.
constexpr int kAttempts = 20;
constexpr std::chrono::milliseconds kBetweenAttempts{5};

UniqueFd openDirectory(const std::string& path) {
    return UniqueFd(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

bool lockWithin(int descriptor, int attempts) {
    while (::flock(descriptor, LOCK_EX | LOCK_NB) != 0) {
        if (errno != EINTR && errno != EWOULDBLOCK) return false;
        if (--attempts == 0) {
            errno = EWOULDBLOCK;
            return false;
        }
        std::this_thread::sleep_for(kBetweenAttempts);
    }
    return true;
}

}  // namespace

Result<std::optional<SessionLock>> SessionLock::take(const std::string& devicePath) {
    UniqueFd directory = openDirectory(devicePath);
    if (!directory) return posixError(errno, "open", devicePath);
    if (lockWithin(directory.get(), kAttempts)) {
        return std::optional<SessionLock>(SessionLock(std::move(directory)));
    }
    if (errno == EWOULDBLOCK) return std::optional<SessionLock>();
    return posixError(errno, "lock", devicePath);
}

bool SessionLock::isHeld(const std::string& devicePath) {
    const UniqueFd directory = openDirectory(devicePath);
    return directory && ::flock(directory.get(), LOCK_SH | LOCK_NB) != 0 && errno == EWOULDBLOCK;
}

}  // namespace appsync
