#pragma once

#include <string>
#include <vector>

#include "host/command/shell/CommandEntry.h"
#include "host/command/shell/ManualPages.h"

namespace appsync {

struct Console;

/// Prints what the last of the words can become. `words` may begin with "--", which is none of
/// them. Never fails: a shell has no place to show why.
[[nodiscard]] int runComplete(const CommandEntry& program, std::vector<std::string> words,
                              const Console& console);

/// Prints the script for that shell, which is one of those that there is a script for.
[[nodiscard]] int runCompletion(const std::string& shell, const Console& console);

/// Writes the pages into the folder, which is made where it is none.
[[nodiscard]] int runManual(const std::string& folder, const std::vector<ManualPage>& pages,
                            bool asJson, const Console& console);

}  // namespace appsync
