#include "system/LogFile.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <utility>

#include "system/file/DescriptorIO.h"

namespace appsync {

namespace {

ByteView bytesOf(std::string_view text) {
    return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

bool isSameFile(const struct stat& one, const struct stat& other) {
    return one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

// Whether what stands there, if anything does, is of that type itself.
bool isNothingElse(const std::string& path, mode_t type) {
    struct stat status {};
    return ::lstat(path.c_str(), &status) != 0 || (status.st_mode & S_IFMT) == type;
}

bool endsInsideLine(int file, off_t size) {
    char last = '\n';
    return size > 0 && ::pread(file, &last, 1, size - 1) == 1 && last != '\n';
}

}  // namespace

std::optional<LogFile> LogFile::open(const std::string& path, const LogLimits& limits) {
    const std::size_t slash = path.rfind('/');
    const std::string directory = path.substr(0, slash);
    if (!isNothingElse(directory, S_IFDIR) || !isNothingElse(path, S_IFREG)) return std::nullopt;
    LogFile log(directory, path.substr(slash + 1), limits);
    static_cast<void>(log.openFile());
    return log;
}

int LogFile::append(std::string_view line) {
    const std::string text = std::string(line).append("\n");
    if (const int error = makeRoom(static_cast<off_t>(text.size())); error != 0) return error;
    const std::string whole = lineIsCutOff_ ? "\n" + text : text;
    const WriteOutcome outcome = writeWhole(file_.get(), bytesOf(whole));
    if (outcome.written > 0) lineIsCutOff_ = outcome.written < whole.size();
    size_ += static_cast<off_t>(outcome.written);
    return outcome.error;
}

// Gives the errno value of the failure, or 0; as the others do.
int LogFile::openDirectory() {
    ::mkdir(directoryPath_.c_str(), 0755);  // it may have been tidied away
    constexpr int kFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
    directory_.reset(::open(directoryPath_.c_str(), kFlags));
    return directory_ ? 0 : errno;
}

int LogFile::openFile() {
    int error = openFileInDirectory();
    if (error == ENOENT && directory_) {
        // The directory itself has gone, and what is open of it takes no files any more.
        directory_.reset();
        error = openFileInDirectory();
    }
    return error;
}

int LogFile::openFileInDirectory() {
    if (!directory_) {
        if (const int error = openDirectory(); error != 0) return error;
    }
    constexpr int kFlags = O_RDWR | O_APPEND | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK;
    file_.reset(::openat(directory_.get(), name_.c_str(), kFlags, 0644));
    if (!file_) return errno;
    if (::fstat(file_.get(), &opened_) != 0 || !S_ISREG(opened_.st_mode)) {
        file_.reset();
        return ENXIO;
    }
    size_ = opened_.st_size;
    lineIsCutOff_ = endsInsideLine(file_.get(), size_);
    return 0;
}

int LogFile::makeRoom(off_t size) {
    const auto now = std::chrono::steady_clock::now();
    if (!file_ || now >= nextLook_) {
        if (const int error = look(); error != 0) return error;
        nextLook_ = now + limits_.unawareness;
    }
    return isFull(size_, size) ? putAside() : 0;
}

int LogFile::look() {
    const std::optional<off_t> now = sizeIfCurrent();
    // Another process has put it aside, or somebody has removed it.
    if (!now) return openFile();
    size_ = *now;
    return 0;
}

int LogFile::putAside() {
    // Who does not get the lock leaves it to the one who has it.
    if (::flock(file_.get(), LOCK_EX | LOCK_NB) != 0) return 0;
    const std::string older = olderPartOf(name_);
    if (sizeIfCurrent() &&
        ::renameat(directory_.get(), name_.c_str(), directory_.get(), older.c_str()) != 0) {
        const int error = errno;
        ::flock(file_.get(), LOCK_UN);
        return error;
    }
    return openFile();
}

std::optional<off_t> LogFile::sizeIfCurrent() const {
    struct stat now {};
    const bool isCurrent =
        file_ && ::fstatat(directory_.get(), name_.c_str(), &now, AT_SYMLINK_NOFOLLOW) == 0 &&
        isSameFile(now, opened_);
    return isCurrent ? std::optional(now.st_size) : std::nullopt;
}

bool LogFile::isFull(off_t size, off_t added) const {
    if (size == 0) return false;
    if (size + added > limits_.part) return true;
    // Looking at the disk with each line would be too much.
    const off_t next = (size + limits_.shortPart - 1) / limits_.shortPart * limits_.shortPart;
    return size + added > next && isSpaceScarce();
}

bool LogFile::isSpaceScarce() const {
    struct statvfs space {};
    return ::fstatvfs(directory_.get(), &space) == 0 &&
           static_cast<off_t>(space.f_bavail * space.f_frsize) < limits_.scarceSpace;
}

}  // namespace appsync
