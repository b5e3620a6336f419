#pragma once

#include <string>
#include <vector>

namespace appsync {

struct Console;

/// Understands the arguments (without the program's name), runs the command and gives the exit
/// status.
[[nodiscard]] int runCommandLine(std::vector<std::string> arguments, const Console& console);

}  // namespace appsync
