#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

class RootDirectory;

/// Something that an archive of data does not hold: a link, a pipe, a name that no archive may
/// hold, what may not be read.
struct LeftOutItem {
    std::string name;
    /// One sentence, the name included.
    std::string why;
};

/// What went into the archive of an application's data.
struct DataArchiveContents {
    std::uint64_t entries = 0;  // files and directories; with none, no archive was written
    std::vector<LeftOutItem> leftOut;
};

/// Hears the size of each piece of data that was read. May be empty.
using DataProgress = std::function<void(std::uint64_t bytes)>;

/// Archives what a directory of the device holds, in pieces, as a new file of this machine. What is
/// left out is told, not refused. A directory that is missing holds nothing.
[[nodiscard]] Result<DataArchiveContents> writeDataArchive(const RootDirectory& root,
                                                           const std::string& directory,
                                                           const std::string& file,
                                                           const DataProgress& progress = {});

/// Refuses a file of this machine that is no archive of data, or one that no device would unpack.
/// Takes what the archive says of its contents for true, and gives the bytes that they take
/// on a device, in whole blocks.
/// Errors say what is wrong with the archive; which it is, and what to do, is for the caller to
/// say.
[[nodiscard]] Result<std::uint64_t> checkDataArchive(const std::string& file);

/// The same, and reads the contents, in pieces, as an unpacking does.
[[nodiscard]] Status verifyDataArchive(const std::string& file);

/// Unpacks an archive of data into an empty directory. Both descriptors stay the caller's; `name`
/// is what errors of the system call the archive. Nothing is made durable. Refused before the first
/// byte when more would be unpacked than there is room for. `progress` hears what was written.
[[nodiscard]] Status unpackDataArchive(int archive, std::string_view name, int directory,
                                       const DataProgress& progress = {});

/// A file or a directory of an application's data.
struct DataEntry {
    std::string name;  // from the directory of the data
    bool isDirectory = false;
    std::uint64_t size = 0;
    std::chrono::system_clock::time_point modified;
};

/// What a directory of data holds, a directory right before everything in it.
struct DataContents {
    std::vector<DataEntry> entries;
    std::vector<LeftOutItem> leftOut;
    std::uint64_t bytes = 0;  // of all files

    [[nodiscard]] std::uint64_t files() const noexcept;
};

/// Lists what an archive of the directory would hold. A directory that is missing holds nothing.
[[nodiscard]] Result<DataContents> listData(const RootDirectory& root,
                                            const std::string& directory);

/// Copies the same into an empty directory, with the times of the files, and gives what was copied.
/// `target` stays the caller's. No link is followed. Refused before the first byte when there is no
/// room for it. Nothing is made durable; after a failure what was copied stays, for the caller to
/// remove.
[[nodiscard]] Result<DataContents> copyData(const RootDirectory& root, const std::string& directory,
                                            int target, const DataProgress& progress = {});

/// Hears what the files of some data hold, in the order of their names.
struct DataReader {
    std::function<void(const std::string& name, std::uint64_t size)> fileBegins;
    std::function<void(ByteView piece)> piece;
};

/// Reads the files that an archive of the directory would hold. A directory that is missing holds
/// none.
[[nodiscard]] Status readData(const RootDirectory& root, const std::string& directory,
                              const DataReader& reader);

/// Reads the files that an archive of data holds, as an unpacking does.
[[nodiscard]] Status readDataArchive(const std::string& file, const DataReader& reader);

}  // namespace appsync
