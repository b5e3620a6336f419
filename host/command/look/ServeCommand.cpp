#include <unistd.h>

#include <chrono>
#include <cstddef>
#include <memory>
#include <ostream>
#include <string>

#include "host/command/argument/OpenDevice.h"
#include "host/command/look/LookCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/serve/LivePage.h"
#include "host/serve/http/HttpServer.h"
#include "host/session/StopSignals.h"
#include "system/file/PosixError.h"

namespace appsync {
namespace {

// What is looked at may be in somebody's hands for longer: then the process leaves at once, which
// leaves nothing undone.
constexpr std::chrono::milliseconds kPatienceOfServer{600};

ErrorRecord cannotListen(const ServeArguments& arguments, const ErrorRecord& cause) {
    return failure(cause.description(), arguments.port == 0
                                            ? "try again"
                                            : "give another port (--port N), or --port 0 for one "
                                              "that is free");
}

}  // namespace

int runServe(const ServeArguments& arguments, const Console& console) {
    Result<std::unique_ptr<LivePage>> page =
        LivePage::open(arguments.place, looksLikeDevice, arguments.version);
    if (!page) return console.fail(page.error());
    const Result<std::unique_ptr<HttpServer>> server = HttpServer::open(
        arguments.port, [&page](const HttpRequest& request) { return (*page)->answer(request); });
    if (!server) return console.fail(cannotListen(arguments, server.error()));
    const StopSignals signals(
        kPatienceOfServer, [&server] { (*server)->stop(); }, [] { ::_exit(kExitDone); });
    console.out << "Serving at http://127.0.0.1:" << (*server)->port() << "/ - Ctrl-C ends it."
                << std::endl;
    if (const std::size_t leftOut = (*page)->leftOut(); leftOut != 0) {
        console.complain(counted(leftOut, "device") + " of " + displayPath(arguments.place) +
                         (leftOut == 1 ? " is" : " are") +
                         " left out, as at most 500 are served at once: serve a folder with fewer, "
                         "or one of them by itself");
    }
    (*server)->run([&page] { (*page)->end(); });
    page->reset();  // while a signal still ends what may take long
    return kExitDone;
}

}  // namespace appsync
