// How a coordinator gets its pieces, and what follows from each.

#include "device/coordination/CoordinationBook.h"
#include "device/coordination/DevicePlaceholder.h"
#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/RegistryTables.h"
#include "device/install/PlaceholderInstall.h"
#include "device/install/ProgressBook.h"
#include "device/values/DeviceError.h"
#include "platform/AppRegistry.h"
#include "platform/PropertyListSerialization.h"

namespace appsync {

namespace {

constexpr std::string_view kMetadataKey = "Metadata";
constexpr std::string_view kInstallTypeKey = "InstallType";
constexpr std::string_view kTargetTypeKey = "InstallTargetType";
constexpr std::string_view kLaunchProhibitedKey = "RGApplicationLaunchProhibited";

Status refused(const std::string& sentence) {
    return coordinationError(CoordinationErrorCode::Refused, sentence);
}

ErrorRecord over(const LiveCoordinator& coordinator) {
    return coordinationError(CoordinationErrorCode::Over,
                             "the install of " + coordinator.identifier + " is over");
}

PropertyList listOf(const InstallOptions& options) {
    return PropertyList::map({{kMetadataKey, options.storeMetadata.metadata},
                              {kInstallTypeKey, options.installType},
                              {kTargetTypeKey, options.installTargetType}});
}

PropertyList infoOf(const PlaceholderConfiguration& configuration) {
    const PlaceholderAttributes& attributes = configuration.attributes;
    PropertyList info = attributes.info.isMap() ? attributes.info : PropertyList::map();
    info.set(BundleIdentifierKey, configuration.identifier);
    info.set(BundleDisplayNameKey, configuration.name);
    info.set(kLaunchProhibitedKey, attributes.launchProhibited);
    if (attributes.bundleVersion) info.set(BundleVersionKey, *attributes.bundleVersion);
    return info;
}

// Whether the placeholder that stands there is to stay, as that of a demoted application.
bool borrows(const LiveCoordinator& coordinator, const std::optional<BundleRow>& standing) {
    const bool isOfSync = coordinator.kind == CoordinatorKind::Initiating ||
                          coordinator.kind == CoordinatorKind::Updating;
    return isOfSync && standing && isDemotedType(standing->installType);
}

}  // namespace

Status CoordinationBook::requireSession() const {
    if (closed_) return coordinationError(CoordinationErrorCode::Over, "the device is closed");
    if (access_ == Access::Session) return {};
    return refused("an install is set up in a session; open the device for one");
}

Status CoordinationBook::setOptions(const Coordinator& coordinator, const InstallOptions& options) {
    if (Status status = requireSession(); !status) return status;
    Result<Bytes> bytes =
        context_.propertyLists.serialize(listOf(options), PropertyListFormat::Binary);
    if (!bytes) return bytes.error();
    if (Status set = coordinator->setOptions(std::move(*bytes)); !set) return set;
    saveLater(coordinator);
    proceed(coordinator);
    return {};
}

std::uint64_t CoordinationBook::installTypeOf(const LiveCoordinator& coordinator) const {
    const std::optional<Bytes> bytes = coordinator.snapshot().options;
    if (!bytes) return kInstallTypeNone;
    const Result<PropertyList> options = context_.propertyLists.parse(*bytes);
    const PropertyList* type = options ? options->find(kInstallTypeKey) : nullptr;
    return type == nullptr ? std::uint64_t{kInstallTypeNone}
                           : type->asUnsigned().value_or(kInstallTypeNone);
}

Status CoordinationBook::setInitialAssets(
    const Coordinator& coordinator, const std::vector<std::shared_ptr<LivePromise>>& promises) {
    Status status = requireSession();
    std::size_t attached = 0;
    while (status && attached < promises.size()) {
        status = attach(coordinator, PromiseRole::InitialAsset, promises[attached]);
        if (status) ++attached;
    }
    if (status) status = coordinator->setInitialAssets(promises);
    if (!status) {
        for (std::size_t index = 0; index < attached; ++index) promises[index]->detach();
        return status;
    }
    saveLater(coordinator);
    proceed(coordinator);
    return {};
}

Status CoordinationBook::setPromise(const Coordinator& coordinator, PromiseRole role,
                                    const std::shared_ptr<LivePromise>& promise) {
    if (Status status = requireSession(); !status) return status;
    if (Status status = attach(coordinator, role, promise); !status) return status;
    if (Status status = coordinator->setPromise(role, promise); !status) {
        promise->detach();
        return status;
    }
    saveLater(coordinator);
    const PromiseValues now = promise->values();
    if (role == PromiseRole::Asset && now.percent > 0) showProgress(*coordinator, now.percent);
    if (now.complete) promiseChanged(coordinator, role, *promise, LivePromise::Change::Complete);
    return {};
}

Status CoordinationBook::setResponsible(const Coordinator& coordinator, CoordinationClient client) {
    if (Status status = requireSession(); !status) return status;
    if (Status status = coordinator->setResponsible(client); !status) return status;
    saveLater(coordinator);
    return {};
}

LivePromise::Listener CoordinationBook::listener(const Coordinator& coordinator, PromiseRole role,
                                                 const std::shared_ptr<LivePromise>& promise) {
    return [book = weak_from_this(), coordinator = std::weak_ptr(coordinator), role,
            promise = std::weak_ptr(promise)](LivePromise::Change change) {
        const auto self = book.lock();
        const auto owner = coordinator.lock();
        const auto changed = promise.lock();
        if (self && owner && changed) self->promiseChanged(owner, role, *changed, change);
    };
}

Status CoordinationBook::attach(const Coordinator& coordinator, PromiseRole role,
                                const std::shared_ptr<LivePromise>& promise) {
    if (promise == nullptr) {
        return refused("what was promised for " + coordinator->identifier +
                       " is no promise of this service");
    }
    if (promise->attach(listener(coordinator, role, promise))) return {};
    return refused("the promise " + promise->values().name +
                   " belongs to another coordinator or placeholder");
}

void CoordinationBook::promiseChanged(const Coordinator& coordinator, PromiseRole role,
                                      const LivePromise& promise, LivePromise::Change change) {
    if (closed_) return;
    switch (change) {
        case LivePromise::Change::Percent:
            if (role == PromiseRole::Asset) {
                madeProgress(coordinator, promise.values().percent);
            }
            [[fallthrough]];
        case LivePromise::Change::Path:
            return saveLater(coordinator);
        case LivePromise::Change::Complete:
            if (role == PromiseRole::Asset) noteDelivery(*coordinator);
            [[fallthrough]];
        case LivePromise::Change::Cancelled:
            // The install need not wait for what is written about it.
            proceed(coordinator);
            saveNow(coordinator);
    }
}

void CoordinationBook::madeProgress(const Coordinator& coordinator, double percent) {
    showProgress(*coordinator, percent);
    if (!coordinator->beginFulfillment()) return;
    tell(coordinator, [id = coordinator->id](InstallCoordinatorObserver& observer) {
        observer.promiseDidBeginFulfillmentWithIdentifier(static_cast<std::uint64_t>(id));
    });
}

void CoordinationBook::showProgress(const LiveCoordinator& coordinator, double percent) {
    const auto record = context_.progress.record(coordinator.identifier);
    if (record == nullptr) return;
    record->setCompletedUnitCount(
        static_cast<std::int64_t>(percent * static_cast<double>(record->totalUnitCount())));
}

// It goes with the next change of anyone's: nobody waits for a disk.
void CoordinationBook::saveLater(const Coordinator& coordinator) {
    if (!coordinator->beginSaving()) return;
    context_.database.changeLater([coordinator](Database& database) -> Status {
        const Result<bool> saved = coordinator->save(database);
        return saved ? Status() : Status(saved.error());
    });
}

void CoordinationBook::saveNow(const Coordinator& coordinator) {
    context_.database
        .change(Durability::Soon,
                [&](Database& database) -> Status {
                    const Result<bool> saved = coordinator->save(database);
                    return saved ? Status() : Status(saved.error());
                })
        .ignore();
}

void CoordinationBook::proceed(const Coordinator& coordinator) {
    if (closed_ || access_ == Access::Look || !coordinator->claimInstall()) return;
    if (coordinator->promise(PromiseRole::Asset) == nullptr) {
        return finishWithoutInstall(coordinator);
    }
    // From now on it is an install under way for whoever asks the registry.
    ProgressBook::installing(context_.progress.record(coordinator->identifier).get(), 0);
    if (install_) install_(coordinator);
}

void CoordinationBook::finishWithoutInstall(const Coordinator& coordinator) {
    bool existed = false;
    const Status status =
        context_.database.change(Durability::Soon, [&](Database& database) -> Status {
            const Result<bool> forgotten = coordinator->forget(database);
            if (!forgotten) return forgotten.error();
            existed = *forgotten;
            return {};
        });
    if (!status) return fail(coordinator, status.error(), FailureOf::Install);
    if (existed) installed(coordinator);
}

// The placeholder.

Status CoordinationBook::setPlaceholder(const Coordinator& coordinator,
                                        const std::shared_ptr<DevicePlaceholder>& placeholder) {
    if (Status status = requireSession(); !status) return status;
    if (placeholder == nullptr || placeholder->identifier() != coordinator->identifier) {
        return refused("what was handed in is no placeholder of " + coordinator->identifier);
    }
    if (Status status = coordinator->keepPlaceholder(); !status) return status;
    const auto complete = [book = weak_from_this(), owner = std::weak_ptr(coordinator),
                           handed = std::weak_ptr(placeholder)] {
        const auto self = book.lock();
        const auto known = owner.lock();
        const auto configured = handed.lock();
        if (!self || !known || !configured || self->closed_) return;
        if (self->show(known, *configured)) self->proceed(known);
    };
    const auto cancelled = [book = weak_from_this(), owner = std::weak_ptr(coordinator)] {
        const auto self = book.lock();
        const auto known = owner.lock();
        if (!self || !known || self->closed_) return;
        known->dropPlaceholder();
        self->saveLater(known);
    };
    if (Status status = placeholder->hand({complete, cancelled}); !status) {
        coordinator->dropPlaceholder();
        return status;
    }
    if (placeholder->isConfigurationComplete()) {
        if (Status shown = show(coordinator, *placeholder); !shown) return shown;
    } else {
        saveNow(coordinator);
    }
    proceed(coordinator);
    return {};
}

void CoordinationBook::holdNews(const LiveCoordinator& coordinator) {
    const bool restores = coordinator.kind == CoordinatorKind::Restoring ||
                          coordinator.kind == CoordinatorKind::RestoringDemoted;
    if (restores && !closed_) herald_.hold(coordinator);
}

void CoordinationBook::tellNews(const LiveCoordinator& coordinator) {
    if (!closed_) herald_.release(coordinator);
}

Status CoordinationBook::show(const Coordinator& coordinator,
                              const DevicePlaceholder& placeholder) {
    Status status = putOnHomeScreen(coordinator, placeholder);
    if (!status) {
        fail(coordinator, status.error(), FailureOf::Placeholder);
        return status;
    }
    if (const auto icon = placeholder.configuration().icon) {
        const PromiseValues values = icon->values();
        const bool goesWithOthers =
            values.path && values.path->starts_with(placeholderFilesOf(coordinator->identifier));
        if (values.complete && values.path && !goesWithOthers) removeFile(*values.path);
    }
    removePlaceholderFiles(coordinator->identifier);
    const auto asset = coordinator->promise(PromiseRole::Asset);
    if (asset != nullptr) showProgress(*coordinator, asset->values().percent);
    tellPlaceholder(coordinator);
    return {};
}

Status CoordinationBook::putOnHomeScreen(const Coordinator& coordinator,
                                         const DevicePlaceholder& placeholder) {
    const Result<std::optional<BundleRow>> standing = standingPlaceholder(coordinator->identifier);
    if (!standing) return standing.error();
    if (borrows(*coordinator, *standing)) return borrow(coordinator);
    const PlaceholderConfiguration configuration = placeholder.configuration();
    const PropertyList info = infoOf(configuration);
    PlaceholderContents contents{configuration.identifier,  info,         std::nullopt,
                                 configuration.installType, std::nullopt, configuration.sinf,
                                 !standing->has_value()};
    if (configuration.icon != nullptr) {
        const PromiseValues icon = configuration.icon->values();
        if (icon.complete) contents.iconFile = icon.path;
    }
    if (configuration.metadata) {
        Result<Bytes> metadata = context_.propertyLists.serialize(configuration.metadata->metadata,
                                                                  PropertyListFormat::Binary);
        if (!metadata) return metadata.error().withContext("the store metadata");
        contents.storeMetadata = std::move(*metadata);
    }
    const Status shown = installPlaceholderWith(context_, contents, [&](Database& database) {
        return recordShown(coordinator, PlaceholderState::Stands, database);
    });
    if (shown) coordinator->setPlaceholderState(PlaceholderState::Stands);
    return shown;
}

Result<std::optional<BundleRow>> CoordinationBook::standingPlaceholder(
    const std::string& identifier) const {
    std::optional<BundleRow> standing;
    const Status status = context_.database.read([&](Database& database) -> Status {
        auto row = findBundle(database, BundleTable::Placeholders, identifier);
        if (!row) return row.error();
        standing = *std::move(row);
        return {};
    });
    if (!status) return status.error();
    return standing;
}

// The placeholder of a demoted application holds its place for its data; the install takes it away
// when it succeeds, and nothing else does.
Status CoordinationBook::borrow(const Coordinator& coordinator) {
    Status status = context_.database.change(Durability::Soon, [&](Database& database) {
        return recordShown(coordinator, PlaceholderState::Borrowed, database);
    });
    if (status) coordinator->setPlaceholderState(PlaceholderState::Borrowed);
    return status;
}

Status CoordinationBook::recordShown(const Coordinator& coordinator, PlaceholderState state,
                                     Database& database) {
    const Result<bool> saved = coordinator->save(database);
    if (!saved) return saved.error();
    const Result<bool> stored = storePlaceholderState(database, coordinator->id, state);
    if (!stored) return stored.error();
    if (!*saved || !*stored) return over(*coordinator);
    return {};
}

}  // namespace appsync
