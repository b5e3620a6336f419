#pragma once

#include <string>
#include <vector>

#include "host/command/shell/CommandEntry.h"

namespace appsync {

/// A page of the manual, as troff reads it.
struct ManualPage {
    /// "appsync-package-make.1"
    std::string file;
    std::string text;
};

/// A page for the program, and one for each of its commands; `ending` is what the help of each ends
/// with, `version` that of the program.
[[nodiscard]] std::vector<ManualPage> manualPages(const CommandEntry& program,
                                                  const std::string& ending,
                                                  const std::string& version);

}  // namespace appsync
