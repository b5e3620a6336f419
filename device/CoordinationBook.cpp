#include "device/CoordinationBook.h"

#include <algorithm>

#include "device/Containers.h"
#include "device/Database.h"
#include "device/DeviceCoordinator.h"
#include "device/DeviceDatabase.h"
#include "device/DeviceError.h"
#include "device/DevicePaths.h"
#include "device/DeviceRegistry.h"
#include "device/ProgressBook.h"
#include "device/RegistryTables.h"
#include "device/WallClock.h"
#include "system/RootDirectory.h"
#include "system/RootedFileSystem.h"

namespace appsync {

namespace {

using Lookup = InstallCoordinatorService::Coordinator;

/// A client that restores notes that it waits for a placeholder after it has handed that in. News
/// that overtook it would be lost, and it would wait until its patience ends.
constexpr std::chrono::milliseconds kBookingTime{20};

Lookup nothing(const ErrorRecord& error) { return {nullptr, false, error}; }

ErrorRecord serviceClosed() {
    return coordinationError(CoordinationErrorCode::Over, "the device is closed");
}

ErrorRecord standsAlready(const StoredCoordinator& stored, CoordinationErrorCode code) {
    return coordinationError(code, "client " + std::to_string(stored.client) +
                                       " has a coordinator (" + nameOf(stored.kind) + ") for " +
                                       stored.identifier + "; let it finish, or cancel it first");
}

ErrorRecord notInstalled(const std::string& identifier) {
    return coordinationError(CoordinationErrorCode::NotInstalled,
                             identifier + " is not installed, so there is nothing to update");
}

Result<bool> isInstalled(Database& database, const std::string& identifier) {
    const auto row = findBundle(database, BundleTable::Applications, identifier);
    if (!row) return row.error();
    return row->has_value();
}

Result<StoredCoordinator> insert(Database& database, CoordinatorKind kind,
                                 const std::string& identifier, CoordinationClient client) {
    const Result<std::int64_t> id = insertCoordinator(database, identifier, kind, client);
    if (!id) return id.error();
    StoredCoordinator stored;
    stored.id = *id;
    stored.identifier = identifier;
    stored.kind = kind;
    stored.client = client;
    return stored;
}

Status storeFailure(Database& database, const std::string& identifier, const ErrorRecord& error) {
    return database
        .query(
            "INSERT OR REPLACE INTO failures (identifier, time, domain, code, description)"
            " VALUES (?, ?, ?, ?, ?)")
        .bind(identifier, milliseconds(wallNow()), error.domain, error.code, error.description())
        .run();
}

}  // namespace

CoordinationBook::CoordinationBook(const InstallContext& context, CoordinationHerald& herald,
                                   Access access)
    : context_(context), herald_(herald), access_(access) {}

void CoordinationBook::setInstaller(std::function<void(const Coordinator&)> install) {
    install_ = std::move(install);
}

void CoordinationBook::close() { closed_ = true; }

// Looking up.

Lookup CoordinationBook::lookUp(CoordinatorKind kind, const std::string& identifier,
                                CoordinationClient client,
                                InstallCoordinatorService::Creation creation) {
    if (closed_) return nothing(serviceClosed());
    if (Status legal = requireLegalIdentifier(identifier); !legal) return nothing(legal.error());
    hearOfOthers();
    Result<std::optional<StoredCoordinator>> found = read(identifier);
    if (!found) return nothing(found.error());
    bool wasCreated = false;
    if (!*found) {
        if (creation == InstallCoordinatorService::Creation::OnlyExisting) return {};
        Result<StoredCoordinator> made = findOrInsert(kind, identifier, client, wasCreated);
        if (!made) return nothing(made.error());
        *found = std::move(*made);
    }
    if ((*found)->kind != kind) {
        return nothing(standsAlready(**found, CoordinationErrorCode::OtherKind));
    }
    return {handle(adopt(**found)), wasCreated, std::nullopt};
}

CoordinationBook::Coordinator CoordinationBook::find(const std::string& identifier) {
    if (closed_) return nullptr;
    hearOfOthers();
    const Result<std::optional<StoredCoordinator>> found = read(identifier);
    if (!found || !*found) return nullptr;
    return adopt(**found);
}

std::shared_ptr<InstallCoordinator> CoordinationBook::existing(const std::string& identifier) {
    const Coordinator coordinator = find(identifier);
    return coordinator == nullptr ? nullptr : handle(coordinator);
}

Status CoordinationBook::create(const std::string& identifier, CoordinationClient client) {
    if (Status legal = requireLegalIdentifier(identifier); !legal) return legal;
    return context_.database.change(Durability::OnDisk, [&](Database& database) -> Status {
        const auto found = findCoordinator(database, identifier);
        if (!found) return found.error();
        if (*found) return standsAlready(**found, CoordinationErrorCode::AlreadyExists);
        const Result<bool> installed = isInstalled(database, identifier);
        if (!installed) return installed.error();
        const auto kind = *installed ? CoordinatorKind::Updating : CoordinatorKind::Initiating;
        const Result<StoredCoordinator> made = insert(database, kind, identifier, client);
        return made ? Status() : Status(made.error());
    });
}

void CoordinationBook::resume() {
    if (closed_ || access_ == Access::Look) return;
    std::call_once(resumed_, [this] {
        std::vector<StoredCoordinator> left;
        context_.database
            .read([&](Database& database) -> Status {
                Result<std::vector<StoredCoordinator>> all = allCoordinators(database);
                if (!all) return all.error();
                left = std::move(*all);
                return {};
            })
            .ignore();
        std::vector<Coordinator> adopted;
        for (const StoredCoordinator& stored : left) adopted.push_back(adopt(stored));
        for (const Coordinator& coordinator : adopted) proceed(coordinator);
    });
}

Result<std::optional<StoredCoordinator>> CoordinationBook::read(const std::string& identifier) {
    std::optional<StoredCoordinator> found;
    const Status status = context_.database.read([&](Database& database) -> Status {
        auto result = findCoordinator(database, identifier);
        if (!result) return result.error();
        found = std::move(*result);
        return {};
    });
    if (!status) return status.error();
    return found;
}

Result<StoredCoordinator> CoordinationBook::findOrInsert(CoordinatorKind kind,
                                                         const std::string& identifier,
                                                         CoordinationClient client,
                                                         bool& wasCreated) {
    StoredCoordinator stored;
    const Status status =
        context_.database.change(Durability::Soon, [&](Database& database) -> Status {
            auto found = findCoordinator(database, identifier);
            if (!found) return found.error();
            wasCreated = !found->has_value();
            if (*found) {
                stored = std::move(**found);
                return {};
            }
            const Result<bool> installed = isInstalled(database, identifier);
            if (!installed) return installed.error();
            if (kind == CoordinatorKind::Updating && !*installed) return notInstalled(identifier);
            Result<StoredCoordinator> made = insert(database, kind, identifier, client);
            if (!made) return made.error();
            stored = std::move(*made);
            return {};
        });
    if (!status) return status.error();
    return stored;
}

// Beside a session, others may change what was read at any time, so nothing is kept.
CoordinationBook::Coordinator CoordinationBook::adopt(const StoredCoordinator& stored) {
    Coordinator former;
    Coordinator made;
    {
        const std::lock_guard lock(mutex_);
        Coordinator& known = coordinators_[stored.identifier];
        if (known != nullptr && known->id == stored.id) return known;
        made = std::make_shared<LiveCoordinator>(stored);
        if (access_ == Access::Look) return made;
        former = std::exchange(known, made);
    }
    if (former != nullptr) (void)retire(former, coordinationError(CoordinationErrorCode::Over, ""));
    for (const auto& [role, promise] : made->promisesByRole()) {
        (void)promise->attach(listener(made, role, promise));
    }
    const auto asset = made->promise(PromiseRole::Asset);
    if (asset != nullptr && asset->isComplete()) noteDelivery(*made);
    return made;
}

std::shared_ptr<InstallCoordinator> CoordinationBook::handle(const Coordinator& coordinator) {
    return std::make_shared<DeviceCoordinator>(shared_from_this(), coordinator);
}

// Ending.

void CoordinationBook::cancel(const Coordinator& coordinator, const ErrorRecord& reason,
                              CoordinationClient client) {
    if (closed_ || !coordinator->beginEnding()) return;
    RemovedCoordinator removed;
    const Status status = context_.database.change(Durability::Soon, [&](Database& database) {
        Status done = removeCoordinator(database, coordinator->id, removed);
        if (!done || !removed.existed || access_ == Access::Session) return done;
        return announceCancellation(database,
                                    {0, coordinator->id, coordinator->identifier, client, reason});
    });
    if (!status || !removed.existed) {
        // The database fails, or somebody else has just ended it and tells of that.
        coordinator->abandonEnding();
        return hearOfOthers();
    }
    if (removed.hadPlaceholder) {
        context_.progress.forget(coordinator->identifier, kInstallStateCanceled);
        context_.containers.remove(removed.container);
    }
    if (access_ == Access::Session) removeFiles(*coordinator);
    if (retire(coordinator, reason)) tellCancellation(coordinator, reason, client);
}

void CoordinationBook::installed(const Coordinator& coordinator) {
    removeFiles(*coordinator);
    if (retire(coordinator, std::nullopt)) tellCompletion(coordinator);
}

void CoordinationBook::failed(const Coordinator& coordinator, const ErrorRecord& error) {
    fail(coordinator, error, FailureOf::Install);
}

void CoordinationBook::fail(const Coordinator& coordinator, const ErrorRecord& error,
                            FailureOf what) {
    if (!coordinator->beginEnding()) return;
    RemovedCoordinator removed;
    const Status status = context_.database.change(Durability::Soon, [&](Database& database) {
        Status done = removeCoordinator(database, coordinator->id, removed);
        if (!done || !removed.existed) return done;
        return storeFailure(database, coordinator->identifier, error);
    });
    if (status && !removed.existed) {
        coordinator->abandonEnding();
        hearOfOthers();
        if (retire(coordinator, error)) tellCompletion(coordinator);
        return;
    }
    // Where the database cannot take it, the next session tries the install again.
    if (status) {
        context_.progress.forget(coordinator->identifier, kInstallStateFailed);
        context_.containers.remove(removed.container);
        removeFiles(*coordinator);
    }
    if (!retire(coordinator, error)) return;
    if (what == FailureOf::Placeholder) tellPlaceholder(coordinator);
    tellCompletion(coordinator);
}

void CoordinationBook::hearOfOthers() {
    if (closed_ || access_ == Access::Look) return;
    std::vector<Cancellation> news;
    context_.database
        .read([&](Database& database) -> Status {
            Result<std::vector<Cancellation>> found = cancellationsSince(database, heardOf_);
            if (!found) return found.error();
            news = std::move(*found);
            return {};
        })
        .ignore();
    if (news.empty()) return;
    for (const Cancellation& cancellation : news) hear(cancellation);
    const std::int64_t last = news.back().id;
    heardOf_ = std::max(heardOf_.load(), last);
    context_.database.changeLater(
        [last](Database& database) { return forgetCancellations(database, last); });
}

void CoordinationBook::hear(const Cancellation& cancellation) {
    Coordinator coordinator;
    {
        const std::lock_guard lock(mutex_);
        const auto found = coordinators_.find(cancellation.identifier);
        if (found == coordinators_.end() || found->second->id != cancellation.coordinator) return;
        coordinator = found->second;
    }
    context_.progress.forget(cancellation.identifier, kInstallStateCanceled);
    removeFiles(*coordinator);
    if (!retire(coordinator, cancellation.reason)) return;
    tellCancellation(coordinator, cancellation.reason, cancellation.client);
}

bool CoordinationBook::retire(const Coordinator& coordinator,
                              const std::optional<ErrorRecord>& error) {
    if (!coordinator->end(error)) return false;
    const std::lock_guard lock(mutex_);
    const auto found = coordinators_.find(coordinator->identifier);
    if (found != coordinators_.end() && found->second == coordinator) coordinators_.erase(found);
    return true;
}

void CoordinationBook::removeFiles(const LiveCoordinator& coordinator) {
    const auto asset = coordinator.promise(PromiseRole::Asset);
    if (asset != nullptr) {
        const PromiseValues values = asset->values();
        if (values.complete && values.path) removeFile(*values.path);
    }
    removePlaceholderFiles(coordinator.identifier);
}

void CoordinationBook::removePlaceholderFiles(const std::string& identifier) {
    const std::string directory = std::string(kPlaceholderFilesDirectory) + "/" + identifier;
    context_.files.removeItem(directory + ".app").ignore();
}

// A promise is kept with a file; whatever else stands at the path is not the service's to remove.
void CoordinationBook::removeFile(const std::string& path) {
    if (!context_.files.root().openRegularFile(path)) return;
    context_.files.removeItem(path).ignore();
}

// Telling.

void CoordinationBook::tell(const Coordinator& coordinator, CoordinationHerald::Call call) {
    if (access_ == Access::Session) herald_.tell(coordinator, std::move(call));
}

void CoordinationBook::tellLast(const Coordinator& coordinator, CoordinationHerald::Call call) {
    if (access_ == Access::Look) return;
    herald_.tell(coordinator, std::move(call), [book = shared_from_this(), coordinator] {
        const std::lock_guard lock(book->mutex_);
        const auto found = book->underWay_.find(coordinator->identifier);
        if (found == book->underWay_.end() || found->second != coordinator->id) return;
        book->underWay_.erase(found);
        book->underWayShrank_.notify_all();
    });
}

void CoordinationBook::tellPlaceholder(const Coordinator& coordinator) {
    if (access_ == Access::Look) return;
    const bool restoring = coordinator->kind == CoordinatorKind::Restoring ||
                           coordinator->kind == CoordinatorKind::RestoringDemoted;
    herald_.tell(
        coordinator,
        [handle = handle(coordinator)](InstallCoordinatorObserver& observer) {
            observer.coordinatorDidInstallPlaceholder(handle);
        },
        {}, restoring ? kBookingTime : std::chrono::milliseconds(0));
}

void CoordinationBook::tellCompletion(const Coordinator& coordinator) {
    tellLast(coordinator, [handle = handle(coordinator)](InstallCoordinatorObserver& observer) {
        observer.coordinatorDidCompleteSuccessfully(handle);
    });
}

void CoordinationBook::tellCancellation(const Coordinator& coordinator, const ErrorRecord& reason,
                                        CoordinationClient client) {
    tellLast(coordinator,
             [handle = handle(coordinator), reason, client](InstallCoordinatorObserver& observer) {
                 observer.coordinatorCanceledWithReason(handle, reason, client);
             });
}

// Installs under way.

void CoordinationBook::noteDelivery(const LiveCoordinator& coordinator) {
    if (coordinator.client != SyncClientID) return;
    const std::lock_guard lock(mutex_);
    underWay_[coordinator.identifier] = coordinator.id;
}

std::vector<std::string> CoordinationBook::installsUnderWay() {
    const std::lock_guard lock(mutex_);
    std::vector<std::string> identifiers;
    for (const auto& [identifier, id] : underWay_) identifiers.push_back(identifier);
    return identifiers;
}

bool CoordinationBook::waitForInstalls(std::chrono::milliseconds longest) {
    std::unique_lock lock(mutex_);
    return underWayShrank_.wait_for(lock, longest, [this] { return underWay_.empty(); });
}

}  // namespace appsync
