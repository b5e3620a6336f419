#pragma once

#include <string>

#include "platform/Result.h"

namespace appsync {

/// Makes an empty device at a path of this machine: under a temporary name beside it, and renamed
/// when it is whole. See Device::create.
Status createDevice(const std::string& path, bool coordination);

}  // namespace appsync
