#pragma once

#include <functional>
#include <string>

#include "platform/Result.h"

namespace appsync {

struct InstallContext;

/// Puts what is to be an application's data into the empty directory of the descriptor.
using DataFill = std::function<Status(int directory)>;

// The data that a restore has left for an application: an archive that waits on the device until
// the application is installed.

/// The device path of the archive.
[[nodiscard]] std::string restoreArchiveOf(const std::string& identifier);

/// Unpacks the archive, if there is one, and puts what it holds in the place of the application's
/// data. It stays until the install is committed, so that an install that was cut off does it
/// again. Nothing is made durable. An archive that cannot be used is an error, and the data stays
/// as it was.
Status placeRestoredData(const InstallContext& context, const std::string& identifier);

/// Refuses where the application's data cannot be replaced: nothing stands under the identifier, or
/// it runs, or data that a restore has left waits for its install.
Status checkDataReplaceable(const InstallContext& context, const std::string& identifier);

/// Replaces the data of an application by what `fill` puts into an empty directory: all of it, in
/// one step, on disk when it returns; or, on failure, nothing. Refused where `checkDataReplaceable`
/// is, whatever has changed meanwhile. Only while the session's lock is held.
Status replaceDataWith(const InstallContext& context, const std::string& identifier,
                       const DataFill& fill);

/// Removes the archive, if there is one.
void dropRestoredData(const InstallContext& context, const std::string& identifier);

}  // namespace appsync
