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
    std::uint16_t flags = 0;
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

/// An archive, built byte by byte.
class ZipBuilder {
  public:
    ZipBuilder& add(const ZipEntry& entry);
    ZipBuilder& add(const std::vector<ZipEntry>& entries);

    /// How many entries the end says there are.
    ZipBuilder& claimCount(std::uint16_t count);
    /// What the end adds to the true size of the central directory.
    ZipBuilder& claimExtraDirectoryBytes(std::uint32_t bytes);
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
