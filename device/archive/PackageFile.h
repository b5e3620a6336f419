#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "platform/Bytes.h"
#include "platform/Result.h"
#include "system/file/RootDirectory.h"
#include "system/file/UniqueFd.h"

namespace appsync {

/// The regular file that a package is, opened for reading. Reading does not move the offset of the
/// descriptor, so that any number of readers may share it. The last `kKeptBytes` are read when it
/// is opened, and kept: an archive has its list there, and a small one everything.
class PackageFile {
  public:
    static constexpr std::uint64_t kKeptBytes = std::uint64_t{80} << 10;

    /// Opens a path of this machine. `NotARegularFile` for anything else, without waiting on a
    /// pipe.
    [[nodiscard]] static Result<PackageFile> open(const std::string& path);

    /// Takes an open file over. `name` is what errors call it.
    [[nodiscard]] static Result<PackageFile> take(RegularFile file, std::string_view name);

    /// Duplicates a descriptor. `name` is what errors call the file.
    [[nodiscard]] static Result<PackageFile> duplicate(int fileDescriptor, std::string_view name);

    [[nodiscard]] const std::string& name() const noexcept { return name_; }
    /// The size when it was opened.
    [[nodiscard]] std::uint64_t size() const noexcept { return size_; }

    /// The last bytes of the file as it was opened; all of a smaller one.
    [[nodiscard]] ByteView end() const noexcept { return end_; }

    /// Reads at an offset; fewer bytes than asked for only at the end of the file.
    [[nodiscard]] Result<std::size_t> readAt(std::uint64_t offset,
                                             std::span<std::uint8_t> bytes) const;

    /// Those bytes, which were there when the file was opened; refused when it became shorter.
    [[nodiscard]] Result<Bytes> readExactly(std::uint64_t offset, std::uint64_t size) const;

  private:
    PackageFile(UniqueFd descriptor, std::uint64_t size, std::string_view name);
    [[nodiscard]] std::size_t readKept(std::uint64_t offset,
                                       std::span<std::uint8_t> bytes) const noexcept;
    [[nodiscard]] static Result<PackageFile> examine(UniqueFd descriptor, std::string_view name);

    UniqueFd descriptor_;
    std::uint64_t size_;
    std::string name_;
    Bytes end_;
};

}  // namespace appsync
