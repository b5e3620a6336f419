#include "device/coordination/CoordinationBook.h"

#include "device/coordination/DeviceCoordinator.h"
#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/RegistryTables.h"
#include "device/values/DeviceError.h"
#include "device/values/PackageIdentifier.h"

namespace appsync {

namespace {

using Lookup = InstallCoordinatorService::Coordinator;

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
    Result<std::optional<StoredCoordinator>> found = hearAndRead(identifier);
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
    const Result<std::optional<StoredCoordinator>> found = hearAndRead(identifier);
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
        adopted.reserve(left.size());
        for (const StoredCoordinator& stored : left) adopted.push_back(adopt(stored));
        for (const Coordinator& coordinator : adopted) proceed(coordinator);
    });
}

// Hears of what others have ended, too: both are one reading of the database.
Result<std::optional<StoredCoordinator>> CoordinationBook::hearAndRead(
    const std::string& identifier) {
    std::vector<Cancellation> news;
    std::optional<StoredCoordinator> found;
    const Status status = context_.database.read([&](Database& database) -> Status {
        if (Status heard = readNews(database, news); !heard) return heard;
        auto result = findCoordinator(database, identifier);
        if (!result) return result.error();
        found = std::move(*result);
        return {};
    });
    hearAll(news);
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
    if (access_ == Access::Look) return std::make_shared<LiveCoordinator>(stored);
    // Whoever ended the former one tells of it; if that was somebody else, while it is still known.
    if (knowsAnother(stored)) hearOfOthers();
    Coordinator made;
    {
        const std::lock_guard lock(mutex_);
        Coordinator& known = coordinators_[stored.identifier];
        if (known != nullptr && known->id == stored.id) return known;
        made = std::make_shared<LiveCoordinator>(stored);
        for (const auto& [role, promise] : made->promisesByRole()) {
            (void)promise->attach(listener(made, role, promise));
        }
        known = made;
    }
    const auto asset = made->promise(PromiseRole::Asset);
    if (asset != nullptr && asset->isComplete()) noteDelivery(*made);
    return made;
}

bool CoordinationBook::knowsAnother(const StoredCoordinator& stored) const {
    const std::lock_guard lock(mutex_);
    const auto known = coordinators_.find(stored.identifier);
    return known != coordinators_.end() && known->second->id != stored.id;
}

std::shared_ptr<InstallCoordinator> CoordinationBook::handle(const Coordinator& coordinator) {
    return std::make_shared<DeviceCoordinator>(shared_from_this(), coordinator);
}

// Installs under way.

void CoordinationBook::noteDelivery(const LiveCoordinator& coordinator) {
    if (coordinator.client != SyncClientID) return;
    const std::lock_guard lock(mutex_);
    // Of one that has ended, the last that is told of it may have been told already.
    if (!coordinator.hasEnded()) underWay_[coordinator.identifier] = coordinator.id;
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
