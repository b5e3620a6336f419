#pragma once

#include <cstddef>
#include <cstdint>
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

/// 6 bytes without meaning, the widths of an offset and of a reference (1 byte each), then 8 bytes
/// each: the number of objects, which one is the outermost, where the offset table stands.
inline constexpr std::size_t kBinaryTrailerSize = 32;

// What shared objects may expand to. An input of N bytes cannot hold more than N references, so a
// list without shared containers has at most N values; and its texts and data are N bytes before
// they are shared. Shared containers are allowed as far as the whole has at most N +
// kBinaryFreeValues values. Texts and data above kBinaryCopiedSize bytes are shared in memory too;
// keys, which are not, may repeat to kBinaryCopiedSize * N + kBinaryFreeKeyBytes bytes.
inline constexpr std::size_t kBinaryFreeValues = std::size_t{1} << 16U;
inline constexpr std::size_t kBinaryCopiedSize = 64;
inline constexpr std::size_t kBinaryFreeKeyBytes = std::size_t{1} << 20U;

}  // namespace appsync
