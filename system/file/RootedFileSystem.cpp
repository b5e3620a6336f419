#include "system/file/RootedFileSystem.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <optional>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "system/file/DescriptorIO.h"
#include "system/file/InPlaceWrite.h"
#include "system/file/PosixError.h"
#include "system/file/TemporaryFile.h"
#include "system/file/TreeWalk.h"

namespace appsync {

namespace {

constexpr std::string_view kDefaultAccount = "mobile";
constexpr mode_t kDirectoryPermissions = S_IRWXU | S_IRGRP | S_IXGRP | S_IROTH | S_IXOTH;

constexpr std::string_view kMakeDirectory = "create the directory";
constexpr std::string_view kCreate = "create";
constexpr std::string_view kCopy = "copy";
constexpr std::string_view kCopyTo = "copy something to";
constexpr std::string_view kExamine = "examine";
constexpr std::string_view kList = "list";
constexpr std::string_view kMove = "move";
constexpr std::string_view kMoveTo = "move something to";
constexpr std::string_view kRead = "read";
constexpr std::string_view kRemove = "remove";
constexpr std::string_view kClear = "clear temporary files in";
constexpr std::string_view kTouch = "set the times of";
constexpr std::string_view kWrite = "write";

/// Whom something is to be given to.
struct Ownership {
    std::optional<uid_t> user;
    std::optional<gid_t> group;
};

Result<MachineAccount> accountNamed(const AccountMap& accounts, const std::string& name,
                                    std::string_view operation, const std::string& path) {
    const auto found = accounts.find(name);
    if (found != accounts.end()) return found->second;
    return posixError(EINVAL, operation, path,
                      "the device has no account named '" + displayPath(name) + "'");
}

Result<Ownership> ownershipFor(const AccountMap& accounts, const FileAttributes& attributes,
                               std::string_view operation, const std::string& path) {
    Ownership result;
    if (attributes.owner) {
        const auto account = accountNamed(accounts, *attributes.owner, operation, path);
        if (!account) return account.error();
        result.user = account->user;
    }
    if (attributes.group) {
        const auto account = accountNamed(accounts, *attributes.group, operation, path);
        if (!account) return account.error();
        result.group = account->group;
    }
    return result;
}

/// Whether a path that begins with the directory leads out of it again by "..".
bool leavesDirectory(std::string_view path, std::string_view directory) {
    if (!path.starts_with(directory)) return false;
    path.remove_prefix(directory.size());
    if (!path.starts_with('/')) return false;
    int depth = 0;
    while (!path.empty() && depth >= 0) {
        const std::size_t end = std::min(path.find('/'), path.size());
        const std::string_view component = path.substr(0, end);
        if (component == "..") {
            --depth;
        } else if (!component.empty() && component != ".") {
            ++depth;
        }
        path.remove_prefix(std::min(end + 1, path.size()));
    }
    return depth < 0;
}

std::string below(const std::string& directory, const std::string& name) {
    return directory.ends_with('/') ? directory + name : directory + "/" + name;
}

bool isGivenTo(const struct stat& status, const Ownership& owner) {
    return status.st_uid == owner.user.value_or(status.st_uid) &&
           status.st_gid == owner.group.value_or(status.st_gid);
}

/// Gives an errno value, or 0. No system call is made that would change nothing: an ordinary
/// account may not make it.
int giveTo(int descriptor, const struct stat& status, const Ownership& owner) {
    if (isGivenTo(status, owner)) return 0;
    const uid_t user = owner.user.value_or(status.st_uid);
    const gid_t group = owner.group.value_or(status.st_gid);
    return ::fchown(descriptor, user, group) == 0 ? 0 : errno;
}

/// Only what is not the owner's yet has to be opened for that.
int giveDirectoryTo(const ItemPlace& place, const Ownership& owner) {
    if (!owner.user && !owner.group) return 0;
    const int parent = place.directory.get();
    struct stat status {};
    if (::fstatat(parent, place.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) return errno;
    if (S_ISDIR(status.st_mode) && isGivenTo(status, owner)) return 0;
    const int flags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
    const UniqueFd opened(::openat(parent, place.name.c_str(), flags));
    if (!opened || ::fstat(opened.get(), &status) != 0) return errno;
    return giveTo(opened.get(), status, owner);
}

Status makeDirectory(const RootDirectory& root, const std::string& path, const Ownership& owner) {
    Result<ItemPlace> place = root.place(path, kMakeDirectory);
    if (!place) return place.error();
    const int parent = place->directory.get();
    if (::mkdirat(parent, place->name.c_str(), kDirectoryPermissions) != 0) {
        return posixError(errno, kMakeDirectory, path);
    }
    const int error = giveDirectoryTo(*place, owner);
    if (error == 0) return {};
    ::unlinkat(parent, place->name.c_str(), AT_REMOVEDIR);
    return posixError(error, kMakeDirectory, path);
}

Status makeDirectoryUnlessThere(const RootDirectory& root, const std::string& path,
                                const Ownership& owner) {
    if (root.openDirectory(path)) return {};
    Status made = makeDirectory(root, path, owner);
    // Somebody else may have made it meanwhile.
    if (!made && root.openDirectory(path)) return {};
    return made;
}

Status makeDirectories(const RootDirectory& root, const std::string& path, const Ownership& owner) {
    const auto there = root.openDirectory(path, kMakeDirectory);
    if (there) return {};
    const std::int64_t code = there.error().code;
    if (code != ENOENT && code != ENOTDIR) return there.error();
    // Most often nothing but the last is missing.
    if (makeDirectory(root, path, owner)) return {};
    std::size_t end = 0;
    while (end != std::string::npos) {
        end = path.find('/', path.find_first_not_of('/', end));
        Status made = makeDirectoryUnlessThere(root, path.substr(0, end), owner);
        if (!made) return made;
    }
    return {};
}

/// Gives an errno value, or 0.
int renameUnlessThere(const ItemPlace& from, const ItemPlace& to) {
    const int source = from.directory.get();
    const int target = to.directory.get();
    if (::renameat2(source, from.name.c_str(), target, to.name.c_str(), RENAME_NOREPLACE) == 0) {
        return 0;
    }
    // These are the answers of a file system that knows no such flag.
    if (errno != EINVAL && errno != ENOSYS && errno != ENOTSUP) return errno;
    struct stat status {};
    if (::fstatat(target, to.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0) return EEXIST;
    return ::renameat(source, from.name.c_str(), target, to.name.c_str()) == 0 ? 0 : errno;
}

/// Gives an errno value, or 0.
int copyInto(const RegularFile& source, const ItemPlace& to) {
    const int flags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
    const UniqueFd target(::openat(to.directory.get(), to.name.c_str(), flags, source.permissions));
    if (!target) return errno;
    const int error = copyWhole(source.descriptor.get(), target.get());
    if (error != 0) ::unlinkat(to.directory.get(), to.name.c_str(), 0);
    return error;
}

int removeEntry(int directory, const std::string& name, int flags) {
    if (::unlinkat(directory, name.c_str(), flags) == 0 || errno == ENOENT) return 0;
    return errno == EEXIST ? ENOTEMPTY : errno;
}

TreeActions removal() {
    return {[](int directory, const std::string& name) { return removeEntry(directory, name, 0); },
            [](int parent, const std::string& name) {
                return removeEntry(parent, name, AT_REMOVEDIR);
            }};
}

Status removeAt(int parent, const std::string& name, const std::string& path) {
    if (::unlinkat(parent, name.c_str(), 0) == 0) return {};
    if (errno != EISDIR) return posixError(errno, kRemove, path);
    return walkTree(parent, name, removal(), kRemove, path);
}

TreeActions clearingOfTemporaries() {
    return {[](int directory, const std::string& name) {
                return isTemporaryName(name) ? removeIfStale(directory, name) : 0;
            },
            [](int, const std::string&) { return 0; }};
}

}  // namespace

Result<std::unique_ptr<RootedFileSystem>> RootedFileSystem::open(const std::string& machinePath,
                                                                 RootedFileSystemOptions options) {
    Result<RootDirectory> root = RootDirectory::open(machinePath);
    if (!root) return root.error();
    struct stat status {};
    if (::fstat(root->descriptor(), &status) != 0) return posixError(errno, kExamine, machinePath);
    options.accounts.try_emplace(std::string(kDefaultAccount),
                                 MachineAccount{status.st_uid, status.st_gid});
    std::unique_ptr<RootedFileSystem> result(
        new RootedFileSystem(std::move(*root), std::move(options)));
    Status made = result->createDirectory(result->temporaryDirectory_, true, nullptr);
    if (!made) return made.error();
    return result;
}

RootedFileSystem::RootedFileSystem(RootDirectory root, RootedFileSystemOptions options)
    : root_(std::move(root)),
      accounts_(std::move(options.accounts)),
      temporaryDirectory_(std::move(options.temporaryDirectory)) {}

bool RootedFileSystem::itemExists(const std::string& path) {
    return root_.openFile(path, O_PATH).ok();
}

Result<ItemAttributes> RootedFileSystem::attributes(const std::string& path) {
    const Result<UniqueFd> item = root_.openFile(path, O_PATH, 0, kExamine);
    if (!item) return item.error();
    struct stat status {};
    if (::fstat(item->get(), &status) != 0) return posixError(errno, kExamine, path);
    return ItemAttributes{static_cast<std::uint64_t>(status.st_size), S_ISDIR(status.st_mode)};
}

Status RootedFileSystem::createDirectory(const std::string& path, bool withIntermediates,
                                         const FileAttributes* attributes) {
    if (Status status = checkStays(path, kMakeDirectory); !status) return status;
    const FileAttributes wanted = attributes != nullptr ? *attributes : FileAttributes{};
    const Result<Ownership> owner = ownershipFor(accounts_, wanted, kMakeDirectory, path);
    if (!owner) return owner.error();
    return withIntermediates ? makeDirectories(root_, path, *owner)
                             : makeDirectory(root_, path, *owner);
}

Status RootedFileSystem::removeItem(const std::string& path) {
    if (Status status = checkStays(path, kRemove); !status) return status;
    const Result<ItemPlace> place = root_.place(path, kRemove);
    if (!place) return place.error();
    return removeAt(place->directory.get(), place->name, path);
}

Status RootedFileSystem::removeContents(const std::string& directory,
                                        const std::function<bool(const std::string& name)>& goes) {
    const Result<UniqueFd> opened = root_.openDirectoryWithoutLinks(directory, kRemove);
    if (!opened) return opened.error();
    const Result<std::vector<std::string>> names = namesIn(opened->get(), directory);
    if (!names) return names.error();
    Status first;
    for (const std::string& name : *names) {
        if (!goes(name)) continue;
        std::string path = directory;
        path.append("/").append(name);
        Status removed = removeAt(opened->get(), name, path);
        if (first && !removed) first = std::move(removed);
    }
    return first;
}

Status RootedFileSystem::moveItem(const std::string& from, const std::string& to) {
    if (Status status = checkStays(from, kMove); !status) return status;
    if (Status status = checkStays(to, kMoveTo); !status) return status;
    const Result<ItemPlace> source = root_.place(from, kMove);
    if (!source) return source.error();
    const Result<ItemPlace> target = root_.place(to, kMoveTo);
    if (!target) return target.error();
    const int error = renameUnlessThere(*source, *target);
    if (error != 0) return posixErrorBetween(error, kMove, from, to);
    return {};
}

Status RootedFileSystem::exchangeItem(const std::string& from, const std::string& to) {
    if (Status status = checkStays(from, kMove); !status) return status;
    if (Status status = checkStays(to, kMoveTo); !status) return status;
    const Result<ItemPlace> source = root_.place(from, kMove);
    if (!source) return source.error();
    const Result<ItemPlace> target = root_.place(to, kMoveTo);
    if (!target) return target.error();
    if (::renameat2(source->directory.get(), source->name.c_str(), target->directory.get(),
                    target->name.c_str(), RENAME_EXCHANGE) == 0) {
        return {};
    }
    if (errno == ENOENT) return moveItem(from, to);
    return posixErrorBetween(errno, "exchange", from, to);
}

Status RootedFileSystem::copyItem(const std::string& from, const std::string& to) {
    if (Status status = checkStays(to, kCopyTo); !status) return status;
    const Result<RegularFile> source = root_.openRegularFile(from, kCopy);
    if (!source) return source.error();
    const Result<ItemPlace> target = root_.place(to, kCopyTo);
    if (!target) return target.error();
    const int error = target->mustBeDirectory ? EISDIR : copyInto(*source, *target);
    if (error != 0) return posixErrorBetween(error, kCopy, from, to);
    return {};
}

Result<std::vector<std::string>> RootedFileSystem::names(const std::string& directory) const {
    const Result<UniqueFd> opened = root_.openDirectory(directory, kList);
    if (!opened) return opened.error();
    Result<std::vector<std::string>> found = namesIn(opened->get(), directory);
    if (found) std::sort(found->begin(), found->end());
    return found;
}

Status RootedFileSystem::copyDirectory(const std::string& from, const std::string& to) {
    if (below(to, "").starts_with(below(from, ""))) {
        return posixError(EINVAL, kCopy, from, "a directory cannot be copied into itself");
    }
    if (Result<UniqueFd> source = root_.openDirectory(from, kCopy); !source) return source.error();
    if (Status made = createDirectory(to, false, nullptr); !made) return made;
    Status copied = copyContents(from, to);
    if (!copied) removeItem(to).ignore();
    return copied;
}

Status RootedFileSystem::copyContents(const std::string& from, const std::string& to) {
    std::vector<std::pair<std::string, std::string>> directories{{from, to}};
    while (!directories.empty()) {
        const auto [source, target] = std::move(directories.back());
        directories.pop_back();
        const Result<std::vector<std::string>> found = names(source);
        if (!found) return found.error();
        for (const std::string& name : *found) {
            Status copied = copyEntry(below(source, name), below(target, name), directories);
            if (!copied) return copied;
        }
    }
    return {};
}

Status RootedFileSystem::copyEntry(const std::string& from, const std::string& to,
                                   std::vector<std::pair<std::string, std::string>>& directories) {
    const Result<UniqueFd> item = root_.openFile(from, O_PATH | O_NOFOLLOW, 0, kCopy);
    if (!item) return item.error();
    struct stat status {};
    if (::fstat(item->get(), &status) != 0) return posixError(errno, kCopy, from);
    if (S_ISREG(status.st_mode)) return copyItem(from, to);
    if (!S_ISDIR(status.st_mode)) {
        return posixError(EINVAL, kCopy, from, "it is neither a regular file nor a directory");
    }
    directories.emplace_back(from, to);
    return createDirectory(to, false, nullptr);
}

Result<Bytes> RootedFileSystem::readFile(const std::string& path) {
    const Result<RegularFile> file = root_.openRegularFile(path, kRead);
    if (!file) return file.error();
    Bytes contents;
    const int error = readWhole(file->descriptor.get(), file->size, kLargestFile, contents);
    if (error != 0) return posixError(error, kRead, path);
    return contents;
}

Status RootedFileSystem::writeFileAtomically(const std::string& path, ByteView contents) {
    if (Status status = checkStays(path, kWrite); !status) return status;
    if (writeInPlace(root_, path, contents)) return {};
    Result<TemporaryFile> file = TemporaryFile::create(root_, path);
    if (!file) return file.error();
    if (Status written = file->write(contents); !written) return written;
    if (!isTemporary(path)) {
        if (Status synced = file->sync(); !synced) return synced;
    }
    // The directory is not synced: after a power loss the old file may stand there, whole.
    return file->commit();
}

Status RootedFileSystem::createFile(const std::string& path, ByteView contents,
                                    const FileAttributes& attributes) {
    if (Status status = checkStays(path, kCreate); !status) return status;
    const Result<Ownership> owner = ownershipFor(accounts_, attributes, kCreate, path);
    if (!owner) return owner.error();
    Result<TemporaryFile> file = TemporaryFile::create(root_, path);
    if (!file) return file.error();
    if (const int error = giveTo(file->descriptor(), file->status(), *owner); error != 0) {
        return posixError(error, kCreate, path);
    }
    if (Status written = file->write(contents); !written) return written;
    return file->commit();
}

Status RootedFileSystem::setTimesToNow(const std::string& path) {
    const Result<UniqueFd> item = root_.openFile(path, O_PATH, 0, kTouch);
    if (!item) return item.error();
    if (::utimensat(item->get(), "", nullptr, AT_EMPTY_PATH) != 0) {
        return posixError(errno, kTouch, path);
    }
    return {};
}

Status RootedFileSystem::checkStays(const std::string& path, std::string_view operation) const {
    if (!leavesDirectory(path, temporaryDirectory_)) return {};
    return posixError(EACCES, operation, path, "the path leads out of " + temporaryDirectory_);
}

bool RootedFileSystem::isTemporary(std::string_view path) const {
    return path.starts_with(temporaryDirectory_) &&
           path.substr(temporaryDirectory_.size()).starts_with('/');
}

std::string RootedFileSystem::temporaryDirectory() { return temporaryDirectory_; }

Status RootedFileSystem::removeStaleTemporaries(const std::string& directory) {
    const Result<UniqueFd> opened = root_.openDirectory(directory, kClear);
    if (!opened) {
        return opened.error().code == ENOENT ? Status() : Status(opened.error());
    }
    return walkTree(opened->get(), ".", clearingOfTemporaries(), kClear, directory);
}

}  // namespace appsync
