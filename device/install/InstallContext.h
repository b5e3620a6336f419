#pragma once

// device/install: how applications come to a device and go. Each operation is a function over an
// `InstallContext` (this header), and ends in one transaction, before which nothing has changed:
//
//     ApplicationInstall.h   a package becomes an application, with RestoreData.h that of a backup
//     PlaceholderInstall.h   a bundle becomes a placeholder
//     BundleRemoval.h        what goes, and what stays
//     Rollback.h             the version before an update comes back
//
// They share Containers.h (the directories of bundles), KeptBundles.h (those of versions that were
// replaced), DurabilityBarrier.h (syncs that threads share), JointCommits.h (transactions of
// installs that end together) and ProgressBook.h (how far each install is).
//
// After a crash or a session that was cut off, Reconciliation.h and CoordinationRecovery.h remove
// what neither database nor disk can account for (docs/device-format.md). Who may call it when is
// for the callers to know: registry (the plug-in's direct path), coordination (its threads) and
// `Device` (people). Includes database, package, screen, values and system/.

#include <functional>
#include <string>

#include "platform/Result.h"

namespace appsync {

class Containers;
class Database;
class DeviceDatabase;
class DurabilityBarrier;
class JointCommits;
class KeptBundles;
class ProgressBook;
class PropertyListSerialization;
class RootedFileSystem;

/// What installing and removing work with. Everything outlives whoever holds a copy of this.
struct InstallContext {
    DeviceDatabase& database;
    RootedFileSystem& files;
    Containers& containers;
    KeptBundles& kept;
    DurabilityBarrier& barrier;
    JointCommits& commits;
    ProgressBook& progress;
    PropertyListSerialization& propertyLists;
    /// Names this boot of the machine; empty when it is not known.
    const std::string& boot;
    /// See DeviceOpenOptions.
    bool keepsData = false;
};

/// What goes into the same transaction as an install; when it fails, nothing is installed.
using AlsoCommitted = std::function<Status(Database&)>;

/// A failure of the device's database as the registry tells it; other failures, and success, as
/// they are.
[[nodiscard]] Status asRegistryStatus(Status status);

/// Keeps the failure of an install for those who ask later.
void rememberFailure(const InstallContext& context, const std::string& identifier,
                     const ErrorRecord& error);

}  // namespace appsync
