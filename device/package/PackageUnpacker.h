#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "device/archive/PackageEntries.h"
#include "device/package/PackageReader.h"
#include "platform/Bytes.h"
#include "platform/Result.h"
#include "system/file/UniqueFd.h"

namespace appsync {

class PackageArchive;

/// One unpacking of an archive into a directory; see PackageReader::unpackInto. Entries come in
/// tree order, so that the directories on the way to an entry are open already, mostly, and every
/// name is looked up in its own directory. Errors do not name the package.
class PackageUnpacker {
  public:
    PackageUnpacker(PackageArchive& archive, int directoryDescriptor,
                    const PackageUnpackOptions& options);

    [[nodiscard]] Status run();

  private:
    [[nodiscard]] Status unpack(const PackageEntry& entry);
    [[nodiscard]] Status unpackFile(const PackageEntry& entry);
    [[nodiscard]] Status writePiece(const PackageEntry& entry, int fileDescriptor, ByteView piece);
    [[nodiscard]] Status finishFile(const PackageEntry& entry, UniqueFd file);
    /// Makes the directory and those it lies in, unless they are open; `mode` is for the last one.
    [[nodiscard]] Status enter(std::string_view directory, std::uint32_t mode);
    /// Leaves directories until the innermost one is, or holds, that directory.
    [[nodiscard]] Status leaveUntil(std::string_view directory);
    /// Opens the innermost directory again, once those that were open have been left.
    [[nodiscard]] Status reopen();
    [[nodiscard]] UniqueFd openDirectory(const std::string& name) const;
    void push(UniqueFd directory);
    [[nodiscard]] Status makeDirectory(std::string_view directory, std::uint32_t mode);
    [[nodiscard]] int innermost() const noexcept;
    [[nodiscard]] Status reportProgress() const;
    [[nodiscard]] ErrorRecord failed(int errorNumber, std::string_view action,
                                     std::string_view name) const;

    PackageArchive& archive_;
    const int top_;
    const PackageUnpackOptions& options_;
    const std::uint64_t total_;
    std::uint64_t done_ = 0;
    Bytes buffer_;
    /// The innermost directories; not all the way to the top, as it may be longer than a process
    /// may have files open. `path_` is the whole name of the last.
    std::vector<UniqueFd> open_;
    std::string path_;
};

}  // namespace appsync
