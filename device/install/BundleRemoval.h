#pragma once

#include <string>
#include <vector>

#include "platform/Result.h"

namespace appsync {

struct InstallContext;

/// Which of what stands under an identifier goes.
enum class Removal {
    /// The placeholder where there is one, else the application.
    PlaceholderFirst,
    PlaceholderOnly,
    /// The placeholder of a sync, which stands for an install that has failed. What was there
    /// before that install stays.
    SyncPlaceholderOnly,
    /// All of it, and the installer's list says so: what a person does.
    Everything,
};

/// Removes what stands under an identifier that is legal. With the last of it goes the data, except
/// behind a sync's placeholder, which never brought any, and where the context keeps it. A
/// coordinator of the identifier is cancelled along with it. On disk when it returns. A registry
/// error when there is nothing to remove, or when it is a system application. Any thread.
Status removeBundles(const InstallContext& context, const std::string& identifier, Removal removal);

/// Removes every placeholder that came with a sync, in one step, except those of coordinators.
/// Gives their identifiers.
[[nodiscard]] Result<std::vector<std::string>> removeSyncPlaceholders(
    const InstallContext& context);

/// The device path of an application's data.
[[nodiscard]] std::string dataDirectoryOf(const std::string& identifier);

}  // namespace appsync
