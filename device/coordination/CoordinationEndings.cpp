// How a coordinator ends, and who is told.

#include <algorithm>

#include "device/coordination/CoordinationBook.h"
#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/install/Containers.h"
#include "device/install/ProgressBook.h"
#include "device/values/DevicePaths.h"
#include "device/values/WallClock.h"
#include "platform/InstallProgressRecord.h"
#include "system/file/RootDirectory.h"
#include "system/file/RootedFileSystem.h"

namespace appsync {

namespace {

Status storeFailure(Database& database, const std::string& identifier, const ErrorRecord& error) {
    return database
        .query(
            "INSERT OR REPLACE INTO failures (identifier, time, domain, code, description)"
            " VALUES (?, ?, ?, ?, ?)")
        .bind(identifier, milliseconds(wallNow()), error.domain, error.code, error.description())
        .run();
}

// One that a failed transaction took along ends as one that is there.
Status saveToEnd(Database& database, LiveCoordinator& coordinator) {
    const Result<bool> saved = coordinator.save(database, LiveCoordinator::For::End);
    return saved ? Status() : Status(saved.error());
}

// Nothing but a restore brings back what stands there.
bool restores(const LiveCoordinator& coordinator) {
    const bool isRestore = coordinator.kind == CoordinatorKind::Restoring ||
                           coordinator.kind == CoordinatorKind::RestoringDemoted;
    return isRestore && coordinator.snapshot().placeholder == PlaceholderState::Stands;
}

}  // namespace

void CoordinationBook::cancel(const Coordinator& coordinator, const ErrorRecord& reason,
                              CoordinationClient client) {
    if (closed_ || !coordinator->beginEnding()) return;
    RemovedCoordinator removed;
    const Status status = context_.database.change(Durability::Soon, [&](Database& database) {
        Status done = saveToEnd(database, *coordinator);
        if (done) done = removeCoordinator(database, coordinator->id, removed);
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
    removePackage(*coordinator);
    // Those of a placeholder that came to stand went then.
    if (coordinator->snapshot().placeholder == PlaceholderState::Kept) {
        removePlaceholderFiles(coordinator->identifier);
    }
    if (retire(coordinator, std::nullopt)) tellCompletion(coordinator);
}

void CoordinationBook::failed(const Coordinator& coordinator, const ErrorRecord& error) {
    fail(coordinator, error, FailureOf::Install);
}

void CoordinationBook::fail(const Coordinator& coordinator, const ErrorRecord& error,
                            FailureOf what) {
    if (!coordinator->beginEnding()) return;
    coordinator->stay();
    RemovedCoordinator removed;
    const bool isKept = what == FailureOf::Install && restores(*coordinator);
    const StoredCoordinator known = coordinator->snapshot();
    const Status status = context_.database.change(Durability::Soon, [&](Database& database) {
        Status done = saveToEnd(database, *coordinator);
        if (!done) return done;
        done = isKept ? renewRestore(database, known, removed)
                      : removeCoordinator(database, coordinator->id, removed);
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
    context_.database.read([&](Database& database) { return readNews(database, news); }).ignore();
    hearAll(news);
}

Status CoordinationBook::readNews(Database& database, std::vector<Cancellation>& news) const {
    if (closed_ || access_ == Access::Look) return {};
    Result<std::vector<Cancellation>> found = cancellationsSince(database, heardOf_);
    if (!found) return found.error();
    news = *std::move(found);
    return {};
}

void CoordinationBook::hearAll(const std::vector<Cancellation>& news) {
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
    removePackage(coordinator);
    removePlaceholderFiles(coordinator.identifier);
}

void CoordinationBook::removePackage(const LiveCoordinator& coordinator) {
    const auto asset = coordinator.promise(PromiseRole::Asset);
    if (asset != nullptr) {
        const PromiseValues values = asset->values();
        if (values.complete && values.path) removeFile(*values.path);
    }
}

std::string CoordinationBook::placeholderFilesOf(const std::string& identifier) {
    return std::string(kPlaceholderFilesDirectory) + "/" + identifier + ".app/";
}

void CoordinationBook::removePlaceholderFiles(const std::string& identifier) {
    context_.files.removeItem(placeholderFilesOf(identifier)).ignore();
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
    tell(coordinator, [handle = handle(coordinator)](InstallCoordinatorObserver& observer) {
        observer.coordinatorDidInstallPlaceholder(handle);
    });
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

}  // namespace appsync
