#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>

namespace appsync {

// The layout of a binary property list, numbers big-endian:
//   "bplist00", the objects, the offset table (where each object stands), the trailer.
// An object is a marker byte - kind in the upper half, a number in the lower - and its content. The
// number is a count, or 15 when the count follows as an integer object. Arrays and maps hold the
// numbers of their elements, all of one width; a map has all of its keys before all of its values.

inline constexpr std::string_view kBinaryMagic = "bplist00";

inline constexpr std::uint8_t kBinaryFalse = 0x08;
inline constexpr std::uint8_t kBinaryTrue = 0x09;
inline constexpr std::uint8_t kBinaryInteger = 0x10;  // lower half: logarithm of the width
inline constexpr std::uint8_t kBinaryReal = 0x20;     // lower half: logarithm of the width
inline constexpr std::uint8_t kBinaryDate = 0x33;
inline constexpr std::uint8_t kBinaryData = 0x40;
inline constexpr std::uint8_t kBinaryAscii = 0x50;
inline constexpr std::uint8_t kBinaryUtf16 = 0x60;  // the count is one of 16-bit units
inline constexpr std::uint8_t kBinaryArray = 0xA0;
inline constexpr std::uint8_t kBinaryMap = 0xD0;
inline constexpr std::uint8_t kBinaryCountFollows = 0x0F;

inline std::uint8_t kindOf(std::uint8_t marker) { return marker & 0xF0U; }
inline std::uint8_t lowerHalf(std::uint8_t marker) { return marker & 0x0FU; }

/// 6 bytes without meaning, the widths of an offset and of a reference (1 byte each), then 8 bytes
/// each: the number of objects, which one is the outermost, where the offset table stands.
inline constexpr std::size_t kBinaryTrailerSize = 32;

/// A number of `width` bytes, 1 to 8. Eight are there to be read: whatever stands before the
/// trailer, or in it, has as many behind it.
inline std::uint64_t bigEndian(const std::uint8_t* bytes, std::size_t width) {
    std::uint64_t value = 0;
    std::memcpy(&value, bytes, sizeof(value));
    if constexpr (std::endian::native == std::endian::little) value = __builtin_bswap64(value);
    return value >> (64 - 8 * width);
}

/// What the trailer says, unchecked.
struct BinaryTrailer {
    std::size_t offsetWidth = 0;
    std::size_t referenceWidth = 0;
    std::uint64_t objectCount = 0;
    std::uint64_t top = 0;
    std::size_t table = 0;
};

inline BinaryTrailer readBinaryTrailer(const std::uint8_t* trailer) {
    return {trailer[6], trailer[7], bigEndian(trailer + 8, 8), bigEndian(trailer + 16, 8),
            static_cast<std::size_t>(bigEndian(trailer + 24, 8))};
}

// What shared objects may expand to. An input of N bytes cannot hold more than N references, so a
// list without shared containers has at most N values; and its texts and data are N bytes before
// they are shared. Shared containers are allowed as far as the whole has at most N +
// kBinaryFreeValues values. Texts and data above kBinaryCopiedSize bytes are shared in memory too;
// keys, which are not, may repeat to kBinaryCopiedSize * N + kBinaryFreeKeyBytes bytes.
inline constexpr std::size_t kBinaryFreeValues = std::size_t{1} << 16U;
inline constexpr std::size_t kBinaryCopiedSize = 64;
inline constexpr std::size_t kBinaryFreeKeyBytes = std::size_t{1} << 20U;

}  // namespace appsync
