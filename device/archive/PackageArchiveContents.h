#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>

#include "platform/Bytes.h"
#include "platform/Result.h"

struct z_stream_s;

namespace appsync {

struct PackageEntry;
class PackageFile;

/// The contents of an entry, unpacked piece by piece. Nothing is true of the pieces before the last
/// was read: only then have the sizes and the CRC been right. The one place that inflates. File and
/// entry must stay. Errors do not name the entry.
class PackageArchiveContents {
  public:
    PackageArchiveContents(const PackageFile& file, const PackageEntry& entry);
    ~PackageArchiveContents();
    PackageArchiveContents(const PackageArchiveContents&) = delete;
    PackageArchiveContents& operator=(const PackageArchiveContents&) = delete;

    /// The next piece, which fills the buffer (of one byte at least) or a part of it; 0 at the end.
    [[nodiscard]] Result<std::size_t> read(std::span<std::uint8_t> buffer);

  private:
    [[nodiscard]] Result<std::size_t> copy(std::span<std::uint8_t> buffer);
    [[nodiscard]] Result<std::size_t> inflate(std::span<std::uint8_t> buffer);
    [[nodiscard]] Status startInflating();
    [[nodiscard]] Status refill();
    [[nodiscard]] Status readPacked(std::span<std::uint8_t> bytes);
    [[nodiscard]] Status checkEnd() const;

    const PackageFile& file_;
    const PackageEntry& entry_;
    std::uint64_t packedDone_ = 0;
    std::uint64_t done_ = 0;
    std::uint32_t crc_ = 0;

    // Of what is deflated alone.
    std::unique_ptr<z_stream_s> stream_;
    Bytes packed_;
    bool isInflated_ = false;
};

}  // namespace appsync
