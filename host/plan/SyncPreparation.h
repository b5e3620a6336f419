#pragma once

#include <cstddef>
#include <string>

#include "host/plan/InterruptedStaging.h"
#include "host/plan/StagingArea.h"
#include "host/plan/StandingInstalls.h"
#include "host/plan/StepProgress.h"
#include "host/plan/SyncPlan.h"
#include "platform/Result.h"

namespace appsync {

class Device;
struct Library;

/// What is known of a sync before anything of it is done.
struct SyncPreparation {
    SyncPlan plan;
    SyncPlan allowed;           // what of it policy lets happen
    std::size_t forbidden = 0;  // how many applications of it policy does not
    std::string permission;     // what `appsync set` has to be told for these
    SpaceCheck space;           // for what is allowed
    StandingInstalls standing;
    /// The list stands here until the session begins.
    StagedTodoList staged;                  // only of a staged sync
    StagedWork givenUp = StagedWork::None;  // only of one that brings its own staging area
};

/// Looks at the device and plans a sync with the library.
[[nodiscard]] Result<SyncPreparation> prepareSync(Device& device, const Library& library,
                                                  const PlanOptions& options);

/// The same for the staging area that waits on the device: the library is where packages are.
[[nodiscard]] Result<SyncPreparation> prepareStagedSync(Device& device, const Library& library);

/// Makes the device ready for the session: nothing stays that an earlier one has left and that this
/// one does not go on with, and its own staging area stands. The progress is that of its writing.
Status clearTheWay(Device& device, const SyncPreparation& sync, const Library& library,
                   const StepProgress& progress = {});

/// The same where the staging area waits on the device, or an interrupted session has left it.
Status clearTheWayForStaged(Device& device, SyncPreparation& sync);

}  // namespace appsync
