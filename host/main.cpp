#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <csignal>
#include <exception>
#include <ostream>
#include <string>
#include <vector>

#include "host/CommandLine.h"
#include "host/Console.h"
#include "host/Problem.h"

namespace {

/// No file may get the number of a standard stream that is closed: what is printed would go there.
/// Nothing can be written to what stands in its place, so that it shows as before.
void keepStandardStreams() {
    int descriptor = 0;
    while (descriptor >= 0 && descriptor <= STDERR_FILENO) {
        descriptor = ::open("/dev/null", O_RDONLY | O_CLOEXEC);
    }
    if (descriptor >= 0) ::close(descriptor);
}

bool hasReaderGoneAway() {
    pollfd output = {STDOUT_FILENO, POLLOUT, 0};
    return ::poll(&output, 1, 0) > 0 && (output.revents & POLLERR) != 0;
}

/// What was printed must have arrived: a full disk must not pass for a whole output. A reader that
/// has gone away has seen what it wanted.
int afterOutput(const appsync::Console& console, int status) {
    console.out.flush();
    if (console.out || hasReaderGoneAway()) return status;
    console.complain("the output could not be written whole: see that there is room for it");
    return status == appsync::kExitDone ? appsync::kExitSomethingFailed : status;
}

}  // namespace

int main(int argumentCount, char** arguments) {
    // A reader that goes away (| head) must not end a session in its middle.
    std::signal(SIGPIPE, SIG_IGN);
    keepStandardStreams();
    const appsync::Console console = appsync::processConsole();
    try {
        const int status =
            appsync::runCommandLine({arguments + 1, arguments + argumentCount}, console);
        return afterOutput(console, status);
    } catch (const std::exception& error) {
        console.complain(std::string("out of means: ") + error.what() + ": run it again");
        return appsync::kExitSomethingFailed;
    }
}
