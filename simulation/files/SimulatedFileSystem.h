#pragma once

// simulation/files: a device's files in memory. `SimulatedFileSystem` (this header) is the service,
// and what tests set up and look at; FileNode.h is a file, a directory or a link; FileJournal.h
// keeps what is on disk apart from what only looks so, for crashes. Includes recording, scheduling
// and platform/; the registry and the coordination service read packages and placeholders from it.

#include <cstddef>
#include <cstdint>
#include <limits>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/FileSystem.h"
#include "simulation/files/FileJournal.h"
#include "simulation/recording/Recorder.h"

namespace appsync {

/// The operations that can be made to fail.
enum class FileOperation {
    Attributes,
    CreateDirectory,
    RemoveItem,
    MoveItem,
    CopyItem,
    ReadFile,
    WriteFileAtomically,
    CreateFile,
    SetTimesToNow,
};

/// A device's files in memory: directories, files, links (followed inside the root only) and pipes,
/// with owners and with times by the virtual clock. At first there are "/tmp",
/// "/var/mobile/Library", "/var/mobile/Library/Preferences" and "/var/mobile/Media/PublicStaging".
///
/// The methods below the interface are the test's: they are not recorded, and never fail silently.
class SimulatedFileSystem : public FileSystem {
  public:
    explicit SimulatedFileSystem(Recorder& recorder);
    ~SimulatedFileSystem() override;

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

    // What is there. Parents are made as needed; what stood there is replaced.
    void addDirectory(const std::string& path);
    void addFile(const std::string& path, ByteView contents);
    void addFile(const std::string& path, std::string_view contents);
    void addLink(const std::string& path, const std::string& target);
    void addPipe(const std::string& path);
    /// Removes whatever is there, if anything.
    void remove(const std::string& path);
    /// Makes an account name known; "mobile" and "root" are.
    void addAccount(const std::string& name) { accounts_.insert(name); }
    /// Files may take this many bytes together; what needs more fails with ENOSPC.
    void setCapacity(std::uint64_t bytes) { capacity_ = bytes; }

    // What the test looks at. Nothing when there is no such thing.
    [[nodiscard]] bool exists(const std::string& path) const;
    [[nodiscard]] std::optional<Bytes> contents(const std::string& path) const;
    [[nodiscard]] std::optional<std::string> text(const std::string& path) const;
    /// "mobile:mobile".
    [[nodiscard]] std::optional<std::string> ownership(const std::string& path) const;
    [[nodiscard]] std::optional<SimulatedTime> modificationTime(const std::string& path) const;
    /// The names in a directory, sorted.
    [[nodiscard]] std::vector<std::string> names(const std::string& directory) const;
    /// The paths of everything below a directory, sorted; directories end with a slash.
    [[nodiscard]] std::vector<std::string> paths(const std::string& directory = "/") const;
    [[nodiscard]] std::uint64_t usedBytes() const { return usedBytes_; }

    // Faults. A path is as the caller writes it (of a move or copy: the source); `kAnyPath` is
    // every.
    static constexpr std::string_view kAnyPath = "*";
    /// The next `count` calls fail with the errno value and change nothing.
    void failNext(FileOperation operation, std::string_view path, int errnoValue,
                  std::size_t count = 1);
    /// Every call fails, until `stopFailing`.
    void failEvery(FileOperation operation, std::string_view path, int errnoValue);
    void stopFailing() { faults_.clear(); }

    // Crashes. What is lost at one is said in platform/FileSystem.h.
    /// From now on it is known what was not synced. Everything that is there now is on disk.
    void keepJournal();
    /// A service of the device has synced the whole file system.
    void sync();
    /// The files as a crash at this moment leaves them. Only with a journal.
    [[nodiscard]] std::shared_ptr<const FileNode> afterCrash(const FileLoss& loss) const;
    /// Takes over what a crash has left; everything is on disk.
    void load(const FileNode& root);

    /// Copies a tree without crossing platform/: what a service of the device does with files that
    /// it is given. False when there is no directory at `from`.
    bool copyTree(const std::string& from, const std::string& to);

  private:
    using Node = FileNode;
    struct Place;
    struct Fault {
        int errnoValue = 0;
        std::size_t left = 0;
    };
    using NodePointer = Node::Pointer;
    using Contents = Node::Contents;
    using Written = FileJournal::Written;
    static constexpr std::size_t kForEver = std::numeric_limits<std::size_t>::max();

    [[nodiscard]] static Contents share(ByteView contents);
    [[nodiscard]] const NodePointer* plainlyAt(std::string_view path) const;
    [[nodiscard]] int resolve(const std::string& path, NodePointer& found) const;
    [[nodiscard]] int resolveByStep(const std::string& path, NodePointer& found) const;
    [[nodiscard]] int place(const std::string& path, Place& found) const;
    [[nodiscard]] NodePointer nodeAt(const std::string& path) const;
    [[nodiscard]] int regularFileAt(const std::string& path, NodePointer& found) const;
    [[nodiscard]] int fault(FileOperation operation, const std::string& path);
    [[nodiscard]] int checkAttributes(const FileAttributes& attributes) const;
    static void give(Node& node, const FileAttributes& attributes);
    [[nodiscard]] int makeDirectory(const std::string& path, const FileAttributes& attributes);
    [[nodiscard]] int makeDirectories(const std::string& path, const FileAttributes& attributes);
    [[nodiscard]] int replaceFile(const std::string& path, Contents contents,
                                  const FileAttributes& attributes, Written written);
    [[nodiscard]] int moveTo(const std::string& from, const std::string& to);
    [[nodiscard]] int copyTo(const std::string& from, const std::string& to);
    [[nodiscard]] int removeAt(const std::string& path);
    void put(const std::string& path, NodePointer node);
    void setChild(const NodePointer& directory, const std::string& name, NodePointer node,
                  Written written);
    void recordRemovals(const NodePointer& directory);
    /// Tells of what a call has changed, if it has.
    void tell(int error, std::string_view method, const std::string& arguments);
    [[nodiscard]] NodePointer makeNode() const;
    [[nodiscard]] static NodePointer copyOf(const Node& node);

    Recorder& recorder_;
    NodePointer root_;
    std::set<std::string, std::less<>> accounts_{"mobile", "root"};
    std::uint64_t capacity_ = std::numeric_limits<std::uint64_t>::max();
    std::uint64_t usedBytes_ = 0;
    std::map<std::pair<FileOperation, std::string>, Fault> faults_;
    std::optional<FileJournal> journal_;
};

}  // namespace appsync
