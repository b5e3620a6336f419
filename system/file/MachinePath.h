#pragma once

#include <string>

namespace appsync {

/// The longest file name of this machine, in bytes.
inline constexpr std::size_t kLongestMachineName = 255;

/// The path under which this machine keeps what stands at a path of a device. It is the same path,
/// but for names that no file of this machine can have: the placeholder of an application is built
/// in a directory `<identifier>.app`, and identifiers have up to 255 bytes. Such a name, of 256 to
/// 259 bytes, is kept without its ".app", and with "~app" in the place of an ".app" that stands
/// before that. So no two bundles in one directory share a name, as no identifier holds a '~'; a
/// name that does stays as it is.
[[nodiscard]] std::string machinePath(const std::string& path);

}  // namespace appsync
