#include "host/console/Console.h"

#include <sys/ioctl.h>
#include <unistd.h>

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
    return {std::cout, std::cerr, canRedraw(), terminalWidth(), {}};
}

}  // namespace appsync
