#pragma once

#include <sys/stat.h>

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Bytes.h"

namespace appsync {

/// An entry of an archive as a test wants it, whether or not it is true.
struct ZipEntry {
    std::string name;
    std::string contents;
    std::uint32_t mode = S_IFREG | 0644;

    /// What the contents are when they are not stored as they are: the packed bytes, and how.
    std::optional<std::string> packed = std::nullopt;
    std::uint16_t method = 0;

    // What to say instead of the truth.
    std::optional<std::string> localName = std::nullopt;
    std::optional<std::uint32_t> crc = std::nullopt;
    std::optional<std::uint32_t> size = std::nullopt;
    std::optional<std::uint32_t> localSize = std::nullopt;
    std::optional<std::uint32_t> localPackedSize = std::nullopt;
    std::optional<std::uint32_t> localCrc = std::nullopt;
    std::optional<std::uint16_t> localMethod = std::nullopt;
    std::optional<std::uint32_t> centralSize = std::nullopt;
    std::optional<std::uint32_t> centralPackedSize = std::nullopt;
    std::uint16_t flags = 0;
    // More extra fields.
    std::string localExtra = {};
    std::string centralExtra = {};
    /// What stands after the contents.
    std::string descriptor = {};
    /// Is there, and not in the central directory.
    bool isHidden = false;
    /// The extra field that says the name again, in both headers.
    std::optional<std::string> unicodeName = std::nullopt;
    /// Instead of bytes of its own it has those of the entry before.
    bool overlapsLast = false;
};

[[nodiscard]] ZipEntry zipFile(std::string_view name, std::string_view contents);
[[nodiscard]] ZipEntry zipDirectory(std::string_view name);
[[nodiscard]] ZipEntry zipOfMode(std::string_view name, std::uint32_t mode);
/// A file of that many zero bytes, deflated.
[[nodiscard]] ZipEntry zipZeros(std::string_view name, std::uint32_t size);

/// How a descriptor gives the CRC and the sizes.
struct ZipDescriptorForm {
    bool hasSignature = true;
    bool isLarge = false;
};

/// The file as a streaming archiver writes it: a local header that knows none of CRC and sizes, and
/// a descriptor after the contents.
[[nodiscard]] ZipEntry zipStreamed(ZipEntry entry, ZipDescriptorForm form = {});

/// The extra field for large sizes.
[[nodiscard]] std::string zipLargeSizes(const std::vector<std::uint64_t>& sizes);

/// An archive, built byte by byte.
class ZipBuilder {
  public:
    ZipBuilder& add(const ZipEntry& entry);
    ZipBuilder& add(const std::vector<ZipEntry>& entries);

    /// How many entries the end says there are.
    ZipBuilder& claimCount(std::uint16_t count);
    /// What the end adds to the true size of the central directory.
    ZipBuilder& claimExtraDirectoryBytes(std::uint32_t bytes);
    /// Bytes that belong to no entry, before the next.
    ZipBuilder& gap(std::string_view bytes);
    ZipBuilder& comment(std::string_view text);
    /// Has the end that large archives have, which says how many entries there are.
    ZipBuilder& largeEnd(std::uint64_t count);

    [[nodiscard]] std::string bytes() const;

  private:
    [[nodiscard]] std::string largeEndBytes(std::uint64_t count) const;

    std::string files_;
    std::string directory_;
    std::string comment_;
    std::uint32_t lastOffset_ = 0;
    std::uint16_t count_ = 0;
    std::optional<std::uint16_t> claimedCount_;
    std::optional<std::uint64_t> largeCount_;
    std::uint32_t extraDirectoryBytes_ = 0;
};

}  // namespace appsync
