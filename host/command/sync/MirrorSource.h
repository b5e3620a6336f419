#pragma once

#include "platform/Result.h"

namespace appsync {

struct Library;

/// Refuses a library that nobody can mean a device to be a mirror of, as all would be removed: the
/// folder of a device or of a backup, and, unless `mayBeEmpty`, one that holds no package.
[[nodiscard]] Status checkMirrorSource(const Library& library, bool mayBeEmpty);

}  // namespace appsync
