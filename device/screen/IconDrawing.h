#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

/// The side of an icon on the home screen, in pixels.
inline constexpr int kIconSize = 120;

/// The largest icon file that is read, in bytes; the largest side of the image in it, in pixels;
/// and how many of them it may have: each takes four bytes, whatever the file's size.
inline constexpr std::size_t kMaximumIconFileBytes = std::size_t{16} << 20;
inline constexpr std::uint32_t kMaximumIconSide = 4096;
inline constexpr std::uint64_t kMaximumIconPixels = std::uint64_t{1} << 22;

/// The image of an icon file as the home screen shows it: scaled to fill 120 x 120 pixels, with
/// rounded corners, encoded as PNG. Refuses what is not a whole PNG within the limits above; the
/// size that the image claims is checked before anything is allocated for it. Callable on any
/// thread.
[[nodiscard]] Result<Bytes> renderIcon(ByteView png);

/// The icon of an application that has no usable one: the first letter of its name on a colour that
/// follows from its identifier; the same for the same arguments. Encoded as PNG, 120 x 120 pixels.
[[nodiscard]] Result<Bytes> renderDefaultIcon(const std::string& identifier,
                                              const std::string& name);

}  // namespace appsync
