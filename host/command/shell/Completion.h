#pragma once

#include <functional>
#include <string>
#include <vector>

#include "host/command/shell/CommandEntry.h"

namespace appsync {

/// What can stand at the end of a line. Files and directories are the shell's to find; where it is
/// to be a device, all directories are good only where none of them is one.
struct Completions {
    enum class Paths { None, Devices, Directories, Files };

    struct Candidate {
        std::string word;
        std::string description;

        friend bool operator==(const Candidate&, const Candidate&) = default;
    };

    std::vector<Candidate> candidates;
    Paths paths = Paths::None;
};

/// The identifiers of what is on a device; none where there is no device.
using IdentifiersOfDevice = std::function<std::vector<std::string>(const std::string& device)>;

/// What the last of the words can become: those before it are a line of the command, without its
/// name. A line that cannot be right has no end.
[[nodiscard]] Completions completionsOf(const CommandEntry& program,
                                        const std::vector<std::string>& words,
                                        const IdentifiersOfDevice& identifiers);

/// As the scripts read it: "word<TAB>description" a line; at last ":files", ":directories" or
/// ":devices" where the shell is to find these.
[[nodiscard]] std::string completionLines(const Completions& completions);

/// The script that has a shell (bash, zsh or fish) complete the lines of the command; empty for
/// another shell. It asks the command itself, so it needs no change when a command does.
[[nodiscard]] std::string completionScript(const std::string& shell);

}  // namespace appsync
