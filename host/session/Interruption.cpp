#include "host/session/Interruption.h"

#include <unistd.h>

#include <ostream>

#include "host/console/Console.h"
#include "host/console/Problem.h"

namespace appsync {

std::string stoppingNotice() {
    return "stopping: what is under way gets " + std::to_string(kPatience.count()) +
           " seconds to end; a second Ctrl-C leaves at once";
}

void leaveAtOnce(const Console& console) {
    console.err << "appsync: interrupted before every install had ended: " << kRunAgain
                << std::endl;
    ::_exit(kExitSomethingFailed);
}

}  // namespace appsync
