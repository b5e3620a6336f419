#pragma once

#include <string>
#include <string_view>

#include "platform/FileSystem.h"
#include "platform/PropertyList.h"

namespace appsync {

class Log;
struct Platform;

// The names of the files in a placeholder bundle.
inline constexpr std::string_view kPlaceholderIconFile = "Icon.png";
inline constexpr std::string_view kPlaceholderInfoFile = "Info.plist";

/// Key of an info dictionary (boolean): the application may not be started.
inline constexpr std::string_view kLaunchProhibitedKey = "RGApplicationLaunchProhibited";
/// Another (boolean).
inline constexpr std::string_view kPresselKey = "VKPresselApp";

// What the transaction log says of placeholders. The scenario is that of a restored application;
// the directory's failure counts as one of its steps whoever asked for the directory.
inline constexpr std::string_view kAppRestoreScenario = "Vessik App Restore";
inline constexpr std::string_view kPlaceholderDirectoryFailed = "Failed to create app directory";
inline constexpr std::string_view kPlaceholderInstalled = "Installed placeholder";
inline constexpr std::string_view kPlaceholderNotInstalled = "Failed to install placeholder";

/// Whom a placeholder bundle and what is in it belong to.
[[nodiscard]] inline FileAttributes placeholderFileAttributes() { return {"mobile", "mobile"}; }

/// Logs the info dictionary of a placeholder bundle that is about to be written.
void willCreatePlaceholder(const Log& log, const std::string& identifier, const PropertyList& info);
/// Has the registry install the directory, a placeholder bundle with this info dictionary, and logs
/// whether it did.
bool installPlaceholder(const Platform& platform, const std::string& directory,
                        const PropertyList& info, const PropertyList& options);

}  // namespace appsync
