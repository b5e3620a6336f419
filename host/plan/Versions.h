#pragma once

#include <compare>
#include <string_view>

namespace appsync {

/// Compares two application versions as people do: "1.10" is higher than "1.9", "2" equals "2.0".
///
/// The versions are cut at every character that is neither a letter nor a digit, and where letters
/// and digits meet. Pieces are compared in turn: numbers by value, words byte by byte, a number is
/// higher than a word ("1.0.1" > "1.0.beta"), a word is lower than nothing ("1.0b2" < "1.0"), and a
/// missing number counts as 0. Never fails, whatever the texts hold.
[[nodiscard]] std::weak_ordering compareVersions(std::string_view left, std::string_view right);

}  // namespace appsync
