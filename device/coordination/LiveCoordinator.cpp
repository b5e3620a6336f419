#include "device/coordination/LiveCoordinator.h"

#include <algorithm>
#include <utility>

#include "device/database/Database.h"
#include "device/values/DeviceError.h"

namespace appsync {

namespace {

std::shared_ptr<LivePromise> unlessCancelled(std::shared_ptr<LivePromise> promise) {
    if (promise != nullptr && promise->values().cancelled) return nullptr;
    return promise;
}

}  // namespace

LiveCoordinator::LiveCoordinator(const StoredCoordinator& stored, Origin comesFrom)
    : id(stored.id),
      identifier(stored.identifier),
      kind(stored.kind),
      client(stored.client),
      origin(comesFrom),
      responsible_(stored.responsible),
      options_(stored.options),
      hasInitialAssets_(stored.hasInitialAssets),
      placeholder_(stored.placeholder),
      isWritten_(comesFrom == Origin::Database) {
    for (const StoredPromise& promise : stored.promises) {
        pieces_.push_back(
            {promise.role, promise.position, std::make_shared<LivePromise>(promise.values)});
    }
}

StoredCoordinator LiveCoordinator::snapshot() const {
    const std::lock_guard lock(mutex_);
    return snapshotLocked();
}

StoredCoordinator LiveCoordinator::snapshotLocked() const {
    StoredCoordinator now;
    now.id = id;
    now.identifier = identifier;
    now.kind = kind;
    now.client = client;
    now.responsible = responsible_;
    now.options = options_;
    now.hasInitialAssets = hasInitialAssets_;
    now.placeholder = placeholder_;
    for (const Piece& piece : pieces_) {
        now.promises.push_back({piece.role, piece.position, piece.promise->values()});
    }
    return now;
}

std::vector<std::pair<PromiseRole, std::shared_ptr<LivePromise>>> LiveCoordinator::promisesByRole()
    const {
    const std::lock_guard lock(mutex_);
    std::vector<std::pair<PromiseRole, std::shared_ptr<LivePromise>>> all;
    for (const Piece& piece : pieces_) all.emplace_back(piece.role, piece.promise);
    return all;
}

std::shared_ptr<LivePromise> LiveCoordinator::promise(PromiseRole role) const {
    const std::lock_guard lock(mutex_);
    const auto found = std::find_if(pieces_.begin(), pieces_.end(),
                                    [role](const Piece& piece) { return piece.role == role; });
    return found == pieces_.end() ? nullptr : unlessCancelled(found->promise);
}

Status LiveCoordinator::mayAdd(bool alreadyThere, const char* what) const {
    if (ended_ || ending_) {
        return coordinationError(CoordinationErrorCode::Over,
                                 "the install of " + identifier + " is over");
    }
    if (!alreadyThere) return {};
    return coordinationError(CoordinationErrorCode::AlreadySet,
                             "the coordinator of " + identifier + " has " + what + " already");
}

Status LiveCoordinator::setOptions(Bytes options) {
    const std::lock_guard lock(mutex_);
    const Status status = mayAdd(options_.has_value(), "install options");
    if (!status) return status;
    options_ = std::move(options);
    rowChanged_ = true;
    return {};
}

Status LiveCoordinator::setInitialAssets(
    const std::vector<std::shared_ptr<LivePromise>>& promises) {
    const std::lock_guard lock(mutex_);
    const Status status = mayAdd(hasInitialAssets_, "initial assets");
    if (!status) return status;
    hasInitialAssets_ = true;
    rowChanged_ = true;
    std::int64_t position = 0;
    for (const auto& promise : promises) {
        pieces_.push_back({PromiseRole::InitialAsset, position++, promise});
    }
    return {};
}

Status LiveCoordinator::setPromise(PromiseRole role, const std::shared_ptr<LivePromise>& promise) {
    const std::lock_guard lock(mutex_);
    const bool alreadyThere = std::any_of(pieces_.begin(), pieces_.end(), [&](const Piece& piece) {
        return piece.role == role && unlessCancelled(piece.promise) != nullptr;
    });
    const Status status =
        mayAdd(alreadyThere, role == PromiseRole::Asset ? "a package promise" : "user data");
    if (!status) return status;
    removePiece(role);  // the one that was given up
    const auto place = std::find_if(pieces_.begin(), pieces_.end(),
                                    [role](const Piece& piece) { return piece.role > role; });
    pieces_.insert(place, {role, 0, promise});
    return {};
}

void LiveCoordinator::removePiece(PromiseRole role) {
    std::erase_if(pieces_, [role](const Piece& piece) { return piece.role == role; });
}

Status LiveCoordinator::setResponsible(CoordinationClient responsible) {
    const std::lock_guard lock(mutex_);
    const Status status = mayAdd(responsible_.has_value(), "a client responsible for the package");
    if (!status) return status;
    responsible_ = responsible;
    rowChanged_ = true;
    return {};
}

Status LiveCoordinator::keepPlaceholder() {
    const std::lock_guard lock(mutex_);
    const Status status = mayAdd(placeholder_ != PlaceholderState::None, "a placeholder");
    if (!status) return status;
    placeholder_ = PlaceholderState::Kept;
    rowChanged_ = true;
    return {};
}

void LiveCoordinator::dropPlaceholder() {
    const std::lock_guard lock(mutex_);
    if (placeholder_ != PlaceholderState::Kept) return;
    placeholder_ = PlaceholderState::None;
    rowChanged_ = true;
}

void LiveCoordinator::setPlaceholderState(PlaceholderState state) {
    const std::lock_guard lock(mutex_);
    placeholder_ = state;
}

void LiveCoordinator::setObserver(std::weak_ptr<InstallCoordinatorObserver> observer) {
    const std::lock_guard lock(mutex_);
    observer_ = std::move(observer);
}

std::shared_ptr<InstallCoordinatorObserver> LiveCoordinator::observer() const {
    const std::lock_guard lock(mutex_);
    return observer_.lock();
}

bool LiveCoordinator::beginFulfillment() {
    const std::lock_guard lock(mutex_);
    return !std::exchange(fulfilling_, true);
}

bool LiveCoordinator::claimInstall() {
    const std::lock_guard lock(mutex_);
    if (claimed_ || ending_ || ended_ || missingPiece(snapshotLocked())) return false;
    claimed_ = true;
    return true;
}

// One whose pieces are all there was written with its placeholder.
bool LiveCoordinator::isBegun() const {
    const std::lock_guard lock(mutex_);
    return origin == Origin::New && !claimed_ && !ending_ && !ended_;
}

bool LiveCoordinator::goesOn() const {
    const std::lock_guard lock(mutex_);
    return !ending_ && !ended_;
}

bool LiveCoordinator::beginEnding() {
    const std::lock_guard lock(mutex_);
    if (ending_ || ended_) return false;
    ending_ = true;
    return true;
}

void LiveCoordinator::abandonEnding() {
    const std::lock_guard lock(mutex_);
    ending_ = false;
}

bool LiveCoordinator::end(const std::optional<ErrorRecord>& error) {
    std::vector<Piece> pieces;
    {
        const std::lock_guard lock(mutex_);
        if (ended_) return false;
        ended_ = true;
        error_ = error;
        pieces = pieces_;
    }
    for (const Piece& piece : pieces) piece.promise->close();
    return true;
}

bool LiveCoordinator::hasEnded() const {
    const std::lock_guard lock(mutex_);
    return ended_;
}

std::optional<ErrorRecord> LiveCoordinator::error() const {
    const std::lock_guard lock(mutex_);
    return error_;
}

bool LiveCoordinator::beginSaving() {
    const std::lock_guard lock(mutex_);
    return !std::exchange(saving_, true);
}

std::optional<LiveCoordinator::Writing> LiveCoordinator::takeWriting(std::uint64_t losses,
                                                                     For what) {
    const std::lock_guard lock(mutex_);
    saving_ = false;
    if (ended_) return std::nullopt;
    Writing writing;
    writing.isNew = !std::exchange(isWritten_, true);
    const bool stays = (!ending_ || what == For::End) && !isLeaving_ && !isPreceded_;
    writing.mayBeLost = stays && losses_ && *losses_ != losses;
    if (stays || !losses_) losses_ = losses;  // what is not mended now may be later
    const bool hasChanged = std::exchange(rowChanged_, false);
    if (hasChanged || writing.isNew || writing.mayBeLost) writing.row = snapshotLocked();
    writing.pieces = pieces_;
    return writing;
}

// Of one that was cancelled by somebody else the database tells.
Result<bool> LiveCoordinator::saveRow(Database& database, const Writing& writing) const {
    if (writing.isNew) return insertReserved(database, *writing.row);
    const Result<bool> updated = updateCoordinator(database, *writing.row);
    if (!updated || *updated || !writing.mayBeLost || origin != Origin::New) return updated;
    const Result<bool> cancelled = wasCancelled(database, id);
    if (!cancelled) return cancelled;
    return *cancelled ? Result<bool>(false) : insertReserved(database, *writing.row);
}

void LiveCoordinator::giveWay() {
    const std::lock_guard lock(mutex_);
    isPreceded_ = true;
}

void LiveCoordinator::stay() {
    const std::lock_guard lock(mutex_);
    isLeaving_ = false;
}

Result<bool> LiveCoordinator::save(Database& database, For what) {
    const std::optional<Writing> writing = takeWriting(database.losses(), what);
    if (!writing) return false;
    if (writing->row) {
        const Result<bool> written = saveRow(database, *writing);
        if (writing->isNew && written && !*written) giveWay();
        if (!written || !*written) return written;
    }
    for (const Piece& piece : writing->pieces) {
        std::optional<PromiseValues> values = piece.promise->takeChanged();
        if (!values && writing->mayBeLost) values = piece.promise->values();
        if (!values) continue;
        const Status stored = storePromise(database, id, {piece.role, piece.position, *values});
        if (!stored) return stored.error();
    }
    return true;
}

Result<bool> LiveCoordinator::forget(Database& database) {
    const Result<bool> saved = save(database);
    if (!saved || !*saved) return saved;
    {
        const std::lock_guard lock(mutex_);
        isLeaving_ = true;
    }
    return forgetCoordinator(database, id);
}

}  // namespace appsync
