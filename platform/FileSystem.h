#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

/// Whom a new file or directory belongs to: account names of the device. One that the device does
/// not know is refused with EINVAL, and nothing is made.
struct FileAttributes {
    std::optional<std::string> owner;
    std::optional<std::string> group;
};

/// What stands at a path.
struct ItemAttributes {
    std::uint64_t size = 0;
    bool isDirectory = false;
};

/// The device's files. Paths are absolute device paths; they are resolved inside the device's root,
/// links and ".." included, and lead nowhere else. A path that holds a NUL is refused.
///
/// Callable on any thread; two threads must not change one file at once (the atomic operations
/// may). Failures are errors of `kPosixErrorDomain` with the errno value and a sentence that names
/// the operation and the path. Nothing but regular files is ever read or copied: a link at the end
/// of a path is followed inside the root; a device or a pipe is refused without waiting on it.
///
/// What the errno values say, in every operation that has an error:
///
/// - ENOENT: the item is missing, or the directory that it is to stand in.
/// - ENOTDIR: the path goes on below a file.
/// - EISDIR: a directory stands where a file is to be read or written.
/// - EINVAL: the path is empty, not absolute or holds a NUL; what is read or copied is neither a
///   file nor a directory.
/// - ENAMETOOLONG: a name has more than 255 bytes, or the path more than the device takes.
/// - ELOOP: links lead in a circle.
///
/// The end of the process, however it comes, undoes nothing that a call has done. A loss of power
/// may undo what was done since the device last synced its files, which it does with the install of
/// each application and at the end of a session, and nobody else has to:
///
/// - `writeFileAtomically` leaves the old file or the new one, whole: an old one may come back, not
///   only the last. In the temporary directory it leaves no more than `createFile` does.
/// - `createFile` and `copyItem` leave what was there before, or the new file, or a part of it: cut
///   off, empty, or with zeros for what is missing.
/// - `createDirectory`, `moveItem` and `removeItem` are done or not; an item that is moved stands
///   in one of the two places.
/// - Of a directory that is removed with what it holds, a part may be gone.
/// - What was done later may stay although what was done before it is undone.
///
/// Both may leave temporary files (`.<name>.appsync-` and six characters) beside a file that was
/// being written; the device clears them when it is next opened, wherever the plug-in writes.
class FileSystem {
  public:
    virtual ~FileSystem() = default;

    /// Whether a file or a directory stands there. A link that leads to nothing is neither.
    [[nodiscard]] virtual bool itemExists(const std::string& path) = 0;
    virtual Result<ItemAttributes> attributes(const std::string& path) = 0;

    /// Makes a directory; the parents too, if asked for, and then one that exists is no failure.
    /// Else EEXIST, whatever stands there. A file in the way of it or of a parent is a failure.
    /// `attributes` may be null: whatever the device gives by default.
    virtual Status createDirectory(const std::string& path, bool withIntermediates,
                                   const FileAttributes* attributes) = 0;

    /// Removes a file, a link (not what it points to) or a directory with everything in it, which
    /// is not one step: a failure or a crash may leave a part. ENOENT when there is none.
    virtual Status removeItem(const std::string& path) = 0;

    /// Renames. EEXIST when something stands at `to`. EINVAL when `to` lies inside `from`.
    virtual Status moveItem(const std::string& from, const std::string& to) = 0;

    /// Copies a regular file. EEXIST when something stands at `to`.
    virtual Status copyItem(const std::string& from, const std::string& to) = 0;

    /// The whole file, past any cache of the process.
    virtual Result<Bytes> readFile(const std::string& path) = 0;

    /// Writes the file whole: temporary file in the same directory, sync, rename; or otherwise,
    /// where that comes to the same. After a failure or a crash at any instant the old file is
    /// there or the new one, and no temporary file stays for good. Everybody reads the new one from
    /// now on; a loss of power may bring an old one back, see above. A link at the path is
    /// replaced, not followed.
    virtual Status writeFileAtomically(const std::string& path, ByteView contents) = 0;

    /// Creates or replaces a file, not atomically: nothing is synced. `attributes` as with
    /// directories.
    virtual Status createFile(const std::string& path, ByteView contents,
                              const FileAttributes& attributes) = 0;

    /// Sets the times of last access and modification to now.
    virtual Status setTimesToNow(const std::string& path) = 0;

    /// The process's directory for temporary files, without a slash at its end. It exists, and what
    /// is in it goes with the process: the device empties it before the next one begins.
    [[nodiscard]] virtual std::string temporaryDirectory() = 0;
};

}  // namespace appsync
