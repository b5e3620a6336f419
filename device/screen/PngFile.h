#pragma once

#include <cstddef>
#include <cstdint>

#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

/// Rows of pixels as a PNG file has them: before each row a byte that says how it is filtered, and
/// for each pixel red, green, blue and how opaque it is, a byte each.
class PngRows {
  public:
    PngRows(std::uint32_t width, std::uint32_t height);

    /// Where the pixels of that row begin. Rows that nobody fills are transparent.
    [[nodiscard]] std::uint8_t* row(std::size_t number) noexcept;

    /// The file. It is compressed for speed: an icon is written with each install, so that its size
    /// matters less than the time. Fails when there is no memory for it.
    [[nodiscard]] Result<Bytes> file() const;

  private:
    std::uint32_t width_;
    std::uint32_t height_;
    Bytes rows_;
};

}  // namespace appsync
