#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "platform/Result.h"

namespace appsync {

struct PackageItem;

/// Writes the items, in their order, as an archive: the same, byte for byte, for the same names,
/// contents, modes and times. Contents are packed in pieces, of each of which `progress`, which may
/// be empty, hears the size. A file that becomes something else while it is packed is refused.
/// Nothing is made durable. Errors call the archive `name`: `path` may be a temporary one. The one
/// place that knows libzip's writer.
[[nodiscard]] Status writeArchive(const std::vector<PackageItem>& items, const std::string& path,
                                  const std::string& name,
                                  const std::function<void(std::uint64_t bytes)>& progress = {});
/// The same under its own name.
[[nodiscard]] Status writeArchive(const std::vector<PackageItem>& items, const std::string& path);

}  // namespace appsync
