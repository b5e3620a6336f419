#pragma once

// host/console: what every other room of host/ speaks with. `Console` (this header) is where a
// command prints; Problem.h makes errors that say what to do and carry an exit status; Text.h makes
// foreign text safe to print, and formats sizes and times; Table.h sets columns; JsonWriting.h and
// JsonReading.h are the two directions of JSON, PropertyListReading.h reads lists from it. Knows
// neither devices nor plans: includes platform/ and nlohmann-json only.

#include <cstddef>
#include <iosfwd>
#include <string>
#include <string_view>

namespace appsync {

struct ErrorRecord;

/// Where a command prints. The streams belong to the caller.
struct Console {
    std::ostream& out;
    std::ostream& err;
    /// `out` is a terminal that can redraw lines.
    bool isTerminal = false;
    /// Characters in a line of that terminal.
    std::size_t width = 80;
    /// What shows the help of the command that runs: "appsync apps --help". Empty: none does yet.
    std::string help{};
    /// Ends what is cut off to fit.
    std::string_view cutMark = "...";
    /// Lines of that terminal.
    std::size_t height = 24;
    /// Its width as it is now; null where that does not change.
    std::size_t (*measure)() = nullptr;

    /// Whether it takes more now without a wait; null where it always does.
    bool (*hasRoom)() = nullptr;

    [[nodiscard]] std::size_t currentWidth() const {
        return measure != nullptr ? measure() : width;
    }
    /// Whether what is only to be seen may be written now: a slow line, or a terminal that was
    /// stopped, must not hold up what is shown.
    [[nodiscard]] bool takesMore() const { return hasRoom == nullptr || hasRoom(); }

    /// One line on the error stream: "appsync: " and the text, made safe to print.
    void complain(std::string_view text) const;
    /// The same of an error; wrong usage is told where the help is. Gives the exit status that it
    /// asks for.
    int fail(const ErrorRecord& error) const;
};

/// The console of this process.
[[nodiscard]] Console processConsole();

}  // namespace appsync
