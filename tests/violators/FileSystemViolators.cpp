#include <cerrno>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "contract/forwarding/ForwardingFileSystem.h"
#include "platform/Error.h"
#include "tests/violators/Violator.h"

namespace appsync {
namespace {

ErrorRecord posix(std::int64_t code, const std::string& path) {
    return ErrorRecord::make(kPosixErrorDomain, code, "violated: '" + path + "'");
}

/// A wrapper that knows which links and pipes there are.
class WithSystem : public ForwardingFileSystem {
  public:
    WithSystem(FileSystem& target, ForwardingSystem& system)
        : ForwardingFileSystem(target), system_(system) {}

  protected:
    /// What a link leads to, as it was made; empty for anything else.
    [[nodiscard]] std::string linkAt(const std::string& path) const {
        const auto found = system_.links().find(path);
        if (found == system_.links().end()) return {};
        if (found->second.starts_with('/')) return found->second;
        return path.substr(0, path.rfind('/') + 1) + found->second;
    }
    [[nodiscard]] bool isPipe(const std::string& path) const { return system_.isPipe(path); }

  private:
    ForwardingSystem& system_;
};

struct EverythingExists : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    bool itemExists(const std::string&) override { return true; }
};
struct DirectoriesDoNotExist : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    bool itemExists(const std::string& path) override {
        const auto found = target().attributes(path);
        return found.ok() && !found->isDirectory;
    }
};
struct NoSizes : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Result<ItemAttributes> attributes(const std::string& path) override {
        auto found = target().attributes(path);
        if (found) found->size = 0;
        return found;
    }
};
struct NothingIsADirectory : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Result<ItemAttributes> attributes(const std::string& path) override {
        auto found = target().attributes(path);
        if (found) found->isDirectory = false;
        return found;
    }
};
struct ExistingParentsAreFailures : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status createDirectory(const std::string& path, bool withIntermediates,
                           const FileAttributes* attributes) override {
        if (target().itemExists(path)) return posix(EEXIST, path);
        return target().createDirectory(path, withIntermediates, attributes);
    }
};
struct ParentsAreAlwaysMade : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status createDirectory(const std::string& path, bool,
                           const FileAttributes* attributes) override {
        if (target().itemExists(path)) return posix(EEXIST, path);
        return target().createDirectory(path, true, attributes);
    }
};
struct ParentsAreNeverMade : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status createDirectory(const std::string& path, bool,
                           const FileAttributes* attributes) override {
        if (target().itemExists(path)) return {};
        return target().createDirectory(path, false, attributes);
    }
};
struct DirectoriesBelongToNobody : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status createDirectory(const std::string& path, bool withIntermediates,
                           const FileAttributes*) override {
        return target().createDirectory(path, withIntermediates, nullptr);
    }
};
struct GroupsAreForgotten : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status createFile(const std::string& path, ByteView contents,
                      const FileAttributes& attributes) override {
        return target().createFile(path, contents, {attributes.owner, std::nullopt});
    }
};
struct UnknownOwnersAreIgnored : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status createFile(const std::string& path, ByteView contents,
                      const FileAttributes& attributes) override {
        Status status = target().createFile(path, contents, attributes);
        return status ? status : target().createFile(path, contents, {});
    }
};
struct UnknownOwnersLeaveADirectory : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status createDirectory(const std::string& path, bool withIntermediates,
                           const FileAttributes* attributes) override {
        Status status = target().createDirectory(path, withIntermediates, attributes);
        if (!status) target().createDirectory(path, withIntermediates, nullptr).ignore();
        return status;
    }
};
struct OnlyFilesAreRemoved : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status removeItem(const std::string& path) override {
        const auto found = target().attributes(path);
        if (found && found->isDirectory) return posix(EISDIR, path);
        return target().removeItem(path);
    }
};
struct RemovingNothingIsFine : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status removeItem(const std::string& path) override {
        target().removeItem(path).ignore();
        return {};
    }
};
struct RemovesWhatLinksPointTo : WithSystem {
    using WithSystem::WithSystem;
    Status removeItem(const std::string& path) override {
        const std::string to = linkAt(path);
        return target().removeItem(to.empty() ? path : to);
    }
};
struct MovingReplaces : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status moveItem(const std::string& from, const std::string& to) override {
        if (target().itemExists(from) && from != to) target().removeItem(to).ignore();
        return target().moveItem(from, to);
    }
};
struct MovingCopies : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status moveItem(const std::string& from, const std::string& to) override {
        const auto found = target().attributes(from);
        if (found && !found->isDirectory) return target().copyItem(from, to);
        Status moved = target().moveItem(from, to);
        if (moved) return target().createDirectory(from, true, nullptr);
        return moved;
    }
};
struct CopyingReplaces : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status copyItem(const std::string& from, const std::string& to) override {
        const auto contents = target().readFile(from);
        if (!contents) return contents.error();
        return target().createFile(to, *contents, {});
    }
};
struct CopyingMoves : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status copyItem(const std::string& from, const std::string& to) override {
        Status copied = target().copyItem(from, to);
        if (copied) target().removeItem(from).ignore();
        return copied;
    }
};
struct DirectoriesAreCopied : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status copyItem(const std::string& from, const std::string& to) override {
        const auto found = target().attributes(from);
        if (found && found->isDirectory) return target().createDirectory(to, false, nullptr);
        return target().copyItem(from, to);
    }
};
struct PipesAreEmptyFiles : WithSystem {
    using WithSystem::WithSystem;
    Result<Bytes> readFile(const std::string& path) override {
        return isPipe(path) ? Bytes{} : target().readFile(path);
    }
};
struct LinksAreNotFollowed : WithSystem {
    using WithSystem::WithSystem;
    Result<Bytes> readFile(const std::string& path) override {
        if (!linkAt(path).empty()) return posix(ELOOP, path);
        return target().readFile(path);
    }
};
struct ReadingIsCached : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Result<Bytes> readFile(const std::string& path) override {
        const auto known = cache_.find(path);
        if (known != cache_.end()) return known->second;
        auto contents = target().readFile(path);
        if (contents) cache_[path] = *contents;
        return contents;
    }
    std::map<std::string, Bytes> cache_;
};
struct ReadingStopsAtABlock : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Result<Bytes> readFile(const std::string& path) override {
        auto contents = target().readFile(path);
        if (contents && contents->size() > 65536) contents->resize(65536);
        return contents;
    }
};
struct ReadingStopsAtAZero : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Result<Bytes> readFile(const std::string& path) override {
        auto contents = target().readFile(path);
        if (!contents) return contents;
        const std::string text(contents->begin(), contents->end());
        return Bytes(contents->begin(), contents->begin() + static_cast<std::ptrdiff_t>(std::min(
                                                                text.find('\0'), text.size())));
    }
};
struct TemporaryFilesStay : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status writeFileAtomically(const std::string& path, ByteView contents) override {
        Status written = target().writeFileAtomically(path, contents);
        if (written) target().createFile(path + ".temporary", contents, {}).ignore();
        return written;
    }
};
struct WritesInTwoSteps : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status writeFileAtomically(const std::string& path, ByteView contents) override {
        if (target().itemExists(path)) {
            Status half = target().createFile(path, contents.first(contents.size() / 2), {});
            if (!half) return half;
        }
        return target().writeFileAtomically(path, contents);
    }
};
struct RemovesBeforeItWrites : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status writeFileAtomically(const std::string& path, ByteView contents) override {
        const auto found = target().attributes(path);
        if (found && !found->isDirectory) target().removeItem(path).ignore();
        return target().writeFileAtomically(path, contents);
    }
};
struct AFailedWriteLosesTheOldFile : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status writeFileAtomically(const std::string& path, ByteView contents) override {
        Status written = target().writeFileAtomically(path, contents);
        if (!written) target().removeItem(path).ignore();
        return written;
    }
};
struct WritesThroughLinks : WithSystem {
    using WithSystem::WithSystem;
    Status writeFileAtomically(const std::string& path, ByteView contents) override {
        const std::string to = linkAt(path);
        return target().writeFileAtomically(to.empty() ? path : to, contents);
    }
};
struct CreatingDoesNotReplace : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status createFile(const std::string& path, ByteView contents,
                      const FileAttributes& attributes) override {
        if (target().itemExists(path)) return posix(EEXIST, path);
        return target().createFile(path, contents, attributes);
    }
};
struct CreatingDoesNotTruncate : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status createFile(const std::string& path, ByteView contents,
                      const FileAttributes& attributes) override {
        Bytes whole(contents.begin(), contents.end());
        if (const auto old = target().readFile(path); old && old->size() > whole.size()) {
            whole.insert(whole.end(), old->begin() + static_cast<std::ptrdiff_t>(whole.size()),
                         old->end());
        }
        return target().createFile(path, whole, attributes);
    }
};
struct TimesOfNothingAreSet : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status setTimesToNow(const std::string&) override { return {}; }
};
struct TemporaryDirectoryWithASlash : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    std::string temporaryDirectory() override { return target().temporaryDirectory() + "/"; }
};
struct TemporaryDirectoryIsMissing : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    std::string temporaryDirectory() override { return "/tmp/of/another/process"; }
};
struct PathsEndAtAZero : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Result<Bytes> readFile(const std::string& path) override {
        return target().readFile(path.c_str());
    }
};
struct RelativePathsAreTaken : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Result<Bytes> readFile(const std::string& path) override {
        return target().readFile(path.starts_with('/') ? path : "/" + path);
    }
};
struct ErrorsOfAnotherDomain : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status moveItem(const std::string& from, const std::string& to) override {
        const Status status = target().moveItem(from, to);
        if (status) return status;
        return ErrorRecord::make("Files", status.error().code, status.error().description());
    }
};
struct ErrorsWithoutADomain : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Result<Bytes> readFile(const std::string& path) override {
        auto contents = target().readFile(path);
        if (contents) return contents;
        return ErrorRecord::make("", contents.error().code, contents.error().description());
    }
};
struct ErrorsWithoutASentence : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Result<Bytes> readFile(const std::string& path) override {
        auto contents = target().readFile(path);
        if (contents) return contents;
        return ErrorRecord{contents.error().domain, contents.error().code, {}};
    }
};
struct EveryErrorIsAnInputError : ForwardingFileSystem {
    using ForwardingFileSystem::ForwardingFileSystem;
    Status copyItem(const std::string& from, const std::string& to) override {
        const Status status = target().copyItem(from, to);
        if (status) return status;
        return posix(EIO, from);
    }
};

/// A root that is nothing but a prefix of paths: ".." and absolute links lead out of it.
class PrefixedFileSystem : public ForwardingFileSystem {
  public:
    explicit PrefixedFileSystem(FileSystem& target) : ForwardingFileSystem(target) {}

    bool itemExists(const std::string& path) override { return target().itemExists(inside(path)); }
    Result<ItemAttributes> attributes(const std::string& path) override {
        return target().attributes(inside(path));
    }
    Status createDirectory(const std::string& path, bool withIntermediates,
                           const FileAttributes* attributes) override {
        return target().createDirectory(inside(path), withIntermediates, attributes);
    }
    Status removeItem(const std::string& path) override {
        return target().removeItem(inside(path));
    }
    Status moveItem(const std::string& from, const std::string& to) override {
        return target().moveItem(inside(from), inside(to));
    }
    Status copyItem(const std::string& from, const std::string& to) override {
        return target().copyItem(inside(from), inside(to));
    }
    Result<Bytes> readFile(const std::string& path) override {
        return target().readFile(inside(path));
    }
    Status writeFileAtomically(const std::string& path, ByteView contents) override {
        return target().writeFileAtomically(inside(path), contents);
    }
    Status createFile(const std::string& path, ByteView contents,
                      const FileAttributes& attributes) override {
        return target().createFile(inside(path), contents, attributes);
    }
    Status setTimesToNow(const std::string& path) override {
        return target().setTimesToNow(inside(path));
    }

    /// Paths that are none are left to the target.
    static std::string inside(const std::string& path) {
        return path.starts_with('/') ? "/var/mobile" + path : path;
    }
};

class PrefixedSystem : public SystemWith<PrefixedFileSystem> {
  public:
    using SystemWith::SystemWith;
    void addLink(const std::string& path, const std::string& target) override {
        SystemWith::addLink(PrefixedFileSystem::inside(path), target);
    }
    void addPipe(const std::string& path) override {
        SystemWith::addPipe(PrefixedFileSystem::inside(path));
    }
    bool belongsTo(const std::string& path, const FileAttributes& accounts) override {
        return SystemWith::belongsTo(PrefixedFileSystem::inside(path), accounts);
    }
    std::vector<std::string> names(const std::string& directory) override {
        return SystemWith::names(PrefixedFileSystem::inside(directory));
    }
};

ContractPort prefixedPort() {
    return {
        "PathsLeaveTheRoot",
        [] { return std::make_unique<PrefixedSystem>(makeSimulatedSystem(Scheduling::seeded(1))); },
        nullptr,
        {}};
}

}  // namespace

std::vector<Violator> fileSystemViolators() {
    Violators v("platform/FileSystem.h", "*FileSystem*");
    v.system<EverythingExists>("EverythingExists", "Whether a file or a directory stands there.");
    v.system<DirectoriesDoNotExist>("DirectoriesDoNotExist",
                                    "Whether a file or a directory stands there.");
    v.system<NoSizes>("NoSizes", "What stands at a path.");
    v.system<NothingIsADirectory>("NothingIsADirectory", "What stands at a path.");
    v.system<ExistingParentsAreFailures>("ExistingParentsAreFailures",
                                         "Makes a directory; the parents too, if asked for, and "
                                         "then one that exists is no failure.");
    v.system<ParentsAreAlwaysMade>("ParentsAreAlwaysMade",
                                   "Makes a directory; the parents too, if asked for, and then one "
                                   "that exists is no failure.");
    v.system<ParentsAreNeverMade>("ParentsAreNeverMade",
                                  "Makes a directory; the parents too, if asked for, and then one "
                                  "that exists is no failure.");
    v.system<DirectoriesBelongToNobody>(
        "DirectoriesBelongToNobody",
        "Whom a new file or directory belongs to: account names of the device.");
    v.system<GroupsAreForgotten>(
        "GroupsAreForgotten",
        "Whom a new file or directory belongs to: account names of the device.");
    v.system<UnknownOwnersAreIgnored>(
        "UnknownOwnersAreIgnored",
        "One that the device does not know is refused with EINVAL, and nothing is made.");
    v.system<UnknownOwnersLeaveADirectory>(
        "UnknownOwnersLeaveADirectory",
        "One that the device does not know is refused with EINVAL, and nothing is made.");
    v.system<OnlyFilesAreRemoved>(
        "OnlyFilesAreRemoved",
        "Removes a file, a link (not what it points to) or a directory with everything in it, "
        "which is not one step: a failure or a crash may leave a part.");
    v.system<RemovesWhatLinksPointTo>(
        "RemovesWhatLinksPointTo",
        "Removes a file, a link (not what it points to) or a directory with everything in it, "
        "which is not one step: a failure or a crash may leave a part.");
    v.system<RemovingNothingIsFine>("RemovingNothingIsFine", "ENOENT when there is none.");
    v.system<MovingReplaces>("MovingReplaces", "EEXIST when something stands at `to`.");
    v.system<MovingCopies>("MovingCopies", "Renames.");
    v.system<CopyingReplaces>("CopyingReplaces", "EEXIST when something stands at `to`.");
    v.system<CopyingMoves>("CopyingMoves", "Copies a regular file.");
    v.system<DirectoriesAreCopied>(
        "DirectoriesAreCopied",
        "Nothing but regular files is ever read or copied: a link at the end of a path is followed "
        "inside the root; a device or a pipe is refused without waiting on it.");
    v.system<PipesAreEmptyFiles>(
        "PipesAreEmptyFiles",
        "Nothing but regular files is ever read or copied: a link at the end of a path is followed "
        "inside the root; a device or a pipe is refused without waiting on it.");
    v.system<LinksAreNotFollowed>(
        "LinksAreNotFollowed",
        "Nothing but regular files is ever read or copied: a link at the end of a path is followed "
        "inside the root; a device or a pipe is refused without waiting on it.");
    v.system<ReadingIsCached>("ReadingIsCached", "The whole file, past any cache of the process.");
    v.system<ReadingStopsAtABlock>("ReadingStopsAtABlock",
                                   "The whole file, past any cache of the process.");
    v.system<ReadingStopsAtAZero>("ReadingStopsAtAZero",
                                  "The whole file, past any cache of the process.");
    v.system<TemporaryFilesStay>(
        "TemporaryFilesStay",
        "After a failure or a crash at any instant the old file is there or the new one, and no "
        "temporary file stays for good.");
    v.system<AFailedWriteLosesTheOldFile>(
        "AFailedWriteLosesTheOldFile",
        "After a failure or a crash at any instant the old file is there or the new one, and no "
        "temporary file stays for good.");
    v.system<WritesInTwoSteps>(
        "WritesInTwoSteps",
        "Writes the file whole: temporary file in the same directory, sync, rename; or otherwise, "
        "where that comes to the same.");
    v.system<RemovesBeforeItWrites>(
        "RemovesBeforeItWrites",
        "Writes the file whole: temporary file in the same directory, sync, rename; or otherwise, "
        "where that comes to the same.");
    v.system<WritesThroughLinks>("WritesThroughLinks",
                                 "A link at the path is replaced, not followed.");
    v.system<CreatingDoesNotReplace>(
        "CreatingDoesNotReplace", "Creates or replaces a file, not atomically: nothing is synced.");
    v.system<CreatingDoesNotTruncate>(
        "CreatingDoesNotTruncate",
        "Creates or replaces a file, not atomically: nothing is synced.");
    v.system<TimesOfNothingAreSet>("TimesOfNothingAreSet",
                                   "Sets the times of last access and modification to now.");
    v.system<TemporaryDirectoryWithASlash>(
        "TemporaryDirectoryWithASlash",
        "The process's directory for temporary files, without a slash at its end.");
    v.system<TemporaryDirectoryIsMissing>(
        "TemporaryDirectoryIsMissing",
        "It exists, and what is in it goes with the process: the device empties it before the next "
        "one begins.");
    v.system<PathsEndAtAZero>("PathsEndAtAZero", "A path that holds a NUL is refused.");
    v.system<RelativePathsAreTaken>("RelativePathsAreTaken",
                                    "EINVAL: the path is empty, not absolute or holds a NUL;");
    v.add(prefixedPort(),
          "Paths are absolute device paths; they are resolved inside the device's root, links and "
          "\"..\" included, and lead nowhere else.");
    v.system<ErrorsOfAnotherDomain>(
        "ErrorsOfAnotherDomain",
        "Failures are errors of `kPosixErrorDomain` with the errno value and a sentence that names "
        "the operation and the path.");
    v.system<ErrorsWithoutADomain>(
        "ErrorsWithoutADomain",
        "Failures are errors of `kPosixErrorDomain` with the errno value and a sentence that names "
        "the operation and the path.");
    v.system<ErrorsWithoutASentence>(
        "ErrorsWithoutASentence",
        "Failures are errors of `kPosixErrorDomain` with the errno value and a sentence that names "
        "the operation and the path.");
    v.system<EveryErrorIsAnInputError>(
        "EveryErrorIsAnInputError",
        "Failures are errors of `kPosixErrorDomain` with the errno value and a sentence that names "
        "the operation and the path.");
    return v.take();
}

}  // namespace appsync
