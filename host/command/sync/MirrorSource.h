#pragma once

#include <string>

#include "platform/Result.h"

namespace appsync {

struct Library;

/// Refuses a folder that nobody can mean as LIBRARY: that of a device or of a backup.
[[nodiscard]] Status checkLibraryFolder(const std::string& folder);

/// Refuses a library that nobody can mean a device to be a mirror of, as all would be removed: a
/// folder in that of a device or of a backup, and, unless `mayBeEmpty`, one that holds no package.
[[nodiscard]] Status checkMirrorSource(const Library& library, bool mayBeEmpty);

}  // namespace appsync
