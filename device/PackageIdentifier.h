#pragma once

#include <cstddef>
#include <string_view>

namespace appsync {

/// The longest identifier of an application, in bytes.
inline constexpr std::size_t kMaximumIdentifierLength = 255;

/// Whether a device accepts the text as the identifier of an application: 1 to 255 bytes of
/// letters, digits, '.', '-' and '_', and neither "." nor "..". Such a text is safe as the name of
/// a file.
[[nodiscard]] bool isLegalIdentifier(std::string_view text) noexcept;

}  // namespace appsync
