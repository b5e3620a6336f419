#pragma once

#include <string>

#include "platform/Result.h"

namespace appsync {

/// Whether a file of this machine can be a module for this process, as far as can be seen without
/// running anything of it: a whole shared object, built for this machine. The system's loader says
/// of another machine's that there is no such file, and ends the process over one that is cut
/// short.
Status checkModuleFile(const std::string& path);

}  // namespace appsync
