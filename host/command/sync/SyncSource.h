#pragma once

#include "host/plan/StepProgress.h"
#include "platform/Result.h"

namespace appsync {

class PropertyListSerialization;
struct Library;
struct SyncArguments;

/// Refuses options of `sync`, `plan` and `stage` that exclude each other, and identifiers that are
/// none.
[[nodiscard]] Status checkSyncArguments(const SyncArguments& arguments);

/// Reads the library that they name. Refuses a folder that nobody can mean as one, or as one to
/// mirror; a note tells of one that holds no package, unless that may be meant.
[[nodiscard]] Result<Library> readSyncLibrary(const SyncArguments& arguments,
                                              PropertyListSerialization& propertyLists,
                                              const StepProgress& progress = {});

}  // namespace appsync
