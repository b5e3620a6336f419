#pragma once

// device/values: what every room of a device, and whoever looks at one, speaks of: records of what
// it holds (this header), errors that tell that a device cannot be used (DeviceError.h), where
// things stand in it (DevicePaths.h), what is a legal identifier and what file name belongs to one
// (PackageIdentifier.h), how names of foreign archives may look and are quoted (PackageText.h),
// promises (PromiseValues.h), the time of day (WallClock.h). Plain values and functions without a
// state: this room opens no file and no database, and includes platform/ only. Every other room of
// device/ may include it, and so may host/.

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "platform/DevicePolicyService.h"
#include "platform/Error.h"
#include "platform/InstallPromises.h"

namespace appsync {

/// A point in time as people know it; kept with a resolution of a millisecond.
using WallTime = std::chrono::system_clock::time_point;

/// How far the install of one application has come.
struct InstallProgress {
    std::uint64_t state = 0;  // an InstallState
    std::uint64_t phase = 0;  // an InstallPhase
    /// Of the transfer, in the units of whoever reports it.
    std::int64_t totalUnits = 0;
    std::int64_t completedUnits = 0;
    /// Of the unpacking: from 0 to 1.
    double unpacked = 0;

    /// Of both together, from 0 to 1: the first half is the transfer.
    [[nodiscard]] double fraction() const noexcept;
};

/// A version that an update has replaced and that a rollback brings back.
struct KeptVersion {
    std::optional<std::string> version;
    std::uint64_t bytes = 0;
};

/// What a rollback has done.
struct RollbackRecord {
    std::optional<std::string> oldVersion;  // that was installed
    std::optional<std::string> newVersion;  // that is
};

/// One installed application, or one placeholder. An update under way has a record of each.
struct ApplicationRecord {
    std::string identifier;
    std::optional<std::string> version;
    std::optional<std::string> name;
    bool isPlaceholder = false;
    std::string type;               // "User" or "System"
    std::uint64_t installType = 0;  // an InstallType
    std::string container;          // device path of the directory that holds the bundle
    std::string bundle;             // device path of the bundle
    std::string iconFile;           // name of a file that the bundle may hold
    std::uint64_t bytes = 0;
    /// Of a placeholder whose install is under way.
    std::optional<InstallProgress> progress;
    /// Of an application: what its last update has replaced, while that is kept.
    std::optional<KeptVersion> kept;
};

/// What a person or a manager has set.
struct DeviceSettings {
    PolicyAnswer installation = PolicyAnswer::Unset;
    PolicyAnswer removal = PolicyAnswer::Unset;
    bool coordination = false;
};

/// What to set; what is absent stays as it is.
struct DeviceSettingsChange {
    std::optional<PolicyAnswer> installation = std::nullopt;
    std::optional<PolicyAnswer> removal = std::nullopt;
    std::optional<bool> coordination = std::nullopt;
};

/// Who holds the device, or held it.
struct SessionRecord {
    /// A session holds the device at this moment.
    bool isUnderWay = false;
    /// Its process, where that is known.
    std::optional<std::int64_t> process;
    /// Since when, where that is known.
    std::optional<WallTime> since;
    /// None does, and the last one did not come to its end.
    bool wasInterrupted = false;
};

/// One record of the transaction log.
struct HistoryRecord {
    enum class Kind { Step, Scenario };

    WallTime time;
    Kind kind = Kind::Step;
    std::string scenario;     // scenarios only
    std::uint64_t step = 0;   // the step's kind; the step of a scenario
    std::uint64_t party = 0;  // steps only
    std::uint64_t phase = 0;  // steps only: 1 start, 2 end
    bool success = false;
    std::string identifier;
    std::string description;
};

/// That the termination of a running application was denied.
struct TerminationDenial {
    WallTime when;
    WallTime nextTry;
};

/// One piece of a coordinated install that a client has promised.
struct PromiseRecord {
    std::string name;
    bool complete = false;
    double percent = 0;             // from 0 to 1
    CoordinationClient client = 0;  // who has to keep it
    /// Its keeper gave it up: nobody waits for it.
    bool cancelled = false;
};

/// One install as the device's coordination service has it.
struct CoordinatorRecord {
    std::string identifier;
    std::string kind;               // "initiating", "updating", "restoring", "restoring demoted"
    CoordinationClient client = 0;  // who created it
    /// In this order, as far as they are there: the package, the user data, the initial assets.
    std::vector<PromiseRecord> promises;
    /// Whether the client has handed in a placeholder, and whether that stands on the home screen.
    bool hasPlaceholder = false;
    bool placeholderStands = false;
    /// Whether everything is there: the device installs it, or does once nothing is in its way.
    bool isComplete = false;
    /// One sentence on the first piece that is missing; empty when the coordinator is complete.
    std::string waitsFor;
    /// Whose task that piece is, where that is known.
    std::optional<CoordinationClient> waitsForClient;
    /// The last failure of an install of this application, if there was one.
    std::optional<ErrorRecord> error;

    /// Whether it brings back what a restore has left a placeholder of.
    [[nodiscard]] bool restores() const { return kind.starts_with("restoring"); }
};

/// The last failure of an install. A later success takes it away.
struct InstallFailure {
    WallTime when;
    ErrorRecord error;
};

/// An application whose last install failed.
struct FailedInstall {
    std::string identifier;
    InstallFailure failure;
};

/// What is known of one identifier, for whoever wants to know what it waits for.
struct ApplicationStatus {
    std::optional<ApplicationRecord> installed;
    std::optional<ApplicationRecord> placeholder;
    bool isRunning = false;
    /// An install of it is at work and keeps it from running.
    bool isHeld = false;
    /// A session holds the device at this moment.
    bool sessionUnderWay = false;
    /// Present while an install waits for the application to end.
    std::optional<TerminationDenial> denial;
    std::optional<InstallFailure> lastFailure;
    /// The install that is being coordinated, if one is.
    std::optional<CoordinatorRecord> coordinator;
    /// Data to restore is yet to come.
    bool awaitsRestoreData = false;
    /// When a person removed it from the device, if the host has not taken note of that yet.
    std::optional<WallTime> uninstalled;
};

/// What a device holds, all of it of one moment.
struct DeviceMoment {
    SessionRecord session;
    /// By identifier: what is installed, or has a placeholder or a coordinator.
    std::map<std::string, ApplicationStatus> applications;
};

}  // namespace appsync
