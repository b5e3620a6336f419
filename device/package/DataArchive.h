#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

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

/// Archives what a directory of the device holds, in pieces, as a new file of this machine. What is
/// left out is told, not refused. A directory that is missing holds nothing.
[[nodiscard]] Result<DataArchiveContents> writeDataArchive(const RootDirectory& root,
                                                           const std::string& directory,
                                                           const std::string& file);

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
/// byte when more would be unpacked than there is room for.
[[nodiscard]] Status unpackDataArchive(int archive, std::string_view name, int directory);

}  // namespace appsync
