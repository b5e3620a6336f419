#include "host/Interruption.h"

#include <unistd.h>

#include <ostream>

#include "host/Console.h"
#include "host/Problem.h"

namespace appsync {

void leaveAtOnce(const Console& console) {
    console.err << "appsync: interrupted before every install had ended: " << kRunAgain
                << std::endl;
    ::_exit(kExitSomethingFailed);
}

}  // namespace appsync
