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

template <typename AnyCoordinator>
ErrorRecord standsAlready(const AnyCoordinator& other, CoordinationErrorCode code) {
    return coordinationError(code, "client " + std::to_string(other.client) +
                                       " has a coordinator (" + nameOf(other.kind) + ") for " +
                                       other.identifier + "; let it finish, or cancel it first");
}

ErrorRecord notInstalled(const std::string& identifier) {
    return coordinationError(CoordinationErrorCode::NotInstalled,
                             identifier + " is not installed, so there is nothing to update");
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
    const Result<Coordinator> found = hearAndFind(identifier);
    if (!found) return nothing(found.error());
    if (*found != nullptr) return answer(kind, *found);
    if (creation == InstallCoordinatorService::Creation::OnlyExisting) return {};
    return begin(kind, identifier, client);
}

Lookup CoordinationBook::answer(CoordinatorKind kind, const Coordinator& found) {
    if (found->kind == kind) return {handle(found), false, std::nullopt};
    return nothing(standsAlready(*found, CoordinationErrorCode::OtherKind));
}

// It is written with the first of its pieces, or with whatever is written before.
Lookup CoordinationBook::begin(CoordinatorKind kind, const std::string& identifier,
                               CoordinationClient client) {
    if (kind == CoordinatorKind::Updating) {
        if (Status installed = requireInstalled(identifier); !installed) {
            return nothing(installed.error());
        }
    }
    const Result<std::int64_t> id = takeId();
    if (!id) return nothing(id.error());
    StoredCoordinator stored;
    stored.id = *id;
    stored.identifier = identifier;
    stored.kind = kind;
    stored.client = client;
    const auto made = std::make_shared<LiveCoordinator>(stored, LiveCoordinator::Origin::New);
    if (access_ == Access::Look) return writeAtOnce(made);
    if (const Result<Coordinator> other = keepUnlessKnown(made); !other) {
        return nothing(other.error());
    } else if (*other != nullptr) {
        return answer(kind, *other);
    }
    saveLater(made);
    return {handle(made), true, std::nullopt};
}

// Beside a session nothing is written later.
Lookup CoordinationBook::writeAtOnce(const Coordinator& made) {
    bool written = false;
    const Status status = context_.database.change(Durability::Soon, [&](Database& database) {
        const Result<bool> saved = made->save(database);
        if (!saved) return Status(saved.error());
        written = *saved;
        return Status();
    });
    if (!status) return nothing(status.error());
    if (written) return {handle(made), true, std::nullopt};
    // Somebody else was faster.
    return lookUp(made->kind, made->identifier, made->client,
                  InstallCoordinatorService::Creation::OnlyExisting);
}

// What another thread has begun meanwhile stays, and so does what that one has got further with:
// unless the database, which has that, tells that it is over.
Result<CoordinationBook::Coordinator> CoordinationBook::keepUnlessKnown(const Coordinator& made) {
    const Coordinator other = keep(made, nullptr);
    if (other == nullptr || other->isBegun()) return other;
    const Result<Coordinator> found = hearAndFind(made->identifier);
    if (!found || *found != nullptr) return found;
    return keep(made, other);
}

// Null when it is kept; else the one that goes on in its place. `over` does not.
CoordinationBook::Coordinator CoordinationBook::keep(const Coordinator& made,
                                                     const Coordinator& over) {
    const std::lock_guard lock(mutex_);
    Coordinator& known = coordinators_[made->identifier];
    if (known != nullptr && known != over && known->goesOn()) return known;
    known = made;
    return nullptr;
}

Status CoordinationBook::requireInstalled(const std::string& identifier) {
    return context_.database.read([&](Database& database) -> Status {
        const Result<bool> installed = isInstalled(database, identifier);
        if (!installed) return installed.error();
        return *installed ? Status() : notInstalled(identifier);
    });
}

// A reservation is a transaction, so it is one of many.
Result<std::int64_t> CoordinationBook::takeId() {
    constexpr std::int64_t kReserved = 64;
    {
        const std::lock_guard lock(mutex_);
        if (nextId_ <= lastId_) return nextId_++;
    }
    std::int64_t first = 0;
    const Status status = context_.database.change(Durability::Soon, [&](Database& database) {
        const Result<std::int64_t> reserved = reserveCoordinatorIds(database, kReserved);
        if (!reserved) return Status(reserved.error());
        first = *reserved;
        return Status();
    });
    if (!status) return status.error();
    const std::lock_guard lock(mutex_);
    nextId_ = first + 1;
    lastId_ = first + kReserved - 1;
    return first;
}

CoordinationBook::Coordinator CoordinationBook::begun(const std::string& identifier) const {
    const std::lock_guard lock(mutex_);
    const auto known = coordinators_.find(identifier);
    return known != coordinators_.end() && known->second->isBegun() ? known->second : nullptr;
}

CoordinationBook::Coordinator CoordinationBook::find(const std::string& identifier) {
    if (closed_) return nullptr;
    const Result<Coordinator> found = hearAndFind(identifier);
    return found ? *found : nullptr;
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
        const Result<std::int64_t> made = insertCoordinator(database, identifier, kind, client);
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

// Hears of what others have ended, too: both are of one state of the database. So what is known and
// not there has yet to be written.
Result<CoordinationBook::Coordinator> CoordinationBook::hearAndFind(const std::string& identifier) {
    std::vector<Cancellation> news;
    std::optional<StoredCoordinator> found;
    const Status status = context_.database.read([&](Database& database) -> Status {
        if (Status begun = database.query("SAVEPOINT look").run(); !begun) return begun;
        Status read = readNews(database, news);
        auto result = findCoordinator(database, identifier);
        database.query("RELEASE look").run().ignore();
        if (!read) return read;
        if (!result) return result.error();
        found = std::move(*result);
        return {};
    });
    hearAll(news);
    if (!status) return status.error();
    return found ? adopt(*found) : begun(identifier);
}

// Beside a session, others may change what was read at any time, so nothing is kept.
CoordinationBook::Coordinator CoordinationBook::adopt(const StoredCoordinator& stored) {
    constexpr auto kOrigin = LiveCoordinator::Origin::Database;
    if (access_ == Access::Look) return std::make_shared<LiveCoordinator>(stored, kOrigin);
    // Whoever ended the former one tells of it; if that was somebody else, while it is still known.
    if (knowsAnother(stored)) hearOfOthers();
    Coordinator made;
    {
        const std::lock_guard lock(mutex_);
        Coordinator& known = coordinators_[stored.identifier];
        if (known != nullptr && known->id == stored.id) return known;
        made = std::make_shared<LiveCoordinator>(stored, kOrigin);
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
