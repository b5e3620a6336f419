#pragma once

// device/archive: zip archives, all of them foreign. Read in this order: PackageFile.h (the bytes),
// PackageArchiveEnd.h (where the list of entries is), PackageArchiveDirectory.h (the list, held
// against the headers before the contents, PackageArchiveHeaders.h), PackageEntries.h (names,
// kinds, the tree), PackageArchive.h (all of it), PackageArchiveContents.h (what is in a file).
// PackageArchiveFormat.h has the records and numbers that several of them read.
// PackageLimits.h says what an archive may claim, PackageError.h why one is refused, Crc.h computes
// the CRC. Written by ArchiveWriter.h, with libzip, from what PackageFolder.h finds.
//
// Includes device/values, system/, libzip, libdeflate and zlib. Called by device/package.

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "device/archive/PackageEntries.h"
#include "device/archive/PackageFile.h"
#include "device/archive/PackageLimits.h"
#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

/// A package as an archive: its entries, checked and arranged as a tree, and their contents. One
/// thread at a time. Errors do not name the package; `name` does.
class PackageArchive {
  public:
    /// Opens and checks everything but what the bundle says of itself.
    [[nodiscard]] static Result<std::unique_ptr<PackageArchive>> open(PackageFile file,
                                                                      const PackageLimits& limits);

    [[nodiscard]] const std::string& name() const noexcept { return file_.name(); }
    [[nodiscard]] std::uint64_t packedBytes() const noexcept { return file_.size(); }
    [[nodiscard]] std::uint64_t unpackedBytes() const noexcept;
    /// In tree order.
    [[nodiscard]] const std::vector<PackageEntry>& entries() const noexcept { return entries_; }
    /// Null when there is none.
    [[nodiscard]] const PackageEntry* find(std::string_view entryName) const noexcept;

    /// Gives the contents piece by piece to `sink`, none longer than `buffer`, which is there for
    /// what is not in memory anyway; stops at the first error.
    /// Succeeds only when the sizes and the CRC were right. Nothing is true of the pieces before
    /// that.
    [[nodiscard]] Status stream(const PackageEntry& entry, std::span<std::uint8_t> buffer,
                                const std::function<Status(ByteView piece)>& sink);

    /// The contents of a file that is at most `maximumBytes` long.
    [[nodiscard]] Result<Bytes> read(const PackageEntry& entry, std::uint64_t maximumBytes);

    /// Reads the contents of every file as an unpacking does, in pieces that nobody gets. Calls
    /// `progress`, which may be empty, with the size of each.
    [[nodiscard]] Status verify(const std::function<void(std::uint64_t bytes)>& progress = {});

    /// The error with what it is about before it: the package.
    [[nodiscard]] ErrorRecord named(const ErrorRecord& error) const;

  private:
    explicit PackageArchive(PackageFile file);

    [[nodiscard]] Status listEntries(const PackageLimits& limits);

    PackageFile file_;
    std::vector<PackageEntry> entries_;
};

}  // namespace appsync
