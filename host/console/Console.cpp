#include "host/console/Console.h"

#include <poll.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdlib>
#include <iostream>
#include <string_view>

#include "host/console/Problem.h"
#include "host/console/Text.h"

namespace appsync {
namespace {

bool canRedraw() {
    const char* terminal = std::getenv("TERM");
    return ::isatty(STDOUT_FILENO) != 0 && terminal != nullptr &&
           std::string_view(terminal) != "dumb";
}

std::size_t terminalWidth() {
    winsize size{};
    if (::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) != 0 || size.ws_col == 0) return 80;
    return size.ws_col;
}

std::size_t terminalHeight() {
    winsize size{};
    if (::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) != 0 || size.ws_row == 0) return 24;
    return size.ws_row;
}

bool terminalHasRoom() {
    pollfd terminal{STDOUT_FILENO, POLLOUT, 0};
    return ::poll(&terminal, 1, 0) > 0;
}

// Of the locale's names, the first that is given counts.
std::string_view charactersOf() {
    for (const char* name : {"LC_ALL", "LC_CTYPE", "LANG"}) {
        const char* value = std::getenv(name);
        if (value != nullptr && *value != '\0') return value;
    }
    return "";
}

bool hasUtf8() {
    const std::string_view locale = charactersOf();
    return std::ranges::any_of(
        std::array<std::string_view, 4>{"UTF-8", "utf-8", "UTF8", "utf8"},
        [&](std::string_view name) { return locale.find(name) != std::string_view::npos; });
}

}  // namespace

void Console::complain(std::string_view text) const {
    out.flush();
    err << "appsync: " << printable(text) << '\n' << std::flush;
}

int Console::fail(const ErrorRecord& error) const {
    const ExitStatus status = exitStatusOf(error);
    const bool showsHelp = status == kExitWrongUsage && !help.empty();
    complain(error.description() + (showsHelp ? "; see " + help : ""));
    return status;
}

Console processConsole() {
    std::cerr.tie(nullptr);  // a complaint must not wait for an output that nobody reads
    return {std::cout,
            std::cerr,
            canRedraw(),
            terminalWidth(),
            {},
            hasUtf8() ? "\u2026" : "...",
            terminalHeight(),
            terminalWidth,
            terminalHasRoom};
}

}  // namespace appsync
