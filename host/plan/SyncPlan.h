#pragma once

// host/plan: what a sync is to do, found out before anything is done. Library.h and LibraryReader.h
// are the folder of packages (Versions.h compares, LibraryIndex.h remembers them), SyncPlan.h (this
// header) what of it the device lacks, StandingInstalls.h what an earlier coordinated session has
// left and goes on, StagingArea.h and InterruptedStaging.h the staging area that a host has written
// or an interrupted session left. SyncPreparation.h puts these together for `sync` and `plan`, and
// makes the device ready for the session. For `send`, RestoredParts.h is what a package of a
// restore comes with; TransferError.h are the errors of what travels.
//
// The plan itself is plain: device records in, `SyncPlan` out, no file and no device touched.
// Called by session (which judges its outcome by the plan), watch, output, backup and the commands.
// Includes console, file, device, system/ and client/ (paths, the todo list).

#include <cstdint>
#include <functional>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "host/plan/Library.h"
#include "platform/Result.h"

namespace appsync {

struct ApplicationRecord;
struct DeviceSettings;
class PropertyList;

/// What the person asked for, beside "in step with the library".
struct PlanOptions {
    /// Identifiers to remove, whatever the library holds.
    std::vector<std::string> remove;
    /// Remove every user application that the library lacks.
    bool mirror = false;
    /// Of the library these alone, where any are named; one that it lacks has failed.
    std::vector<std::string> only = {};
    /// Bring offloaded applications back: the plug-in asks for those where installs are
    /// coordinated.
    bool bringsOffloaded = false;
    /// How a person brings what a restore has left a placeholder of, where the sync does not.
    std::function<std::string(const std::string& identifier)> howRestoredComes = nullptr;
};

/// An application to bring to the device, or to bring up to date there.
struct PlannedInstall {
    std::string identifier;
    std::string name;
    std::string oldVersion;  // empty for one that is absent
    std::string newVersion;
    std::uint64_t bytes = 0;          // that travel
    std::uint64_t unpackedBytes = 0;  // that it takes when installed
    bool hasArrived = false;          // its package is on the device already, and travels no more
    bool isInstalledUnasked = false;  // the device installs it with nothing more being done
    bool isLeftOver = false;          // the plan does not ask for it: it comes all the same
    std::string doubt = {};           // why no good package of it can be sent, if there is none
    std::string file = {};            // its package on this machine, where there is one
    /// Why the host sends nothing, although the device asks for it; empty where it does send.
    std::string refusal = {};

    /// The device has a higher version than the one to come.
    [[nodiscard]] bool isDowngrade() const;
};

/// Why policy keeps something from being done.
inline constexpr std::string_view kInstallationForbidden =
    "device policy does not allow installing applications";
inline constexpr std::string_view kRemovalForbidden =
    "device policy does not allow removing applications";

/// The refusal of what policy keeps from being installed, with what to do.
[[nodiscard]] ErrorRecord installationForbidden();

/// Something that is left alone.
struct PlannedSkip {
    std::string identifier;
    std::string why;
    /// It was asked for all the same: the device will not be in step.
    bool isUnmet = false;
};

/// An application, or a file, and what is wrong with it.
struct SyncFailure {
    std::string identifier;
    std::string error;
};

/// What a sync would do.
struct SyncPlan {
    std::vector<PlannedInstall> install;
    std::vector<PlannedInstall> update;
    std::vector<std::string> remove;
    std::vector<PlannedSkip> skipped;
    /// What is asked for but cannot even be tried.
    std::vector<SyncFailure> failed;
    /// For people: packages of the library that others have hidden.
    std::vector<std::string> notes;
    /// For people: what they may not have meant.
    std::vector<std::string> warnings;
    /// It brings the device in step with a library; a staging area only asks for this and that.
    bool bringsInStep = true;
    /// Bytes on the device that the removals give back.
    std::uint64_t reclaimed = 0;

    [[nodiscard]] bool empty() const { return install.empty() && update.empty() && remove.empty(); }
    /// Bytes of all packages that are still to travel.
    [[nodiscard]] std::uint64_t bytes() const;
    /// Bytes that the device must have free: every package, and every application unpacked. An
    /// update too is unpacked beside the version that it replaces.
    [[nodiscard]] std::uint64_t needed() const;
};

/// Whether a plan fits on a device.
struct SpaceCheck {
    std::uint64_t needed = 0;
    std::uint64_t free = 0;  // as the device is now
    /// What the removals give back before the first package comes.
    std::uint64_t reclaimed = 0;

    [[nodiscard]] std::uint64_t missing() const {
        const std::uint64_t available = free + reclaimed;
        return needed > available ? needed - available : 0;
    }
    [[nodiscard]] bool fits() const { return missing() == 0; }
    /// One sentence for people: what is needed, what is free, how much is missing, what to do.
    [[nodiscard]] std::string description() const;
};

/// Compares a library with what the device holds (every record of it, in any order).
[[nodiscard]] SyncPlan makePlan(const Library& library,
                                const std::vector<ApplicationRecord>& present,
                                const PlanOptions& options);

/// What the device holds in the library's very version.
[[nodiscard]] std::set<std::string> identifiersInStep(
    const Library& library, const std::vector<ApplicationRecord>& present);

/// What of the plan can happen: what the device's policy forbids is skipped, what has no good
/// package has failed.
[[nodiscard]] SyncPlan allowedBy(const DeviceSettings& settings, SyncPlan plan);

/// What a staged plan has to know beside the todo list.
struct StagedPlanOptions {
    /// The package that would be sent for an identifier, or why there is none that a device takes.
    std::function<Result<LibraryPackage>(const std::string& identifier)> packageOf;
    /// The version that the staging area has the name and icon of; nothing where it tells none.
    std::function<std::optional<std::string>(const std::string& identifier)> stagedVersionOf =
        nullptr;
    /// The device asks for offloaded applications: where installs are coordinated.
    bool bringsOffloaded = false;
    /// As in `PlanOptions`.
    std::function<std::string(const std::string& identifier)> howRestoredComes = nullptr;
};

/// The plan that a todo list asks for, whatever stands in it. Entries with another operation than
/// "install" and "remove" ask for nothing. An install without a good package is planned with a
/// doubt, as the device asks for it all the same.
[[nodiscard]] SyncPlan makeStagedPlan(const PropertyList& todoList,
                                      const std::vector<ApplicationRecord>& present,
                                      const StagedPlanOptions& options);

}  // namespace appsync
