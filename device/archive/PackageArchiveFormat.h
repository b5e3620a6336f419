#pragma once

#include <cstddef>
#include <cstdint>

#include "device/archive/PackageError.h"
#include "platform/Bytes.h"

namespace appsync {

// What zip archives consist of: records that begin with a signature, their numbers little-endian.

/// The header before the contents of an entry; a name and extra fields follow it.
inline constexpr std::uint32_t kLocalHeaderSignature = 0x04034b50;
inline constexpr std::size_t kLocalHeaderBytes = 30;
/// A header of the central directory; a name, extra fields and a comment follow it.
inline constexpr std::uint32_t kCentralHeaderSignature = 0x02014b50;
inline constexpr std::size_t kCentralHeaderBytes = 46;

// An extra field of an entry: what it is and its length, of two bytes each, and what it says.
inline constexpr std::size_t kExtraFieldHead = 4;
/// When the contents were changed last: a byte whose lowest bit says so, and seconds since 1970 in
/// UTC, signed, of four bytes.
inline constexpr std::uint16_t kTimesField = 0x5455;
inline constexpr std::size_t kTimesFieldBytes = 5;
inline constexpr std::uint8_t kHasModificationTime = 1;

// What says that a number of that width stands elsewhere, as it is too large.
inline constexpr std::uint16_t kElsewhere16 = 0xffff;
inline constexpr std::uint32_t kElsewhere32 = 0xffffffff;

[[nodiscard]] inline std::uint64_t littleEndian(ByteView bytes, std::size_t offset,
                                                std::size_t count) noexcept {
    std::uint64_t value = 0;
    for (std::size_t i = count; i > 0; --i) value = value << 8U | bytes[offset + i - 1];
    return value;
}

[[nodiscard]] inline std::uint16_t u16(ByteView bytes, std::size_t offset) noexcept {
    return static_cast<std::uint16_t>(littleEndian(bytes, offset, 2));
}

[[nodiscard]] inline std::uint32_t u32(ByteView bytes, std::size_t offset) noexcept {
    return static_cast<std::uint32_t>(littleEndian(bytes, offset, 4));
}

[[nodiscard]] inline std::uint64_t u64(ByteView bytes, std::size_t offset) noexcept {
    return littleEndian(bytes, offset, 8);
}

/// The refusal of an archive that contradicts itself.
[[nodiscard]] inline ErrorRecord inconsistentArchive(const std::string& what) {
    return packageError(PackageErrorCode::Inconsistent, what + "; copy it or make it again");
}

}  // namespace appsync
