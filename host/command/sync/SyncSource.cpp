#include "host/command/sync/SyncSource.h"

#include <algorithm>
#include <string>
#include <string_view>
#include <vector>

#include "host/command/argument/IdentifierArgument.h"
#include "host/command/sync/MirrorSource.h"
#include "host/command/sync/SyncCommands.h"
#include "host/console/Problem.h"
#include "host/plan/LibraryReader.h"
#include "system/file/PosixError.h"

namespace appsync {
namespace {

Status checkIdentifiers(const std::vector<std::string>& identifiers, std::string_view whatToDo,
                        std::string_view option) {
    for (const std::string& identifier : identifiers) {
        if (Status legal = checkIdentifier(identifier, whatToDo, option); !legal) return legal;
    }
    return {};
}

Status checkChoice(const SyncArguments& arguments) {
    const std::vector<std::string>& only = arguments.plan.only;
    if (only.empty()) return {};
    if (arguments.isStaged) {
        return wrongUsage("--only does not go with --staged", "the staging area says what to sync");
    }
    if (arguments.plan.mirror) {
        return wrongUsage("--only does not go with --mirror",
                          "a mirror is one of the whole library");
    }
    for (const std::string& identifier : arguments.plan.remove) {
        if (std::find(only.begin(), only.end(), identifier) == only.end()) continue;
        return wrongUsage(identifier + " is named by --only and by --remove",
                          "sync it or remove it");
    }
    return checkIdentifiers(only, kUseLegalCharacters, "--only");
}

// A removal, an application that is chosen or a staging area may be all that is wanted.
bool wantsPackages(const SyncArguments& arguments) {
    const PlanOptions& plan = arguments.plan;
    return !arguments.isStaged && !plan.mirror && plan.remove.empty() && plan.only.empty();
}

}  // namespace

Status checkSyncArguments(const SyncArguments& arguments) {
    if (arguments.isStaged && (arguments.plan.mirror || !arguments.plan.remove.empty())) {
        return wrongUsage("--staged goes with neither --remove nor --mirror",
                          "the staging area says what to remove");
    }
    Status legal = checkIdentifiers(arguments.plan.remove, kGiveAsShown, "--remove");
    return legal ? checkChoice(arguments) : legal;
}

Result<Library> readSyncLibrary(const SyncArguments& arguments,
                                PropertyListSerialization& propertyLists,
                                const StepProgress& progress) {
    if (Status folder = checkLibraryFolder(arguments.library); !folder) return folder.error();
    Result<Library> library = readLibrary(arguments.library, propertyLists, progress);
    if (!library) return library;
    // Where a few applications are chosen, the places of the others are not the sync's to say.
    if (!arguments.plan.only.empty()) library->iconOrder.reset();
    if (library->packages.empty() && library->faults.empty() && wantsPackages(arguments)) {
        library->notes.push_back(displayPath(arguments.library) +
                                 " holds no package (*.zip): there is nothing to install");
    }
    if (!arguments.plan.mirror) return library;
    if (Status mirrored = checkMirrorSource(*library, arguments.mirrorsEmpty); !mirrored) {
        return mirrored.error();
    }
    return library;
}

}  // namespace appsync
