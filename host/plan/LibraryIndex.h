#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "host/plan/Library.h"
#include "platform/Bytes.h"

namespace appsync {

/// What tells whether a file is still the one that was read: a change of its contents, or of what
/// stands under its name, changes one of these.
struct FileStamp {
    std::uint64_t device = 0;
    std::uint64_t inode = 0;
    std::uint64_t size = 0;
    std::int64_t modified = 0;  // nanoseconds since 1970, as is the next
    std::int64_t changed = 0;   // the file or what the system says of it; nobody can set it

    friend bool operator==(const FileStamp&, const FileStamp&) = default;
};

/// A package as an index has it. Its `file` is the name in the library alone.
struct IndexedPackage {
    FileStamp stamp;
    LibraryPackage package;
};

/// What an index says.
struct LibraryIndexContents {
    /// The library's folder: absolute, and without links.
    std::string folder;
    std::vector<IndexedPackage> packages;
};

/// Where indexes of libraries are kept, and of which files.
struct LibraryIndexPlace {
    /// Absolute; empty where no index is kept.
    std::string directory;
    /// A file that was changed so short a time ago may change again without its stamp telling: no
    /// file system's clock is coarser than 2 seconds. Such a file is read again next time.
    std::chrono::nanoseconds settling = std::chrono::seconds(2);
    /// Fewer packages are read in a moment.
    std::size_t fewest = 64;

    /// "appsync" in the cache directory of the user who runs the process: $XDG_CACHE_HOME, else
    /// ~/.cache; either is made where it is missing. None where that is another user's, as for root
    /// who acts for a device's owner.
    [[nodiscard]] static LibraryIndexPlace ofUser();
};

/// What is known of the packages of a library, so that none is opened again that has not changed.
/// Only packages that can be used are in it, whose stamps tell them from all others. It is never
/// needed: it may be deleted at any time, and one that is damaged, somebody else's or of another
/// form is none. Processes that write it at the same time replace each other's.
///
/// Used so: made for the whole names of a library; for each package `take`, else `keep` once it was
/// read; `save`. What was neither taken nor kept is forgotten.
class LibraryIndex {
  public:
    /// Reads the index of a folder that holds `count` packages.
    LibraryIndex(LibraryIndexPlace place, const std::string& folder, std::size_t count);

    /// The package in the file of that name and stamp; nothing where it must be read.
    [[nodiscard]] std::optional<LibraryPackage> take(const std::string& name,
                                                     const FileStamp& stamp);

    /// Remembers what was read of a file whose stamp was looked at before.
    void keep(const std::string& name, const FileStamp& stamp, const LibraryPackage& package);

    /// Writes it where something of it has changed and that is possible; then the indexes go whose
    /// libraries are gone.
    void save();

  private:
    [[nodiscard]] bool hasSettled(const FileStamp& stamp) const;

    const LibraryIndexPlace place_;
    std::string folder_;
    std::string fileName_;  // empty where there is to be none
    std::unordered_map<std::string, IndexedPackage> before_;
    std::vector<IndexedPackage> now_;
    bool hasNew_ = false;
};

/// The stamp of a regular file, or of the one that a link leads to; nothing for anything else.
[[nodiscard]] std::optional<FileStamp> stampOf(const std::string& file);

/// The contents of an index, and what they say; nothing where they are not what `indexBytes` gives.
[[nodiscard]] Bytes indexBytes(const LibraryIndexContents& contents);
[[nodiscard]] std::optional<LibraryIndexContents> readIndex(ByteView bytes);

}  // namespace appsync
