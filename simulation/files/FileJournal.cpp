#include "simulation/files/FileJournal.h"

#include <algorithm>
#include <cstddef>
#include <map>
#include <random>
#include <utility>

namespace appsync {
namespace {

constexpr const char* kLostMark = ".appsync-lost0";

FileNode::Contents share(Bytes bytes) { return std::make_shared<const Bytes>(std::move(bytes)); }

}  // namespace

/// One crash: first everything that was not synced is taken back, then what the loss leaves of it
/// is done again.
class FileJournal::Crash {
  public:
    Crash(const FileJournal& journal, const FileLoss& loss)
        : journal_(journal),
          loss_(loss),
          random_(loss.seed),
          // Some seeds lose nearly everything, some nearly nothing.
          keptOfFour_(1 + random_() % 3) {}

    FileNode::Pointer imageOf(const FileNode::Pointer& root) {
        for (auto each = journal_.operations_.rbegin(); each != journal_.operations_.rend();
             ++each) {
            takeBack(*each);
        }
        for (std::size_t i = 0; i < journal_.operations_.size(); ++i) {
            const Operation& operation = journal_.operations_[i];
            if (isKept(i) && isPossible(operation)) {
                doAgain(operation);
            } else {
                leaveTemporary(operation);
            }
        }
        return copyOf(root);
    }

  private:
    void takeBack(const Operation& operation) {
        for (auto each = operation.changes.rbegin(); each != operation.changes.rend(); ++each) {
            put(childrenOf(each->directory), each->name, each->before);
        }
    }

    void doAgain(const Operation& operation) {
        for (const Change& each : operation.changes) {
            put(childrenOf(each.directory), each.name, each.after);
        }
    }

    [[nodiscard]] bool isKept(std::size_t number) {
        switch (loss_.kind) {
            case FileLoss::Kind::Nothing:
                return true;
            case FileLoss::Kind::LastOperation:
                return number + 1 < journal_.operations_.size();
            case FileLoss::Kind::Everything:
                return false;
            case FileLoss::Kind::Some:
                break;
        }
        return random_() % 4 < keptOfFour_;
    }

    /// What is moved must have come to where it is moved from.
    [[nodiscard]] bool isPossible(const Operation& operation) {
        if (operation.changes.size() < 2) return true;
        return std::all_of(operation.changes.begin(), operation.changes.end(),
                           [this](const Change& each) {
                               if (each.before == nullptr || each.after != nullptr) return true;
                               const FileNode::Children& there = childrenOf(each.directory);
                               const auto found = there.find(each.name);
                               return found != there.end() && found->second == each.before;
                           });
    }

    /// The file was there before it was renamed, and may have reached the disk.
    void leaveTemporary(const Operation& operation) {
        if (operation.written == Written::Nothing || operation.changes.empty()) return;
        if (loss_.kind != FileLoss::Kind::LastOperation && random_() % 2 == 0) return;
        const Change& change = operation.changes.back();
        childrenOf(change.directory)["." + change.name + kLostMark] = change.after;
    }

    static void put(FileNode::Children& children, const std::string& name,
                    const FileNode::Pointer& node) {
        if (node != nullptr) {
            children[name] = node;
        } else {
            children.erase(name);
        }
    }

    FileNode::Children& childrenOf(const FileNode::Pointer& directory) {
        const auto [found, isNew] = directories_.try_emplace(directory.get());
        if (isNew) found->second = directory->children;
        return found->second;
    }

    FileNode::Pointer copyOf(const FileNode::Pointer& node) {
        auto copy = std::make_shared<FileNode>(*node);
        if (node->kind == FileNode::Kind::Directory) {
            copy->children = childrenOf(node);
            for (auto& [name, child] : copy->children) child = copyOf(child);
        } else if (journal_.unsynced_.contains(node)) {
            copy->contents = share(remainderOf(*node->contents));
        }
        return copy;
    }

    [[nodiscard]] Bytes remainderOf(const Bytes& contents) {
        Bytes remainder = contents;
        const bool powerIsLost =
            loss_.kind == FileLoss::Kind::Everything || loss_.kind == FileLoss::Kind::Some;
        if (!powerIsLost || contents.empty()) return remainder;
        const std::size_t whole = random_() % contents.size();
        switch (random_() % 4) {
            case 0:
                return remainder;
            case 1:
                return {};
            case 2:
                remainder.resize(whole);
                return remainder;
            default:
                std::fill(remainder.begin() + static_cast<std::ptrdiff_t>(whole), remainder.end(),
                          Bytes::value_type{0});
                return remainder;
        }
    }

    const FileJournal& journal_;
    const FileLoss loss_;
    std::mt19937_64 random_;
    const std::uint64_t keptOfFour_;
    std::map<const FileNode*, FileNode::Children> directories_;
};

void FileJournal::record(std::vector<Change> changes, Written written) {
    if (written == Written::Unsynced) unsynced_.insert(changes.back().after);
    operations_.push_back({std::move(changes), written});
}

void FileJournal::sync() {
    operations_.clear();
    unsynced_.clear();
}

FileNode::Pointer FileJournal::afterCrash(const FileNode::Pointer& root,
                                          const FileLoss& loss) const {
    return Crash(*this, loss).imageOf(root);
}

}  // namespace appsync
