#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include <sys/types.h>

#include "platform/Result.h"
#include "system/file/UniqueFd.h"

namespace appsync {

/// An open regular file.
struct RegularFile {
    UniqueFd descriptor;
    /// Its size in bytes when it was opened.
    std::uint64_t size = 0;
    /// Its permission bits.
    mode_t permissions = 0;
};

/// The directory that holds an item, and the item's name in it. The name is never empty, ".", or
/// "..", and holds no slash: system calls on it reach that one item and nothing else.
struct ItemPlace {
    /// Opened with O_PATH: good for the *at() calls.
    UniqueFd directory;
    std::string name;
    /// Whether a slash stood at the end of the path: only a directory may stand there.
    bool mustBeDirectory = false;
};

/// The directory of the machine that is a device's root. Every path is an absolute device path and
/// is resolved inside it by the kernel (openat2, RESOLVE_IN_ROOT): links, absolute ones included,
/// and ".." lead nowhere outside, whoever changes the tree meanwhile.
///
/// Callable on any thread, by several at once. Failures are errors of `kPosixErrorDomain` that name
/// the operation and the path: EINVAL for a path that is empty, not absolute, or holds a NUL;
/// ENAMETOOLONG for one that is too long, or has a name that is (system/file/MachinePath.h says
/// which longer names there are). Descriptors belong to the caller and are closed on exec.
class RootDirectory {
  public:
    /// Opens the root at a path of the machine. ENOSYS when the kernel cannot resolve inside a
    /// root.
    [[nodiscard]] static Result<RootDirectory> open(const std::string& machinePath);

    /// The root itself; still owned.
    [[nodiscard]] int descriptor() const noexcept { return descriptor_.get(); }

    /// Opens anything. `flags` and `mode` are those of open(2); O_CLOEXEC and O_NOCTTY are added. A
    /// link at the end is followed inside the root unless O_NOFOLLOW is given. Give O_NONBLOCK or
    /// O_PATH where a pipe could stand: opening one waits for its other end. `operation` is the
    /// verb of the error's sentence.
    [[nodiscard]] Result<UniqueFd> openFile(const std::string& path, int flags, mode_t mode = 0,
                                            std::string_view operation = "open") const;

    /// Opens a directory for reading, for sync, and for the *at() calls.
    [[nodiscard]] Result<UniqueFd> openDirectory(const std::string& path,
                                                 std::string_view operation = "open") const;

    /// The same where no part of the path is a link; ELOOP where one is. For whoever removes what
    /// the directory holds: nobody who may only put a link somewhere can turn that elsewhere.
    [[nodiscard]] Result<UniqueFd> openDirectoryWithoutLinks(
        const std::string& path, std::string_view operation = "open") const;

    /// Opens a regular file for reading. Anything else is refused without waiting on it: EISDIR for
    /// a directory, EINVAL for a pipe, a device, a socket.
    [[nodiscard]] Result<RegularFile> openRegularFile(const std::string& path,
                                                      std::string_view operation = "read") const;

    /// Where the item stands or would stand; its directory must exist. The item itself may be
    /// absent, and is not followed if it is a link. EINVAL for the root and for paths that end in
    /// "." or "..".
    [[nodiscard]] Result<ItemPlace> place(const std::string& path,
                                          std::string_view operation = "open") const;

  private:
    explicit RootDirectory(UniqueFd descriptor) : descriptor_(std::move(descriptor)) {}

    UniqueFd descriptor_;
};

/// The names in the directory that a descriptor refers to, without "." and "..".
[[nodiscard]] Result<std::vector<std::string>> namesIn(int directory, std::string_view path);

}  // namespace appsync
