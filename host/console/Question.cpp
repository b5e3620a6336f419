#include "host/console/Question.h"

#include <unistd.h>

#include <iostream>
#include <string>

#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"

namespace appsync {

Status askBeforeLosing(const Loss& loss, const Console& console) {
    if (::isatty(STDIN_FILENO) == 0 || ::isatty(STDERR_FILENO) == 0) {
        return failure(loss.what, loss.whatToDo);
    }
    console.out.flush();
    console.err << printable(loss.question) << " [y/N] " << std::flush;
    std::string answer;
    if (!std::getline(std::cin, answer)) console.err << '\n';
    if (answer == "y" || answer == "Y" || answer == "yes") return {};
    return failure(loss.what, "nothing was changed");
}

}  // namespace appsync
