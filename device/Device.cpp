#include "device/Device.h"

#include <sys/statvfs.h>

#include <algorithm>
#include <cerrno>
#include <fstream>
#include <map>
#include <set>
#include <unordered_set>

#include "device/DeviceCreation.h"
#include "device/DeviceOpening.h"
#include "device/DeviceQueries.h"
#include "device/SessionLock.h"
#include "device/SpaceReserve.h"
#include "device/coordination/CoordinationService.h"
#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/install/BundleRemoval.h"
#include "device/install/Containers.h"
#include "device/install/DurabilityBarrier.h"
#include "device/install/InstallContext.h"
#include "device/install/JointCommits.h"
#include "device/install/KeptBundles.h"
#include "device/install/PlaceholderInstall.h"
#include "device/install/ProgressBook.h"
#include "device/install/RestoreData.h"
#include "device/install/recovery/Reconciliation.h"
#include "device/install/recovery/Rollback.h"
#include "device/registry/DeviceRegistry.h"
#include "device/screen/CairoIconRenderer.h"
#include "device/screen/DeviceHomeScreen.h"
#include "device/services/DeviceServices.h"
#include "device/values/DeviceError.h"
#include "device/values/DevicePaths.h"
#include "device/values/PackageIdentifier.h"
#include "system/SystemNotifications.h"
#include "system/file/PosixError.h"
#include "system/file/RootDirectory.h"
#include "system/file/RootedFileSystem.h"
#include "system/property_list/PropertyListCodec.h"
#include "system/threads/SystemWorkQueues.h"

namespace appsync {

namespace {

std::string readBoot() {
    std::ifstream file("/proc/sys/kernel/random/boot_id");
    std::string boot;
    std::getline(file, boot);
    return boot;
}

}  // namespace

double InstallProgress::fraction() const noexcept {
    const double loaded =
        totalUnits <= 0 ? 0 : static_cast<double>(completedUnits) / static_cast<double>(totalUnits);
    const bool loading = phase == kInstallPhaseLoading;
    return (loading ? std::clamp(loaded, 0.0, 1.0) : 1.0) / 2 + std::clamp(unpacked, 0.0, 1.0) / 2;
}

/// Everything that an open device consists of. Members are destroyed from the last to the first:
/// whatever runs tasks goes before the services that those use.
struct Device::State {
    State(OpenedDevice opened, const DeviceOpenOptions& openOptions)
        : options(openOptions),
          path(std::move(opened.path)),
          givenUpReserve(opened.givenUpReserve),
          lock(std::move(opened.lock)),
          files(std::move(opened.files)),
          database(std::move(opened.database)),
          barrier(files->root().descriptor()),
          commits(barrier, *database),
          containers(*files),
          kept(*files, path),
          progress(*database, [this] { registry.touch(); }),
          registry(context),
          policy(*database),
          installer(*database),
          backup(*database),
          history(*database),
          homeScreen(*database, propertyLists, options.retryInterval),
          icons(files->root(), propertyLists),
          coordination(context, policy, homeScreen, options.retryInterval,
                       lock ? CoordinationBook::Access::Session : CoordinationBook::Access::Look) {}

    // Puts in order what an interrupted session has left.
    Status begin() {
        Result<std::vector<std::string>> found = reconcileDevice(context);
        if (!found) return found.error();
        repairs = std::move(*found);
        return beginSession(context);
    }

    const DeviceOpenOptions options;
    const std::string path;
    const std::uint64_t givenUpReserve;
    const std::string boot = readBoot();
    const std::optional<SessionLock> lock;
    std::vector<std::string> repairs;
    SystemPropertyLists propertyLists;
    const std::unique_ptr<RootedFileSystem> files;
    const std::unique_ptr<DeviceDatabase> database;
    DurabilityBarrier barrier;
    JointCommits commits;
    Containers containers;
    KeptBundles kept;
    ProgressBook progress;
    const InstallContext context{*database, *files,   containers,    kept, barrier,
                                 commits,   progress, propertyLists, boot, options.keepsData};
    DeviceRegistry registry;
    DevicePolicy policy;
    DeviceInstaller installer;
    DeviceBackup backup;
    DeviceHistory history;
    DeviceHomeScreen homeScreen;
    CairoIconRenderer icons;
    CoordinationService coordination;
    SystemNotifications notifications;
    SystemNotificationCenter notificationCenter;
    SystemWorkQueues queues;
};

Status Device::create(const std::string& path, const DeviceCreateOptions& options) {
    return createDevice(path, options.coordination);
}

Result<std::unique_ptr<Device>> Device::open(const std::string& path,
                                             const DeviceOpenOptions& options) {
    const bool session = options.access == DeviceAccess::Session;
    Result<OpenedDevice> opened =
        openDevice(path, {session, options.makesRoom, options.borrowsRoom, options.sparesKept});
    if (!opened) return opened.error();
    const std::string place = opened->path;
    const std::uint64_t givenUp = opened->givenUpReserve;
    auto state = std::make_unique<State>(std::move(*opened), options);
    const Status begun = session ? state->begin() : Status();
    if (!begun) state.reset();
    // What was given up is needed to the end; a session that does not begin has come to its own.
    const bool needsRoom = givenUp != 0 && begun.ok();
    if (session && !needsRoom) keepSpaceReserve(place, givenUp);
    if (!begun) return cannotUseDevice(path, begun.error());
    return std::unique_ptr<Device>(new Device(std::move(state)));
}

Device::Device(std::unique_ptr<State> state) : state_(std::move(state)) {}

Device::~Device() {
    state_->coordination.close();
    state_->database->flush().ignore();
    const bool isSession = state_->lock.has_value();
    if (isSession) {
        clearPackages(state_->context);
        endSession(state_->context).ignore();
    }
    const bool makesRoom = state_->options.makesRoom;
    const std::uint64_t borrowed = makesRoom ? 0 : state_->givenUpReserve;
    if (!isSession && !makesRoom && borrowed == 0) return;
    const std::string path = state_->path;
    state_.reset();  // and with it what the database's log has taken
    keepSpaceReserve(path, borrowed);
}

Platform Device::platform(SyncHost& host, LogFacility& log) {
    return {host,
            log,
            state_->registry,
            state_->installer,
            state_->coordination,
            state_->policy,
            state_->backup,
            state_->homeScreen,
            state_->icons,
            state_->history,
            state_->queues,
            *state_->files,
            state_->propertyLists,
            state_->notifications,
            state_->notificationCenter};
}

AppRegistry& Device::registry() { return state_->registry; }
FileSystem& Device::files() { return *state_->files; }
PropertyListSerialization& Device::propertyLists() { return state_->propertyLists; }
WorkQueues& Device::queues() { return state_->queues; }
IconRenderer& Device::icons() { return state_->icons; }
const RootDirectory& Device::root() const { return state_->files->root(); }
const std::string& Device::path() const noexcept { return state_->path; }
const std::vector<std::string>& Device::repairs() const noexcept { return state_->repairs; }

std::string Device::logPath() const { return state_->path + "/" + std::string(kLogName); }

Result<std::uint64_t> Device::freeSpace() const {
    struct statvfs space = {};
    if (::fstatvfs(state_->files->root().descriptor(), &space) != 0) {
        return posixError(errno, "ask for the free space of", state_->path);
    }
    const Result<std::uint64_t> kept = bytesKept(*state_->database);
    if (!kept) return kept.error();
    const std::uint64_t capacity = std::uint64_t{space.f_blocks} * space.f_frsize;
    const std::uint64_t free = std::uint64_t{space.f_bavail} * space.f_frsize;
    const std::uint64_t own = free - std::min(free, state_->givenUpReserve);
    return own + std::min(*kept, capacity - std::min(own, capacity));
}

std::uint64_t Device::spaceReserve() const { return spaceReserveOf(state_->path); }

std::optional<ErrorRecord> Device::databaseFailure() const { return state_->database->failure(); }

Result<std::vector<ApplicationRecord>> Device::applications() {
    return listApplications(*state_->database);
}

// An install may have taken the old bundle away between the two looks.
Result<std::vector<ApplicationRecord>> Device::applicationsOnDisk() {
    Result<std::vector<ApplicationRecord>> records = applications();
    if (!records) return records;
    const Result<std::vector<std::string>> names = state_->containers.names();
    if (!names) return names.error();
    std::unordered_set<std::string> there;
    for (const std::string& name : *names) there.insert(containerPath(name));
    std::unordered_set<std::string> lost;
    for (const ApplicationRecord& each : *records) {
        if (!there.contains(each.container)) lost.insert(each.container);
    }
    if (lost.empty()) return records;
    records = applications();
    if (!records) return records;
    std::erase_if(*records,
                  [&](const ApplicationRecord& each) { return lost.contains(each.container); });
    return records;
}

bool Device::freeze(std::chrono::milliseconds longest) { return state_->database->freeze(longest); }

std::optional<InstallProgress> Device::installProgress(const std::string& identifier) {
    if (state_->lock) return state_->progress.progress(identifier);
    return storedProgress(*state_->database, identifier);
}

Result<ApplicationStatus> Device::status(const std::string& identifier) {
    Result<ApplicationStatus> status = applicationStatus(*state_->database, identifier);
    if (!status) return status;
    status->sessionUnderWay = SessionLock::isHeld(state_->path);
    status->isHeld = status->isHeld && status->sessionUnderWay;
    if (!status->sessionUnderWay) status->denial.reset();
    return status;
}

Result<std::vector<std::string>> Device::running() {
    return runningApplications(*state_->database);
}

Result<SessionRecord> Device::session() {
    return sessionRecord(*state_->database, SessionLock::isHeld(state_->path));
}

bool Device::hasData(const std::string& identifier) const {
    const std::string path = dataDirectoryOf(identifier);
    const Result<UniqueFd> data = root().openDirectoryWithoutLinks(path, "list");
    if (!data) return false;
    const Result<std::vector<std::string>> names = namesIn(data->get(), path);
    return names && !names->empty();
}

Result<std::vector<HomeScreenItem>> Device::homeScreen() {
    const Result<std::vector<std::string>> order = state_->homeScreen.order();
    if (!order) return order.error();
    const Result<std::vector<ApplicationRecord>> records = applications();
    if (!records) return records.error();
    return homeScreenItems(*order, *records, state_->files->root());
}

Result<std::vector<ApplicationRecord>> Device::homeScreenApplications() {
    const Result<std::vector<std::string>> order = state_->homeScreen.order();
    if (!order) return order.error();
    const Result<std::vector<ApplicationRecord>> records = applications();
    if (!records) return records.error();
    std::vector<ApplicationRecord> shown;
    for (const ApplicationRecord* record : homeScreenRecords(*order, *records)) {
        shown.push_back(*record);
    }
    return shown;
}

Result<std::vector<std::string>> Device::homeScreenOrder() { return state_->homeScreen.order(); }

Bytes Device::homeScreenIcon(const ApplicationRecord& record) const {
    return appsync::homeScreenIcon(record, state_->files->root());
}

Result<DeviceMoment> Device::moment() {
    return deviceMoment(*state_->database, SessionLock::isHeld(state_->path));
}

Result<std::vector<HistoryRecord>> Device::history(std::size_t limit) {
    return state_->history.records(limit);
}

Result<std::vector<FailedInstall>> Device::failedInstalls() {
    return listFailedInstalls(*state_->database);
}

Result<DeviceSettings> Device::settings() { return state_->policy.settings(); }

Status Device::change(const DeviceSettingsChange& change) { return state_->policy.change(change); }

Result<std::vector<CoordinatorRecord>> Device::coordinators() {
    return listCoordinators(*state_->database);
}

Status Device::createCoordinator(const std::string& identifier, CoordinationClient client) {
    return state_->coordination.create(identifier, client);
}

Status Device::cancelCoordinator(const std::string& identifier, CoordinationClient client) {
    return state_->coordination.cancel(identifier, client);
}

Status Device::startCoordination() {
    if (Status status = requireSession(); !status) return status;
    state_->coordination.start();
    return {};
}

void Device::closeCoordination() { state_->coordination.close(); }

std::vector<std::string> Device::coordinatedInstallsUnderWay() {
    return state_->coordination.installsUnderWay();
}

bool Device::waitForCoordinatedInstalls(std::chrono::milliseconds longest) {
    return state_->coordination.waitForInstalls(longest);
}

void Device::holdCoordinatedInstalls() { state_->coordination.holdInstalls(); }

void Device::letCoordinatedInstallsGo() { state_->coordination.letInstallsGo(); }

Status Device::run(const std::string& identifier) {
    const bool stale = !SessionLock::isHeld(state_->path);
    return state_->database->change(Durability::OnDisk, [&](Database& database) {
        return markRunning(database, identifier, stale);
    });
}

Status Device::quit(const std::string& identifier) {
    return state_->database->change(
        Durability::OnDisk, [&](Database& database) { return endRunning(database, identifier); });
}

Status Device::uninstall(const std::string& identifier) {
    if (Status status = requireLegalIdentifier(identifier); !status) return status;
    Status removed = removeBundles(state_->context, identifier, Removal::Everything);
    if (removed || !isRegistryError(removed.error(), RegistryErrorCode::NothingInstalled) ||
        !hasData(identifier))
        return removed;
    return state_->files->removeItem(dataDirectoryOf(identifier));
}

Result<std::vector<std::string>> Device::removeLeftoverSyncPlaceholders() {
    if (Status status = requireSession(); !status) return status.error();
    return removeSyncPlaceholders(state_->context);
}

Status Device::forgetFailures(const std::set<std::string>& identifiers) {
    if (Status status = requireSession(); !status) return status;
    std::vector<std::string> obsolete;
    Status status = state_->database->read([&](Database& database) {
        Query rows = database.query("SELECT identifier FROM failures");
        while (rows.next()) {
            if (identifiers.contains(rows.text(0))) obsolete.push_back(rows.text(0));
        }
        return rows.status();
    });
    if (!status || obsolete.empty()) return status;
    return state_->database->change(Durability::Soon, [&](Database& database) -> Status {
        for (const std::string& identifier : obsolete) {
            Status deleted =
                database.query("DELETE FROM failures WHERE identifier = ?").bind(identifier).run();
            if (!deleted) return deleted;
        }
        return {};
    });
}

void Device::makeRoom(std::uint64_t bytes) {
    constexpr std::uint64_t kAllowance = std::uint64_t{1} << 20U;  // records, lists, the log
    if (bytes == 0) return;
    if (state_->lock) makeRoomFor(state_->context, std::max(bytes, bytes + kAllowance));
}

Result<RollbackRecord> Device::rollBack(const std::string& identifier) {
    if (Status status = requireSession(); !status) return status.error();
    if (Status status = requireLegalIdentifier(identifier); !status) return status.error();
    return rollBackApplication(state_->context, identifier);
}

Status Device::demote(const std::string& identifier, DemotedBy by) {
    if (Status status = requireSession(); !status) return status;
    if (Status status = requireLegalIdentifier(identifier); !status) return status;
    const std::uint64_t type =
        by == DemotedBy::System ? kInstallTypeDowngrade : kInstallTypeIntentionalDowngrade;
    return demoteApplication(state_->context, identifier, type);
}

Status Device::setRestoreDataExpected(const std::string& identifier, bool expected) {
    if (Status status = requireLegalIdentifier(identifier); !status) return status;
    return state_->backup.setRestoreDataExpected(identifier, expected);
}

Status Device::expectRestoreData(const std::vector<std::string>& identifiers) {
    for (const std::string& identifier : identifiers) {
        if (Status status = requireLegalIdentifier(identifier); !status) return status;
    }
    return state_->backup.expectRestoreData(identifiers);
}

std::string Device::restoreDataPath(const std::string& identifier) {
    return restoreArchiveOf(identifier);
}

std::string Device::dataPath(const std::string& identifier) { return dataDirectoryOf(identifier); }

Status Device::checkDataReplaceable(const std::string& identifier) {
    if (Status status = requireSession(); !status) return status;
    if (Status status = requireLegalIdentifier(identifier); !status) return status;
    return appsync::checkDataReplaceable(state_->context, identifier);
}

Status Device::replaceData(const std::string& identifier,
                           const std::function<Status(int directory)>& fill) {
    if (Status status = requireSession(); !status) return status;
    if (Status status = requireLegalIdentifier(identifier); !status) return status;
    return replaceDataWith(state_->context, identifier, fill);
}

Result<std::map<std::string, Bytes>> Device::sinfData() {
    std::map<std::string, Bytes> found;
    const Status status = state_->database->read([&](Database& database) {
        Query rows =
            database.query("SELECT identifier, sinf FROM placeholders WHERE sinf IS NOT NULL");
        while (rows.next()) found[rows.text(0)] = rows.blob(1);
        return rows.status();
    });
    if (!status) return status.error();
    return found;
}

Status Device::requireSession() const {
    if (state_->lock) return {};
    return deviceError(DeviceErrorCode::CannotUse,
                       "the device " + state_->path + " is not open for a session");
}

}  // namespace appsync
