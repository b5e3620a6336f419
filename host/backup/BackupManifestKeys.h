#pragma once

#include <cstdint>
#include <string_view>

namespace appsync {

// The names in a manifest (docs/device-format.md), and the format that this version writes.
inline constexpr std::uint64_t kBackupFormat = 1;

inline constexpr std::string_view kFormatKey = "format";
inline constexpr std::string_view kMadeKey = "made";
inline constexpr std::string_view kApplicationsKey = "applications";
inline constexpr std::string_view kFilesKey = "files";
inline constexpr std::string_view kIdentifierKey = "identifier";
inline constexpr std::string_view kVersionKey = "version";
inline constexpr std::string_view kNameKey = "name";
inline constexpr std::string_view kDataKey = "data";
inline constexpr std::string_view kSizeKey = "size";
inline constexpr std::string_view kSumKey = "sha256";

}  // namespace appsync
