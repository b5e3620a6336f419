#pragma once

#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "simulation/files/FileNode.h"

namespace appsync {

/// What a crash takes of the files that were changed since they were last synced.
struct FileLoss {
    enum class Kind {
        /// The process ended: the kernel has everything.
        Nothing,
        /// The process ended within the last operation, which is not done; a temporary file that it
        /// was about to rename stays.
        LastOperation,
        /// Power was lost, and with it everything that was not synced.
        Everything,
        /// Power was lost. Of the operations that were not synced the seed says which are done, in
        /// whatever order they came; of the contents that were not synced, how much is there.
        Some,
    };
    Kind kind = Kind::Nothing;
    std::uint64_t seed = 0;
};

/// The changes of a simulated file system that are not synced, in order. An operation is done whole
/// or not at all; one that moves what an earlier one has brought is not done without that.
class FileJournal {
  public:
    /// That `name` of the directory was `before` and is `after` (null: nothing).
    struct Change {
        FileNode::Pointer directory;
        std::string name;
        FileNode::Pointer before;
        FileNode::Pointer after;
    };

    /// How a file came to its contents.
    enum class Written {
        /// None was written.
        Nothing,
        /// Under a temporary name that was synced and then renamed.
        Synced,
        /// Under a temporary name that was renamed: the contents may be cut off.
        Unsynced,
    };

    /// An operation has been done, which is these changes at once. `written` is how the file that
    /// the last of them brings came to its contents.
    void record(std::vector<Change> changes, Written written);
    /// Everything is on disk.
    void sync();
    /// The tree as a crash leaves it: a copy of its own.
    [[nodiscard]] FileNode::Pointer afterCrash(const FileNode::Pointer& root,
                                               const FileLoss& loss) const;

  private:
    struct Operation {
        std::vector<Change> changes;
        Written written = Written::Nothing;
    };
    class Crash;

    std::vector<Operation> operations_;
    std::set<FileNode::Pointer> unsynced_;  // files
};

}  // namespace appsync
