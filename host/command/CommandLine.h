#pragma once

// host/command: `appsync`, command by command. CommandLine.cpp declares the commands and their
// options; what one does, once its arguments are understood, is a function that the header of a
// room declares (host/command/look/LookCommands.h ...), in a file of its own: <Name>Command.cpp. It
// gives the exit status (see host/console/Problem.h); errors have then been told on the console.
// Such a file holds what is the command's own: which arguments go together, what it opens, in which
// order it asks other rooms, what it prints. What could serve another command stands elsewhere:
// host/command/argument (a device, an application, a file that is named), host/plan (what is to be
// done), host/session (doing it with the plug-in), host/backup, host/output (texts and JSON).
//
// A new command: a function and a file in the room of its concern, its options in CommandLine.cpp,
// a line in docs/commands.md and in tests/host/command/CommandLineTest.cpp. The rooms do not know
// each other; together they include every other room of host/. Called by host/main.cpp only.

#include <string>
#include <vector>

namespace appsync {

struct Console;

/// Understands the arguments (without the program's name), runs the command and gives the exit
/// status.
[[nodiscard]] int runCommandLine(std::vector<std::string> arguments, const Console& console);

}  // namespace appsync
