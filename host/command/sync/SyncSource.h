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

/// Reads the library that they name. Refuses one that nobody can mean a device to be a mirror of.
[[nodiscard]] Result<Library> readSyncLibrary(const SyncArguments& arguments,
                                              PropertyListSerialization& propertyLists,
                                              const StepProgress& progress = {});

}  // namespace appsync
