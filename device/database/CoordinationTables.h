#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "device/values/PromiseValues.h"
#include "platform/Bytes.h"
#include "platform/Error.h"
#include "platform/InstallCoordinatorService.h"
#include "platform/Result.h"

namespace appsync {

class Database;
struct CoordinatorRecord;

/// What became of the placeholder that a coordinator was handed. The numbers stand in the database
/// and do not change any more once it stands there.
enum class PlaceholderState : std::int64_t {
    None = 0,
    Kept = 1,      // its configuration is not complete: it is not shown
    Stands = 2,    // on the home screen
    Borrowed = 3,  // that of the demoted application stands there, and outlives the coordinator
};

/// Which of a coordinator's promises. The numbers stand in the database.
enum class PromiseRole : std::int64_t { Asset = 0, UserData = 1, InitialAsset = 2 };

struct StoredPromise {
    PromiseRole role = PromiseRole::Asset;
    std::int64_t position = 0;  // among the initial assets
    PromiseValues values;
};

/// A coordinator as the database has it.
struct StoredCoordinator {
    std::int64_t id = 0;  // names it for ever, other than the identifier
    std::string identifier;
    CoordinatorKind kind = CoordinatorKind::Initiating;
    CoordinationClient client = 0;
    std::optional<CoordinationClient> responsible;
    std::optional<Bytes> options;
    bool hasInitialAssets = false;
    PlaceholderState placeholder = PlaceholderState::None;
    std::vector<StoredPromise> promises;  // by role and position

    /// The promise of a role, given up or not; null when there is none.
    [[nodiscard]] const PromiseValues* promise(PromiseRole role) const;
};

/// That a coordinator was cancelled by somebody who has no handle of this process on it.
struct Cancellation {
    std::int64_t id = 0;
    std::int64_t coordinator = 0;
    std::string identifier;
    CoordinationClient client = 0;
    ErrorRecord reason;
};

/// What a coordinator that was taken away leaves behind.
struct RemovedCoordinator {
    bool existed = false;
    bool hadPlaceholder = false;
    std::string container;  // of its placeholder; empty when there is none
};

/// "initiating" and so on.
[[nodiscard]] std::string nameOf(CoordinatorKind kind);

/// What an install waits for, as far as its coordinator is concerned.
struct MissingPiece {
    std::string sentence;
    std::optional<CoordinationClient> client;  // whose task it is
};

/// The first piece that a coordinator of its kind needs and that is not there; nothing when all
/// are.
///
/// - Every kind needs a placeholder, and each promise that it has kept or given up.
/// - A first install and an update need, besides, the install options, the list of initial assets
///   (which may be empty) and the package. The placeholder need not be shown.
/// - A restoring one needs the package besides.
/// - That of a demoted application needs no package: it is done when its placeholder stands.
[[nodiscard]] std::optional<MissingPiece> missingPiece(const StoredCoordinator& coordinator);

[[nodiscard]] CoordinatorRecord recordOf(const StoredCoordinator& coordinator);

// The statements. Those that change something run inside a transaction.

[[nodiscard]] Result<std::optional<StoredCoordinator>> findCoordinator(
    Database& database, const std::string& identifier);
/// Ordered by identifier.
[[nodiscard]] Result<std::vector<StoredCoordinator>> allCoordinators(Database& database);
/// Gives its id.
[[nodiscard]] Result<std::int64_t> insertCoordinator(Database& database,
                                                     const std::string& identifier,
                                                     CoordinatorKind kind,
                                                     CoordinationClient client);
/// Takes ids that no coordinator has or had, and none of another process's gets: so many, from the
/// one that it gives on.
[[nodiscard]] Result<std::int64_t> reserveCoordinatorIds(Database& database, std::int64_t count);
/// Writes a new coordinator with an id that was reserved, except its promises. False when the
/// identifier has one by now.
[[nodiscard]] Result<bool> insertReserved(Database& database, const StoredCoordinator& coordinator);
/// Writes what changes of a coordinator, except its promises. False when it is no longer there.
[[nodiscard]] Result<bool> updateCoordinator(Database& database,
                                             const StoredCoordinator& coordinator);
/// Its placeholder came to stand on the home screen. False when the coordinator is not there.
[[nodiscard]] Result<bool> storePlaceholderState(Database& database, std::int64_t id,
                                                 PlaceholderState state);
/// Writes a promise, unless its coordinator is no longer there.
Status storePromise(Database& database, std::int64_t coordinator, const StoredPromise& promise);

/// Takes a coordinator away and leaves its placeholder. False when it was not there.
[[nodiscard]] Result<bool> forgetCoordinator(Database& database, std::int64_t id);
/// Takes it away with the placeholder that is its own, and with what tells of a denial.
Status removeCoordinator(Database& database, std::int64_t id, RemovedCoordinator& removed);

/// Takes the coordinator of a restore away whose install failed, with what tells of a denial, and
/// puts another in its place that waits for a package anew. The placeholder goes on standing.
/// Nothing changes where the coordinator is not there.
Status renewRestore(Database& database, const StoredCoordinator& failed,
                    RemovedCoordinator& removed);

/// Tells the session that a coordinator was cancelled.
Status announceCancellation(Database& database, const Cancellation& cancellation);
/// Those that came after the one with that id, oldest first.
[[nodiscard]] Result<std::vector<Cancellation>> cancellationsSince(Database& database,
                                                                   std::int64_t id);
/// Whether somebody told that this coordinator was cancelled, and it is not forgotten yet.
[[nodiscard]] Result<bool> wasCancelled(Database& database, std::int64_t coordinator);
Status forgetCancellations(Database& database, std::int64_t upTo);

/// Cancels whatever coordinator the identifier has, because what it was to put in place is being
/// removed from the device. Its placeholder is not touched.
Status cancelForRemoval(Database& database, const std::string& identifier);

}  // namespace appsync
