#include "system/TreeWalk.h"

#include <cerrno>
#include <cstring>
#include <memory>
#include <optional>
#include <vector>

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include "system/PosixError.h"
#include "system/UniqueFd.h"

namespace appsync {

namespace {

constexpr int kMostVisits = 16;

struct CloseStream {
    void operator()(DIR* stream) const { ::closedir(stream); }
};

/// Which directory it is, whatever its name.
struct Identity {
    dev_t device = 0;
    ino_t inode = 0;
    friend bool operator==(const Identity&, const Identity&) = default;
};

/// A directory that the walk is in.
struct Level {
    std::string name;
    Identity identity;
    std::vector<std::string> subdirectories;  // still to be entered
    int visits = 0;
};

std::optional<Identity> identityOf(int descriptor) {
    struct stat status {};
    if (::fstat(descriptor, &status) != 0) return std::nullopt;
    return Identity{status.st_dev, status.st_ino};
}

bool isDirectory(int directory, const dirent& entry) {
    if (entry.d_type != DT_UNKNOWN) return entry.d_type == DT_DIR;
    struct stat status {};
    return ::fstatat(directory, entry.d_name, &status, AT_SYMLINK_NOFOLLOW) == 0 &&
           S_ISDIR(status.st_mode);
}

UniqueFd openSubdirectory(int parent, const char* name) {
    return UniqueFd(::openat(parent, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
}

class TreeWalk {
  public:
    TreeWalk(int top, const TreeActions& actions) : top_(top), actions_(actions) {}

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
        return enter(current_.get(), name);
    }

    int enter(int parent, const std::string& name) {
        UniqueFd opened = openSubdirectory(parent, name.c_str());
        if (!opened) return explainRefusal(parent, name, errno);
        const std::optional<Identity> identity = identityOf(opened.get());
        if (!identity) return errno;
        levels_.push_back({name, *identity, {}, 0});
        current_ = std::move(opened);
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
        Level& level = levels_.back();
        ++level.visits;
        const int copy = ::fcntl(current_.get(), F_DUPFD_CLOEXEC, 0);
        if (copy < 0) return errno;
        const std::unique_ptr<DIR, CloseStream> stream(::fdopendir(copy));
        if (stream == nullptr) {
            const int error = errno;
            UniqueFd(copy).reset();
            return error;
        }
        ::rewinddir(stream.get());
        return visitEntries(*stream);
    }

    int visitEntries(DIR& stream) {
        while (true) {
            errno = 0;
            const dirent* entry = ::readdir(&stream);
            if (entry == nullptr) return errno;
            if (std::strcmp(entry->d_name, ".") == 0 || std::strcmp(entry->d_name, "..") == 0) {
                continue;
            }
            if (const int error = visitEntry(*entry); error != 0) return error;
        }
    }

    int visitEntry(const dirent& entry) {
        const std::string name = entry.d_name;
        const int error =
            isDirectory(current_.get(), entry) ? EISDIR : actions_.item(current_.get(), name);
        if (error == EISDIR) {
            levels_.back().subdirectories.push_back(name);
            return 0;
        }
        if (error != 0) failedName_ = name;
        return error;
    }

    int leave() {
        UniqueFd parent;
        if (levels_.size() > 1) {
            parent = openSubdirectory(current_.get(), "..");
            if (!parent) return errno;
            if (identityOf(parent.get()) != levels_[levels_.size() - 2].identity) return EAGAIN;
        }
        const int parentDescriptor = parent ? parent.get() : top_;
        const int error = actions_.afterDirectory(parentDescriptor, levels_.back().name);
        if (error == ENOTEMPTY && levels_.back().visits < kMostVisits) return visit();
        if (error != 0 && error != ENOENT) return error;
        levels_.pop_back();
        current_ = std::move(parent);
        return 0;
    }

    const int top_;
    const TreeActions& actions_;
    std::vector<Level> levels_;
    UniqueFd current_;  // the directory of the last level
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
