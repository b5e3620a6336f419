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
///
/// A deflated entry of at most `kMostAtOnce` bytes, packed and unpacked together, is inflated at
/// once by libdeflate, which is much faster than zlib and needs all of both sides. A larger one is
/// inflated by zlib, which streams, and so is what libdeflate cannot inflate to just the size that
/// the entry says: what is wrong with damaged bytes is zlib's to say.
class PackageArchiveContents {
  public:
    static constexpr std::uint64_t kMostAtOnce = std::uint64_t{2} << 20;

    PackageArchiveContents(const PackageFile& file, const PackageEntry& entry);
    ~PackageArchiveContents();
    PackageArchiveContents(const PackageArchiveContents&) = delete;
    PackageArchiveContents& operator=(const PackageArchiveContents&) = delete;

    /// The next piece, empty at the end: at most as long as the buffer (of one byte at least), in
    /// it or in memory that stays until the next call.
    [[nodiscard]] Result<ByteView> next(std::span<std::uint8_t> buffer);

  private:
    [[nodiscard]] Result<ByteView> piece(std::span<std::uint8_t> buffer);
    [[nodiscard]] Result<std::size_t> copy(std::span<std::uint8_t> buffer);
    [[nodiscard]] Status inflateAtOnce();
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
    bool hasTriedAtOnce_ = false;
    std::unique_ptr<std::uint8_t[]> whole_;  // all of the contents, where that went well
    std::unique_ptr<z_stream_s> stream_;     // where it did not, or the entry is large
    Bytes packed_;
    bool isInflated_ = false;
};

}  // namespace appsync
