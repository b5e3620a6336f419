#pragma once

#include <string>

#include "platform/Bytes.h"
#include "system/file/RootDirectory.h"

namespace appsync {

/// Changes the file at a device path to new contents without writing it anew, where that is as
/// safe: a regular file with no other name, as long as the contents, and different from them within
/// one aligned word of eight bytes. A disk writes a word whole or not at all, and the kernel copies
/// it in one piece; so whoever reads the file, or finds it after a loss of power, has the old
/// contents or the new ones. Nothing is waited for. False when the file is not so, or on any
/// failure: then it is as it was.
[[nodiscard]] bool writeInPlace(const RootDirectory& root, const std::string& path,
                                ByteView contents);

}  // namespace appsync
