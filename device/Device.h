#pragma once

// device: a whole device in a directory of this machine (docs/device-format.md): it is made
// (DeviceCreation.h), opened (DeviceOpening.h), asked (DeviceQueries.h), held by one session at a
// time (SessionLock.h), and keeps space back for a full disk (SpaceReserve.h). The work is done in
// the rooms:
//
//     values         records, errors, paths and names that all rooms speak of
//     database       SQLite: connections, schema, the statements of each table
//     archive        reading, checking and writing zip archives
//     package        packages and archives of data: looked into, unpacked and made
//     screen         icons, the home screen and its picture
//     services       the services that are little more than a table
//     install        installing and removing: containers, placeholders, progress, putting in order
//     registry       the platform's registry, over `install`
//     coordination   the platform's install-coordination service, over `install`
//
// `Device` alone wires them into a `Platform`. Of all this host/ sees `Device`, values, package and
// screen.

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "device/screen/HomeScreenPicture.h"
#include "device/values/DeviceRecords.h"
#include "platform/Bytes.h"
#include "platform/Platform.h"
#include "platform/Result.h"

namespace appsync {

class RootDirectory;

/// What a device is opened for.
enum class DeviceAccess {
    /// To sync: one session at a time holds the device. What an interrupted session left is put in
    /// order first.
    Session,
    /// For everything else. Works while a session is under way; takes nothing away from it.
    Look,
};

struct DeviceCreateOptions {
    bool coordination = false;
};

struct DeviceOpenOptions {
    DeviceAccess access = DeviceAccess::Look;
    /// When a denied termination is asked for again: by the coordination service. On the direct
    /// path it is only told to people, as the plug-in keeps the time.
    std::chrono::seconds retryInterval{30};
    /// Something is to be taken away. Where the disk is full, the space that the device keeps for
    /// that is given up; the next session that ends with plenty of it left keeps some again.
    bool makesRoom = false;
    /// No more than a record is to be written. The same space is given up, and all of it that is
    /// left kept again at the end.
    bool borrowsRoom = false;
    /// No earlier version of an application is given up, however full the disk is.
    bool sparesKept = false;
    /// What goes without being asked for by name leaves the application's data where it is.
    bool keepsData = false;
};

/// Who takes an application's bundle away while its placeholder and its data stay.
enum class DemotedBy { Person, System };

/// A whole device in one directory (docs/device-format.md): the services that the plug-in needs,
/// and what a person or a manager can do on the device itself.
///
/// Callable on any thread, except that the destructor comes last: after every client that was made
/// with its platform has gone and its queued work is done. Errors of opening and creating are of
/// `kDeviceErrorDomain`, as are those of the other operations when the device's database fails; a
/// request that is refused is an error of `kRegistryErrorDomain`. Each holds one sentence that says
/// what is wrong and what to do.
class Device {
  public:
    /// Makes an empty device in a new directory: all of it or, on failure, nothing. The parent
    /// directory must exist, the path must not.
    static Status create(const std::string& path, const DeviceCreateOptions& options = {});

    /// Where the device may only be read, `Look` looks at a copy of its database: nothing is left
    /// behind, what others commit from now on is not seen, and every change is refused. A process
    /// of root's acts as the owner of the directory from now on (system/ActingAccount.h).
    [[nodiscard]] static Result<std::unique_ptr<Device>> open(
        const std::string& path, const DeviceOpenOptions& options = {});

    /// Writes what is still to be written.
    ~Device();
    Device(const Device&) = delete;
    Device& operator=(const Device&) = delete;

    /// Everything that a client needs. Host and log outlive the client, as does this device.
    [[nodiscard]] Platform platform(SyncHost& host, LogFacility& log);

    // Single services, for those who make no client.
    [[nodiscard]] AppRegistry& registry();
    [[nodiscard]] FileSystem& files();
    [[nodiscard]] PropertyListSerialization& propertyLists();
    [[nodiscard]] WorkQueues& queues();
    [[nodiscard]] IconRenderer& icons();
    /// The device's files as descriptors, for transfers in pieces.
    [[nodiscard]] const RootDirectory& root() const;

    /// Absolute path of the device directory on this machine.
    [[nodiscard]] const std::string& path() const noexcept;
    /// The system log on this machine: one JSON object a line. It may not exist yet.
    [[nodiscard]] std::string logPath() const;
    /// Bytes that may still be written to the file system that holds the device: what versions take
    /// that are kept for a rollback is among them, as those go once the room is needed; what the
    /// device keeps for a full disk is not, also while that is given up.
    [[nodiscard]] Result<std::uint64_t> freeSpace() const;
    /// Bytes that the device keeps back for a full disk: 0 where it could not, or has given them
    /// up.
    [[nodiscard]] std::uint64_t spaceReserve() const;

    /// What went wrong with the database first, if anything did: the services of the platform
    /// cannot all say so. A session with such a failure has failed.
    [[nodiscard]] std::optional<ErrorRecord> databaseFailure() const;

    /// What the opening of a session found missing, one sentence each, for the log: applications
    /// whose bundles somebody took away.
    [[nodiscard]] const std::vector<std::string>& repairs() const noexcept;

    // What there is.

    /// Installed applications and placeholders, ordered by identifier; an application stands before
    /// the placeholder that covers it.
    [[nodiscard]] Result<std::vector<ApplicationRecord>> applications();
    /// The same as a session that began now would find it: without what has lost its bundle on
    /// disk. An error where that cannot be looked at.
    [[nodiscard]] Result<std::vector<ApplicationRecord>> applicationsOnDisk();
    /// The identifiers of the applications that run, ordered.
    [[nodiscard]] Result<std::vector<std::string>> running();
    [[nodiscard]] Result<SessionRecord> session();
    /// Whether the device holds any file of an application's data.
    [[nodiscard]] bool hasData(const std::string& identifier) const;
    /// How far an install has come; nothing when none is under way. Cheap; may be polled.
    [[nodiscard]] std::optional<InstallProgress> installProgress(const std::string& identifier);
    [[nodiscard]] Result<ApplicationStatus> status(const std::string& identifier);
    /// What `drawHomeScreen` draws: one item an application, in home-screen order.
    [[nodiscard]] Result<std::vector<HomeScreenItem>> homeScreen();
    /// The same applications in the same order, without rendering their icons.
    [[nodiscard]] Result<std::vector<ApplicationRecord>> homeScreenApplications();
    /// The identifiers of what stands there, or would if it were installed, in that order.
    [[nodiscard]] Result<std::vector<std::string>> homeScreenOrder();
    /// The icon of one application, as a PNG; empty where its bundle has none that can be read.
    [[nodiscard]] Bytes homeScreenIcon(const ApplicationRecord& record) const;
    /// The same as `applications`, `coordinators`, `session` and `status` of each, of one moment.
    /// For whoever looks again and again: one pass through the database.
    [[nodiscard]] Result<DeviceMoment> moment();
    /// The transaction log, oldest first; at most the last `limit` records.
    [[nodiscard]] Result<std::vector<HistoryRecord>> history(std::size_t limit = 100'000);

    /// The applications whose last install failed, the oldest failure first: the transaction log
    /// has the steps of an install, and not always its failure.
    [[nodiscard]] Result<std::vector<FailedInstall>> failedInstalls();

    [[nodiscard]] Result<DeviceSettings> settings();
    /// Takes effect at once, also for a session that is under way (coordination: for the next).
    Status change(const DeviceSettingsChange& change);

    /// For a process that is about to leave at once: nothing more is committed, whoever tries to
    /// waits for ever, so that what the device shows from now on is what it will be left with.
    /// False, and nothing is certain, when a commit does not end within the time. The device cannot
    /// be used any more, except to look at it.
    [[nodiscard]] bool freeze(std::chrono::milliseconds longest);

    // Coordinated installs.

    /// The coordinators that stand, of every client, ordered by identifier.
    [[nodiscard]] Result<std::vector<CoordinatorRecord>> coordinators();
    /// Creates a coordinator as the client: updating when the application is installed, initiating
    /// else. Refused where one stands, and on a device whose installs are not coordinated.
    Status createCoordinator(const std::string& identifier, CoordinationClient client);
    /// Cancels the coordinator as the client: its placeholder goes, an installed version stays.
    /// Refused when there is none.
    Status cancelCoordinator(const std::string& identifier, CoordinationClient client);

    /// The coordination service begins to work, if it does not yet: what is complete is installed.
    /// A client that attaches to the service has the same effect. Only with DeviceAccess::Session.
    Status startCoordination();
    /// It works no more, and calls no observer any more. Does not come back.
    void closeCoordination();
    /// The applications whose package the sync client has delivered to the service and whose
    /// install has not ended, observers included; ordered. Those that wait for a running
    /// application to end are among them: `status` tells of the denial.
    [[nodiscard]] std::vector<std::string> coordinatedInstallsUnderWay();
    /// Waits until there are no such applications. False when the time is over before that, or
    /// while installs are held.
    [[nodiscard]] bool waitForCoordinatedInstalls(std::chrono::milliseconds longest);
    /// From now on no coordinated install begins; those that could count as under way, for whoever
    /// asks the registry, all the same. So none ends while a client makes up its mind what it
    /// wants.
    void holdCoordinatedInstalls();
    void letCoordinatedInstallsGo();

    // What a person does on the device. An identifier under which there is nothing is refused.

    /// The application runs until it is quit: its termination is denied. Refused while an install
    /// holds it.
    Status run(const std::string& identifier);
    /// It ends. No failure when it does not run.
    Status quit(const std::string& identifier);
    /// Removes the application, its placeholder and its data, and puts it on the installer's list.
    /// Where nothing but data is left of it, that goes.
    Status uninstall(const std::string& identifier);

    // What the device or a host does between sessions. Only with DeviceAccess::Session.

    /// Removes the placeholders of type `kInstallTypeSync` that an interrupted session left. Gives
    /// their identifiers.
    [[nodiscard]] Result<std::vector<std::string>> removeLeftoverSyncPlaceholders();
    /// Nobody misses anything of these applications any more: their last failures are forgotten.
    Status forgetFailures(const std::set<std::string>& identifiers);
    /// Sees to it that so many bytes are free, and a little more for what goes along with them, as
    /// far as giving up versions that are kept for a rollback can do that: the oldest first. Of 0
    /// bytes nothing is needed.
    void makeRoom(std::uint64_t bytes);
    /// Exchanges the application with the version that its last update has replaced; the data stays
    /// as it is. Refused while it runs or is being updated, and where nothing is kept of it. What
    /// is damaged is kept no more.
    [[nodiscard]] Result<RollbackRecord> rollBack(const std::string& identifier);
    /// Takes the bundle away and leaves placeholder and data.
    Status demote(const std::string& identifier, DemotedBy by);

    /// Whether the backup service holds data to restore for the application: until the application
    /// is installed or its restore is given up.
    Status setRestoreDataExpected(const std::string& identifier, bool expected);
    /// The same of many, all of them at once.
    Status expectRestoreData(const std::vector<std::string>& identifiers);
    /// The device path at which the backup service finds the data that a restore has left for an
    /// application: an archive. It is unpacked, and goes, with the install of the application.
    [[nodiscard]] static std::string restoreDataPath(const std::string& identifier);
    /// The device path of an application's data.
    [[nodiscard]] static std::string dataPath(const std::string& identifier);
    /// Refuses where `replaceData` would before it begins.
    Status checkDataReplaceable(const std::string& identifier);
    /// Replaces the data of an application by what `fill` puts into an empty directory, whose
    /// descriptor it gets: all of it, on disk, or on failure nothing. Refused where nothing stands
    /// under the identifier, while the application runs, and where a restore has left data that
    /// still waits for the install.
    Status replaceData(const std::string& identifier,
                       const std::function<Status(int directory)>& fill);
    /// The SINF data of placeholders that have any, by identifier.
    [[nodiscard]] Result<std::map<std::string, Bytes>> sinfData();

  private:
    struct State;
    explicit Device(std::unique_ptr<State> state);

    [[nodiscard]] Status requireSession() const;

    std::unique_ptr<State> state_;
};

}  // namespace appsync
