#pragma once

#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "device/coordination/LivePromise.h"
#include "device/database/CoordinationTables.h"
#include "platform/Bytes.h"
#include "platform/InstallCoordinator.h"
#include "platform/Result.h"

namespace appsync {

class Database;

/// A coordinator as this process knows it; every handle on it shares one. It holds what the
/// database holds or is about to, and who observes. Callable on any thread; waits for nothing.
///
/// It lives in this order: pieces are added; `claimInstall` succeeds once; it ends. It may end at
/// any time, once.
class LiveCoordinator {
  public:
    enum class Origin { Database, New };

    /// Its promises are for the caller to attach. A new one stands in the database once it is
    /// saved.
    LiveCoordinator(const StoredCoordinator& stored, Origin comesFrom);

    const std::int64_t id;
    const std::string identifier;
    const CoordinatorKind kind;
    const CoordinationClient client;
    const Origin origin;

    [[nodiscard]] StoredCoordinator snapshot() const;
    [[nodiscard]] std::vector<std::pair<PromiseRole, std::shared_ptr<LivePromise>>> promisesByRole()
        const;
    /// The first promise of a role; null when there is none, or when it was given up.
    [[nodiscard]] std::shared_ptr<LivePromise> promise(PromiseRole role) const;

    // Each adds a piece that is not there yet, and refuses a second, and any after the end.
    Status setOptions(Bytes options);
    Status setInitialAssets(const std::vector<std::shared_ptr<LivePromise>>& promises);
    Status setPromise(PromiseRole role, const std::shared_ptr<LivePromise>& promise);
    Status setResponsible(CoordinationClient client);
    Status keepPlaceholder();
    /// The placeholder that is kept was given up: there is none.
    void dropPlaceholder();
    void setPlaceholderState(PlaceholderState state);

    void setObserver(std::weak_ptr<InstallCoordinatorObserver> observer);
    [[nodiscard]] std::shared_ptr<InstallCoordinatorObserver> observer() const;

    /// True the first time: its package is on its way.
    [[nodiscard]] bool beginFulfillment();
    /// True the first time that everything is there.
    [[nodiscard]] bool claimInstall();

    /// Whether it is a new one that goes on and that the database need not have yet.
    [[nodiscard]] bool isBegun() const;
    /// Whether nobody has ended it yet, or is about to.
    [[nodiscard]] bool goesOn() const;

    /// True for the one caller who may try to end it.
    [[nodiscard]] bool beginEnding();
    /// It could not.
    void abandonEnding();
    /// It has ended. False when it had before.
    [[nodiscard]] bool end(const std::optional<ErrorRecord>& error);
    [[nodiscard]] bool hasEnded() const;
    [[nodiscard]] std::optional<ErrorRecord> error() const;

    /// True for the one caller who has to see to it that changes are written.
    [[nodiscard]] bool beginSaving();
    /// What it is saved for: while it is about to end, only the transaction that ends it writes
    /// what was lost, as it takes that away again.
    enum class For { Life, End };
    /// Writes the changes that were not written yet, inside a transaction; all of it where the
    /// database has lost something since. False when it turns out that the database has it no
    /// longer.
    [[nodiscard]] Result<bool> save(Database& database, For what = For::Life);
    /// Takes it away with the transaction that installs it. False as that of `save`.
    [[nodiscard]] Result<bool> forget(Database& database);
    /// That transaction has failed.
    void stay();

  private:
    struct Piece {  // by role and position
        PromiseRole role;
        std::int64_t position;
        std::shared_ptr<LivePromise> promise;
    };

    /// What is to be written, by which way. Nothing where it has ended.
    struct Writing {
        bool isNew = false;
        bool mayBeLost = false;
        std::optional<StoredCoordinator> row;  // where it has changed
        std::vector<Piece> pieces;
    };
    [[nodiscard]] std::optional<Writing> takeWriting(std::uint64_t losses, For what);
    [[nodiscard]] Result<bool> saveRow(Database& database, const Writing& writing) const;
    void giveWay();

    [[nodiscard]] Status mayAdd(bool alreadyThere, const char* what) const;
    void removePiece(PromiseRole role);
    [[nodiscard]] StoredCoordinator snapshotLocked() const;

    mutable std::mutex mutex_;
    // Protected by mutex_.
    std::optional<CoordinationClient> responsible_;
    std::optional<Bytes> options_;
    bool hasInitialAssets_ = false;
    PlaceholderState placeholder_ = PlaceholderState::None;
    std::vector<Piece> pieces_;
    std::weak_ptr<InstallCoordinatorObserver> observer_;
    std::optional<ErrorRecord> error_;
    bool fulfilling_ = false;
    bool claimed_ = false;
    bool ending_ = false;
    bool ended_ = false;
    bool saving_ = false;
    bool rowChanged_ = false;
    bool isWritten_ = false;
    bool isLeaving_ = false;               // what installs it takes it away
    bool isPreceded_ = false;              // another process had begun one of its identifier
    std::optional<std::uint64_t> losses_;  // of the database, when it was written last
};

}  // namespace appsync
