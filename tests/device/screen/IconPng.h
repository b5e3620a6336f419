#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "device/screen/IconCanvas.h"
#include "platform/Bytes.h"

namespace appsync {

inline constexpr Color kRed = {1, 0, 0};
/// What a pixel of it is.
inline constexpr std::uint32_t kOpaqueRed = 0xffff0000;

/// A PNG of one colour.
[[nodiscard]] Bytes pngOf(int width, int height, const Color& color);

/// The same PNG, but claiming other dimensions (its checks are right).
[[nodiscard]] Bytes claimingSize(Bytes png, std::uint32_t width, std::uint32_t height);

/// The pixel of a PNG there: alpha, red, green, blue from the highest byte down, premultiplied.
[[nodiscard]] std::uint32_t pixelOf(ByteView png, int x, int y);

/// The width and height of a PNG: "120x120".
[[nodiscard]] std::string sizeOf(ByteView png);

}  // namespace appsync
