#pragma once

#include <string>
#include <string_view>

#include "host/backup/Backup.h"

namespace appsync {

/// Reads what stands in a manifest. What a manifest has no use for is skipped. Answers why it
/// cannot be used; nothing when it can.
[[nodiscard]] std::string readManifestText(std::string_view text, BackupManifest& manifest);

}  // namespace appsync
