#include "host/console/Problem.h"

#include <string>

#include "host/console/Text.h"

namespace appsync {
namespace {

ErrorRecord problem(ExitStatus status, std::string_view what, std::string_view whatToDo) {
    return ErrorRecord::make(kCommandErrorDomain, status,
                             std::string(what) + ": " + std::string(whatToDo));
}

}  // namespace

ErrorRecord failure(std::string_view what, std::string_view whatToDo) {
    return problem(kExitSomethingFailed, what, whatToDo);
}

ErrorRecord wrongUsage(std::string_view what, std::string_view whatToDo) {
    return problem(kExitWrongUsage, what, whatToDo);
}

ErrorRecord unusable(std::string_view what, std::string_view whatToDo) {
    return problem(kExitUnusable, what, whatToDo);
}

ErrorRecord unusable(const ErrorRecord& cause) {
    return ErrorRecord::make(kCommandErrorDomain, kExitUnusable, cause.description());
}

ErrorRecord lackOfSpace(std::string_view subject, std::uint64_t needed, std::uint64_t free,
                        std::string_view whatToDo) {
    return failure(std::string(subject) + " needs " + formatBytes(needed) + ", the device has " +
                       formatBytes(free) + " free",
                   whatToDo);
}

ExitStatus exitStatusOf(const ErrorRecord& error) {
    if (error.domain != kCommandErrorDomain) return kExitSomethingFailed;
    switch (error.code) {
        case kExitWrongUsage:
            return kExitWrongUsage;
        case kExitUnusable:
            return kExitUnusable;
        default:
            return kExitSomethingFailed;
    }
}

}  // namespace appsync
