#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

/// What one of the two headers of an entry says: that in the central directory, or the local one
/// before the contents. The texts are views of the bytes that were read.
struct ArchiveHeader {
    /// As it stands.
    std::string_view name;
    /// What the extra field for it says is the name in Unicode; empty when there is none for that
    /// name.
    std::string_view unicodeName;
    std::uint16_t flags = 0;
    std::uint16_t method = 0;
    /// Time and date, as they stand.
    std::uint32_t time = 0;
    /// Seconds since 1970 in UTC, where an extra field tells when the contents were changed last.
    std::optional<std::int64_t> modified;
    std::uint32_t crc = 0;
    std::uint64_t packedSize = 0;
    std::uint64_t size = 0;
    /// The length of all of it.
    std::size_t bytes = 0;

    // The central one alone.
    /// The mode of a file system, its type included; 0 when the archive gives none.
    std::uint32_t mode = 0;
    /// Where the local one stands.
    std::uint64_t localOffset = 0;

    [[nodiscard]] std::string_view effectiveName() const noexcept {
        return unicodeName.empty() ? name : unicodeName;
    }
    [[nodiscard]] bool isEncrypted() const noexcept;
    /// Whether CRC and sizes stand in a descriptor after the contents, too. Then the local header
    /// need not know them, and says 0.
    [[nodiscard]] bool hasDescriptor() const noexcept;
};

/// The first header of those that are left of the central directory.
[[nodiscard]] Result<ArchiveHeader> parseCentralHeader(ByteView directory);

/// How long the local header is that begins so (at least `kLocalHeaderBytes`).
[[nodiscard]] std::size_t localHeaderLength(ByteView begin) noexcept;

/// The local header that the bytes begin with, all of which are there. Its signature was looked at.
[[nodiscard]] Result<ArchiveHeader> parseLocalHeader(ByteView bytes);

/// How the local header contradicts the central one: "another size"; null when it does not. Where
/// it says 0 and a descriptor says the rest it contradicts nothing. The versions, the flags and the
/// extra fields may differ: archivers that do not know an entry's size when they begin it, or set
/// aside room for a large one, write them so.
[[nodiscard]] const char* contradictionOf(const ArchiveHeader& local,
                                          const ArchiveHeader& central) noexcept;

/// Whether the bytes are a descriptor, in any of its four forms (with and without a signature,
/// sizes of 32 and of 64 bits), that says the same as the central header.
[[nodiscard]] bool isDescriptorOf(ByteView bytes, const ArchiveHeader& central) noexcept;

/// The longest of those forms.
inline constexpr std::size_t kLongestDescriptor = 24;

}  // namespace appsync
