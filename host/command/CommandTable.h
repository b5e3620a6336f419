#pragma once

#include "host/command/shell/CommandEntry.h"

namespace CLI {
class App;
}

namespace appsync {

/// What the parser knows of a command and of the commands in it, those apart that it keeps hidden.
[[nodiscard]] CommandEntry commandTable(const CLI::App& command);

}  // namespace appsync
