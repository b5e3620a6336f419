#pragma once

// system/file: the files of a device below one directory, as any device on POSIX can use them.
// `RootedFileSystem` (this header) is a service of platform/, over RootDirectory.h, which no path
// leads out of; MachinePath.h, TreeWalk.h, TemporaryFile.h, InPlaceWrite.h, DescriptorIO.h,
// UniqueFd.h, RandomBytes.h and PosixError.h are what it and others need.
//
// Includes platform/ and POSIX. Called by system/, device/ and host/; a port to another POSIX
// device takes it as it is (docs/porting.md).

#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <sys/types.h>

#include "platform/FileSystem.h"
#include "system/file/RootDirectory.h"

namespace appsync {

/// An account of the machine.
struct MachineAccount {
    uid_t user = 0;
    gid_t group = 0;
};

/// From account names of the device to accounts of the machine.
using AccountMap = std::map<std::string, MachineAccount, std::less<>>;

/// How to make a `RootedFileSystem`.
struct RootedFileSystemOptions {
    /// The accounts that file attributes may name. "mobile" is added where it is missing: whoever
    /// owns the root directory.
    AccountMap accounts;
    /// The process's directory for temporary files, an absolute device path; it is made if absent.
    std::string temporaryDirectory = "/tmp";
};

/// A device's files in a directory of this machine.
///
/// Files are written through a temporary file in the same directory, named after the target (see
/// `isTemporaryName`); the finished file takes the target's name, and where the target was a link,
/// the link's place. Only a change of a few bytes is written in place (system/file/InPlaceWrite.h).
/// A file that is replaced keeps its permissions and its owner. A crash can leave a temporary file;
/// `removeStaleTemporaries` clears it.
///
/// What begins with the path of the temporary directory is changed there only: where ".." would
/// lead out of it, nothing is made, changed or removed, and the error is EACCES.
class RootedFileSystem : public FileSystem {
  public:
    /// The largest file that `readFile` reads.
    static constexpr std::uint64_t kLargestFile = std::uint64_t{1} << 30U;

    /// Opens the device whose root is at a path of the machine.
    [[nodiscard]] static Result<std::unique_ptr<RootedFileSystem>> open(
        const std::string& machinePath, RootedFileSystemOptions options = {});

    /// The root, for work that needs descriptors. Lives as long as this object.
    [[nodiscard]] const RootDirectory& root() const noexcept { return root_; }

    [[nodiscard]] bool itemExists(const std::string& path) override;
    Result<ItemAttributes> attributes(const std::string& path) override;
    Status createDirectory(const std::string& path, bool withIntermediates,
                           const FileAttributes* attributes) override;
    Status removeItem(const std::string& path) override;
    Status moveItem(const std::string& from, const std::string& to) override;
    Status copyItem(const std::string& from, const std::string& to) override;
    Result<Bytes> readFile(const std::string& path) override;
    Status writeFileAtomically(const std::string& path, ByteView contents) override;
    Status createFile(const std::string& path, ByteView contents,
                      const FileAttributes& attributes) override;
    Status setTimesToNow(const std::string& path) override;
    [[nodiscard]] std::string temporaryDirectory() override;

    // Beyond the interface: for the registry of a device, which copies and sweeps whole
    // directories.

    /// The names in a directory, sorted, without "." and "..".
    [[nodiscard]] Result<std::vector<std::string>> names(const std::string& directory) const;

    /// Copies a directory with everything in it, such as a placeholder bundle, at whatever depth a
    /// path may have. EEXIST when something stands at `to`, whose parent must exist. What is
    /// neither a regular file nor a directory is refused: EINVAL, for links too, and for a copy
    /// into itself. After a failure nothing stands at `to`; a crash may leave a part. Nothing is
    /// synced.
    Status copyDirectory(const std::string& from, const std::string& to);

    /// Puts what stands at `from` in the place of `to`, in one step. What stood there stands at
    /// `from` afterwards; where nothing did, this is `moveItem`. An error on a file system that
    /// cannot do it in one step.
    Status exchangeItem(const std::string& from, const std::string& to);

    /// Removes what stands in the directory under the names that `goes` accepts. Refused where a
    /// part of the path is a link. Everything is tried; tells the first failure.
    Status removeContents(const std::string& directory,
                          const std::function<bool(const std::string& name)>& goes);

    /// Removes, from the directory and everything below it, the temporary files that crashed
    /// processes left. Those that a living process is writing are left alone. No failure when there
    /// is no such directory.
    Status removeStaleTemporaries(const std::string& directory);

  private:
    RootedFileSystem(RootDirectory root, RootedFileSystemOptions options);

    Status copyContents(const std::string& from, const std::string& to);
    Status copyEntry(const std::string& from, const std::string& to,
                     std::vector<std::pair<std::string, std::string>>& directories);

    /// Refuses a path to something in the temporary directory that lies elsewhere.
    [[nodiscard]] Status checkStays(const std::string& path, std::string_view operation) const;

    /// Whether a path that stays where it begins is one of something in the temporary directory.
    [[nodiscard]] bool isTemporary(std::string_view path) const;

    const RootDirectory root_;
    const AccountMap accounts_;
    const std::string temporaryDirectory_;
};

}  // namespace appsync
