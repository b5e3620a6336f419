#include "host/command/argument/IdentifierArgument.h"

#include "device/values/PackageIdentifier.h"
#include "host/console/Problem.h"

namespace appsync {

Status checkIdentifier(const std::string& identifier, std::string_view whatToDo,
                       std::string_view option) {
    if (isLegalIdentifier(identifier)) return {};
    std::string given(option);
    if (!given.empty()) given += ' ';
    return wrongUsage(given + shownArgument(identifier) + " is not an identifier", whatToDo);
}

std::string shownArgument(const std::string& identifier) {
    return identifier.empty() ? "''" : identifier;
}

}  // namespace appsync
