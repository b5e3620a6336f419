#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace appsync {

/// The pieces between the slashes of a path, decoded; none for "/". Nothing where it does not begin
/// with a slash, where an escape is none, and where a piece is empty, "." or "..", or has a slash,
/// a control character or NUL in it once it is decoded.
[[nodiscard]] std::optional<std::vector<std::string>> decodedPieces(std::string_view path);

/// The text with everything escaped that has a meaning in an address.
[[nodiscard]] std::string percentEncoded(std::string_view text);

}  // namespace appsync
