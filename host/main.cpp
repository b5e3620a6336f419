#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <new>
#include <ostream>
#include <string>
#include <system_error>
#include <vector>

#include "host/command/CommandLine.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "system/AllocatorTuning.h"

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

/// An exception that nothing on its thread can catch: it ends the process, as a crash would, which
/// a device survives. Who runs out of memory or threads is told so.
[[noreturn]] void endWithoutMeans() {
    const char* what = nullptr;
    try {
        if (const std::exception_ptr thrown = std::current_exception()) {
            std::rethrow_exception(thrown);
        }
    } catch (const std::bad_alloc& error) {
        what = error.what();
    } catch (const std::system_error& error) {
        what = error.what();
    } catch (...) {
        what = nullptr;
    }
    if (what == nullptr) std::abort();
    // In one piece: another thread may be about to say the same.
    std::array<char, 256> line{};
    std::snprintf(line.data(), line.size(), "appsync: out of means: %s: run it again\n", what);
    [[maybe_unused]] const ssize_t written =
        ::write(STDERR_FILENO, line.data(), std::strlen(line.data()));
    ::_exit(appsync::kExitSomethingFailed);
}

}  // namespace

int main(int argumentCount, char** arguments) {
    appsync::tuneAllocator();
    // Neither a reader that goes away (| head) nor a limit on the size of files may end a session
    // in its middle: both are errors of the write.
    std::signal(SIGPIPE, SIG_IGN);
    std::signal(SIGXFSZ, SIG_IGN);
    std::set_terminate(endWithoutMeans);
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
