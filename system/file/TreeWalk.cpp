#include "system/file/TreeWalk.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <optional>
#include <utility>
#include <vector>

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "system/file/PosixError.h"
#include "system/file/UniqueFd.h"

namespace appsync {

namespace {

constexpr int kMostVisits = 16;
/// Of the directories that lead to where the walk is, so many stay open, the outermost.
constexpr std::size_t kMostOpen = 8;
constexpr std::size_t kEntriesBytes = std::size_t{32} << 10U;

/// Which directory it is, whatever its name.
struct Identity {
    dev_t device = 0;
    ino_t inode = 0;
    friend bool operator==(const Identity&, const Identity&) = default;
};

/// A directory that the walk is in.
struct Level {
    std::string name;
    UniqueFd directory;                       // closed while the walk is far below
    std::optional<Identity> identity;         // of one that is closed meanwhile
    std::vector<std::string> subdirectories;  // still to be entered
    int visits = 0;
};

std::optional<Identity> identityOf(int descriptor) {
    struct stat status {};
    if (::fstat(descriptor, &status) != 0) return std::nullopt;
    return Identity{status.st_dev, status.st_ino};
}

bool isDirectory(int directory, const dirent64& entry) {
    if (entry.d_type != DT_UNKNOWN) return entry.d_type == DT_DIR;
    struct stat status {};
    return ::fstatat(directory, entry.d_name, &status, AT_SYMLINK_NOFOLLOW) == 0 &&
           S_ISDIR(status.st_mode);
}

bool isRemoved(int directory) {
    struct stat status {};
    return ::fstat(directory, &status) == 0 && status.st_nlink == 0;
}

UniqueFd openSubdirectory(int parent, const char* name) {
    return UniqueFd(::openat(parent, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
}

class TreeWalk {
  public:
    TreeWalk(int top, const TreeActions& actions)  // NOLINT(*-member-init): what is read fills it
        : top_(top), actions_(actions) {}

    /// An errno value, or 0.
    int run(const std::string& name) {
        int error = enter(top_, name);
        while (error == 0 && !levels_.empty()) error = step();
        return error;
    }

    /// Where the walk is, below its top.
    [[nodiscard]] std::string whereabouts() const {
        std::string path;
        for (std::size_t i = 1; i < levels_.size(); ++i) path += "/" + levels_[i].name;
        if (!failedName_.empty()) path += "/" + failedName_;
        return path;
    }

  private:
    int step() {
        std::vector<std::string>& waiting = levels_.back().subdirectories;
        if (waiting.empty()) return leave();
        const std::string name = std::move(waiting.back());
        waiting.pop_back();
        return enter(levels_.back().directory.get(), name);
    }

    int enter(int parent, const std::string& name) {
        UniqueFd opened = openSubdirectory(parent, name.c_str());
        if (!opened) return explainRefusal(parent, name, errno);
        std::optional<Identity> identity;
        if (levels_.size() >= kMostOpen) {
            identity = identityOf(opened.get());
            if (!identity) return errno;
        }
        if (levels_.size() > kMostOpen) levels_.back().directory.reset();
        levels_.push_back({name, std::move(opened), identity, {}, 0});
        return visit();
    }

    /// What could not be entered has gone, is no directory any more, or is really refused.
    int explainRefusal(int parent, const std::string& name, int error) {
        if (error == ENOENT) return 0;
        if (error == ENOTDIR || error == ELOOP) error = actions_.item(parent, name);
        if (error != 0 && !levels_.empty()) failedName_ = name;
        return error;
    }

    int visit() {
        const int directory = levels_.back().directory.get();
        if (levels_.back().visits++ > 0 && ::lseek(directory, 0, SEEK_SET) != 0) return errno;
        while (true) {
            const ssize_t size = ::getdents64(directory, entries_.data(), entries_.size());
            // A directory that was removed has no entries.
            if (size < 0) return errno == ENOENT ? 0 : errno;
            if (size == 0) return 0;
            if (const int error = visitEntries(static_cast<std::size_t>(size)); error != 0) {
                return error;
            }
        }
    }

    int visitEntries(std::size_t size) {
        for (std::size_t at = 0; at < size;) {
            const auto& entry = *reinterpret_cast<const dirent64*>(&entries_.at(at));
            at += entry.d_reclen;
            const std::string name = &entry.d_name[0];
            if (name == "." || name == "..") continue;
            if (const int error = visitEntry(entry, name); error != 0) return error;
        }
        return 0;
    }

    int visitEntry(const dirent64& entry, const std::string& name) {
        const int directory = levels_.back().directory.get();
        const int error = isDirectory(directory, entry) ? EISDIR : actions_.item(directory, name);
        if (error == EISDIR) {
            levels_.back().subdirectories.push_back(name);
            return 0;
        }
        if (error != 0) failedName_ = name;
        return error;
    }

    int leave() {
        if (const int error = openParent(); error != 0) return error;
        const bool isTop = levels_.size() == 1;
        const int parent = isTop ? top_ : levels_[levels_.size() - 2].directory.get();
        const int error = actions_.afterDirectory(parent, levels_.back().name);
        if (error == ENOTEMPTY && levels_.back().visits < kMostVisits) return visit();
        if (error == ENOENT && !isTop && !isRemoved(levels_.back().directory.get())) return EAGAIN;
        if (error != 0 && error != ENOENT) return error;
        levels_.pop_back();
        return 0;
    }

    /// Where the directory above the walk's is closed, opens it again.
    int openParent() {
        if (levels_.size() == 1) return 0;
        Level& parent = levels_[levels_.size() - 2];
        if (parent.directory) return 0;
        UniqueFd opened = openSubdirectory(levels_.back().directory.get(), "..");
        if (!opened) return errno;
        if (identityOf(opened.get()) != parent.identity) return EAGAIN;
        parent.directory = std::move(opened);
        return 0;
    }

    const int top_;
    const TreeActions& actions_;
    std::vector<Level> levels_;
    alignas(dirent64) std::array<char, kEntriesBytes> entries_;  // as the system tells them
    std::string failedName_;
};

}  // namespace

Status walkTree(int parent, const std::string& name, const TreeActions& actions,
                std::string_view operation, const std::string& path) {
    TreeWalk walk(parent, actions);
    const int error = walk.run(name);
    if (error == 0) return {};
    const std::string where = path + walk.whereabouts();
    if (error != EAGAIN) return posixError(error, operation, where);
    return posixError(error, operation, where, "a directory was moved away meanwhile");
}

}  // namespace appsync
