#pragma once

#include <string>

#include "platform/Result.h"

namespace appsync {

struct InstallContext;

// The data that a restore has left for an application: an archive that waits on the device until
// the application is installed.

/// The device path of the archive.
[[nodiscard]] std::string restoreArchiveOf(const std::string& identifier);

/// Unpacks the archive, if there is one, and puts what it holds in the place of the application's
/// data. It stays until the install is committed, so that an install that was cut off does it
/// again. Nothing is made durable. An archive that cannot be used is an error, and the data stays
/// as it was.
Status placeRestoredData(const InstallContext& context, const std::string& identifier);

/// Removes the archive, if there is one.
void dropRestoredData(const InstallContext& context, const std::string& identifier);

}  // namespace appsync
