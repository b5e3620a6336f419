#include "system/file/RootDirectory.h"

#include <cerrno>
#include <memory>
#include <optional>
#include <utility>

#include <dirent.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include "system/file/MachinePath.h"
#include "system/file/PosixError.h"

namespace appsync {

namespace {

// The kernel answers EAGAIN where a rename anywhere on the machine met the resolution of a "..".
constexpr int kResolutionTries = 1000;

bool isWorthRepeating(int code) { return code == EAGAIN || code == EINTR; }

UniqueFd openInRoot(int root, const std::string& path, int flags, mode_t mode,
                    std::uint64_t resolution = 0) {
    const std::string kept = machinePath(path);
    open_how how{};
    how.flags = static_cast<std::uint64_t>(flags | O_CLOEXEC | O_NOCTTY);
    if ((flags & O_PATH) != 0) how.flags = static_cast<std::uint64_t>(flags | O_CLOEXEC);
    const bool creates = (flags & O_CREAT) != 0 || (flags & O_TMPFILE) == O_TMPFILE;
    how.mode = creates ? mode : 0;
    how.resolve = RESOLVE_IN_ROOT | RESOLVE_NO_MAGICLINKS | resolution;
    UniqueFd opened;
    for (int tries = 0; tries < kResolutionTries; ++tries) {
        opened.reset(
            static_cast<int>(::syscall(SYS_openat2, root, kept.c_str(), &how, sizeof how)));
        if (opened || !isWorthRepeating(errno)) break;
    }
    return opened;
}

struct CloseDirectory {
    void operator()(DIR* directory) const { ::closedir(directory); }
};

/// What is wrong with the path before anybody looks for it; nothing when it may be used.
std::optional<std::string_view> complaintAbout(std::string_view path) {
    if (path.empty()) return "the path is empty";
    if (path.find('\0') != std::string_view::npos) return "the path holds a NUL";
    if (path.front() != '/') return "the path is not absolute";
    return std::nullopt;
}

}  // namespace

Result<RootDirectory> RootDirectory::open(const std::string& machinePath) {
    UniqueFd root(::open(machinePath.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!root) return posixError(errno, "open the device's files in", machinePath);
    if (!openInRoot(root.get(), "/", O_PATH | O_DIRECTORY, 0)) {
        const int code = errno;
        const bool mayLackIt = code == ENOSYS || code == EPERM;
        const char* need = mayLackIt ? " (this needs openat2: Linux 5.6 or newer)" : "";
        return posixError(code, "resolve paths inside", machinePath, posixReason(code) + need);
    }
    return RootDirectory(std::move(root));
}

Result<UniqueFd> RootDirectory::openFile(const std::string& path, int flags, mode_t mode,
                                         std::string_view operation) const {
    if (const auto complaint = complaintAbout(path)) {
        return posixError(EINVAL, operation, path, *complaint);
    }
    UniqueFd opened = openInRoot(descriptor_.get(), path, flags, mode);
    if (!opened) return posixError(errno, operation, path);
    return opened;
}

Result<UniqueFd> RootDirectory::openDirectory(const std::string& path,
                                              std::string_view operation) const {
    return openFile(path, O_RDONLY | O_DIRECTORY, 0, operation);
}

Result<UniqueFd> RootDirectory::openDirectoryWithoutLinks(const std::string& path,
                                                          std::string_view operation) const {
    if (const auto complaint = complaintAbout(path)) {
        return posixError(EINVAL, operation, path, *complaint);
    }
    UniqueFd opened =
        openInRoot(descriptor_.get(), path, O_RDONLY | O_DIRECTORY, 0, RESOLVE_NO_SYMLINKS);
    if (!opened) return posixError(errno, operation, path);
    return opened;
}

Result<RegularFile> RootDirectory::openRegularFile(const std::string& path,
                                                   std::string_view operation) const {
    Result<UniqueFd> opened = openFile(path, O_RDONLY | O_NONBLOCK, 0, operation);
    if (!opened) return opened.error();
    struct stat status {};
    if (::fstat(opened->get(), &status) != 0) return posixError(errno, operation, path);
    if (S_ISDIR(status.st_mode)) return posixError(EISDIR, operation, path);
    if (!S_ISREG(status.st_mode)) {
        return posixError(EINVAL, operation, path, "it is not a regular file");
    }
    return RegularFile{std::move(*opened), static_cast<std::uint64_t>(status.st_size),
                       status.st_mode & (S_IRWXU | S_IRWXG | S_IRWXO)};
}

Result<ItemPlace> RootDirectory::place(const std::string& path, std::string_view operation) const {
    if (const auto complaint = complaintAbout(path)) {
        return posixError(EINVAL, operation, path, *complaint);
    }
    const std::size_t end = path.find_last_not_of('/') + 1;
    const std::size_t start = end == 0 ? 0 : path.rfind('/', end - 1) + 1;
    std::string name = machinePath(path.substr(start, end - start));
    if (name.empty() || name == "." || name == "..") {
        return posixError(EINVAL, operation, path, "the path does not end in a name");
    }
    UniqueFd directory =
        openInRoot(descriptor_.get(), path.substr(0, start), O_PATH | O_DIRECTORY, 0);
    if (!directory) return posixError(errno, operation, path);
    return ItemPlace{std::move(directory), std::move(name), end < path.size()};
}

Result<std::vector<std::string>> namesIn(int directory, std::string_view path) {
    UniqueFd own(::openat(directory, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!own) return posixError(errno, "list", path);
    const std::unique_ptr<DIR, CloseDirectory> stream(::fdopendir(own.get()));
    if (stream == nullptr) return posixError(errno, "list", path);
    static_cast<void>(own.release());  // the stream's now
    std::vector<std::string> names;
    errno = 0;
    while (const dirent* entry = ::readdir(stream.get())) {
        const std::string_view name = entry->d_name;
        if (name != "." && name != "..") names.emplace_back(name);
        errno = 0;
    }
    if (errno != 0) return posixError(errno, "list", path);
    return names;
}

}  // namespace appsync
