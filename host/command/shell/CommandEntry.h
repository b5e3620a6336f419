#pragma once

// host/command/shell: what makes the command at home in a shell, all of it from the one table of
// commands that `--help` is made of too: Completion.h finds what can follow the words of a line
// (and has the scripts that ask for it), ManualPages.h writes pages for man. Knows no command
// by name, and of devices only where they are and what is on them. Called by host/command only.

#include <string>
#include <vector>

namespace appsync {

/// An option of a command, or an argument that is known by its place.
struct OptionEntry {
    /// "--remove", "DEVICE"
    std::string name;
    std::string description;
    /// What stands for its value in the help: "ID", "on|off"; empty where it takes none.
    std::string value;
    bool isPlaced = false;
    bool isRequired = false;
    bool isRepeated = false;
};

/// The value of an argument that names what is not there yet.
inline constexpr const char* kNewPlace = "NEW";

/// A command as it was declared.
struct CommandEntry {
    std::string name;
    std::string description;
    std::vector<OptionEntry> options;
    std::vector<CommandEntry> commands;
};

/// The words that stand for a value "on|off"; none where it is anything else.
[[nodiscard]] std::vector<std::string> wordsOfValue(const std::string& value);

}  // namespace appsync
