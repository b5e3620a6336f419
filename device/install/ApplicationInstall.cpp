#include "device/install/ApplicationInstall.h"

#include <sys/statvfs.h>

#include <cerrno>
#include <memory>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/RegistryTables.h"
#include "device/database/SumTable.h"
#include "device/install/Containers.h"
#include "device/install/InstallContext.h"
#include "device/install/JointCommits.h"
#include "device/install/KeptBundles.h"
#include "device/install/ProgressBook.h"
#include "device/install/RestoreData.h"
#include "device/package/PackageReader.h"
#include "device/values/DeviceError.h"
#include "platform/FileURL.h"
#include "system/file/PosixError.h"
#include "system/file/RootDirectory.h"
#include "system/file/RootedFileSystem.h"

namespace appsync {

namespace {

Result<PackageReader> openPackage(const InstallContext& context, const std::string& identifier,
                                  const FileURL& package) {
    Result<RegularFile> file =
        context.files.root().openRegularFile(package.path(), "read the package");
    if (!file) return file.error();
    Result<PackageReader> reader =
        PackageReader::open(*std::move(file), displayPath(package.path()), context.propertyLists);
    if (!reader) return reader;
    if (Status status = reader->expectIdentifier(identifier); !status) return status.error();
    return reader;
}

Status checkSpace(int directory, const std::string& identifier, const PackageInfo& info) {
    struct statvfs space = {};
    if (::fstatvfs(directory, &space) != 0) return {};  // the writes will tell
    const std::uint64_t free = std::uint64_t{space.f_bavail} * space.f_frsize;
    if (info.unpackedBytes <= free) return {};
    return posixError(ENOSPC, "unpack", identifier,
                      "it needs " + std::to_string(info.unpackedBytes) + " bytes and " +
                          std::to_string(free) +
                          " are free; remove something from the device and sync again");
}

Status unpack(const NewContainer& container, PackageReader& reader, InstallProgressRecord* record) {
    PackageUnpackOptions options;
    options.progress = [record](std::uint64_t done, std::uint64_t total) {
        const double fraction =
            total == 0 ? 1 : static_cast<double>(done) / static_cast<double>(total);
        return ProgressBook::installing(record, fraction);
    };
    return reader.unpackInto(container.descriptor(), options);
}

BundleRow rowOf(const PackageInfo& info, const NewContainer& container, std::uint64_t installType) {
    BundleRow row;
    row.identifier = info.identifier;
    if (!info.version.empty()) row.version = info.version;
    row.name = info.displayName;
    row.installType = installType;
    row.container = container.name();
    row.bundle = info.bundleDirectoryName;
    row.iconFile = info.iconFile;
    row.bytes = info.unpackedBytes;
    return row;
}

// A person who uninstalls an application while its install is under way has the last word.
Status refuseIfUninstalled(Database& database, const std::string& identifier) {
    Query rows = database.query(
        "SELECT 1 FROM uninstalled JOIN session ON uninstalled.id > last_uninstall"
        " WHERE identifier = ?");
    rows.bind(identifier);
    const bool found = rows.next();
    if (Status status = rows.status(); !status) return status;
    if (!found) return {};
    return registryError(RegistryErrorCode::Uninstalled,
                         identifier +
                             " was uninstalled on the device while the sync was under way; sync "
                             "again to bring it back");
}

JointCommits::Outcome commitInstall(const InstallContext& context, const PackageReader& package,
                                    NewContainer& container, std::uint64_t installType,
                                    const AlsoCommitted& alsoCommitted) {
    const BundleRow row = rowOf(package.info(), container, installType);
    const std::uint64_t sum = package.bundleSum();
    FreedContainers freed;
    JointCommits::Outcome outcome = context.commits.commit([&](Database& database) {
        Status committing = refuseIfUninstalled(database, row.identifier);
        if (committing) committing = recordInstalled(database, row, freed);
        if (committing) committing = recordSum(database, row.container, sum);
        return committing && alsoCommitted ? alsoCommitted(database) : committing;
    });
    if (!outcome.synced) return outcome;
    if (!outcome.committed) return {{}, asRegistryStatus(std::move(outcome.committed))};
    container.keep();
    context.progress.forget(row.identifier, kInstallStateFinished);
    putAway(context, freed);
    return outcome;
}

// After a failed sync nobody knows what is on disk, so everything is written anew, once.
Status unpackAndCommit(const InstallContext& context, const std::string& identifier,
                       PackageReader& reader, std::uint64_t installType,
                       const AlsoCommitted& alsoCommitted) {
    const std::shared_ptr<InstallProgressRecord> record = context.progress.record(identifier);
    for (bool again : {true, false}) {
        makeRoomFor(context, reader.info().unpackedBytes);
        Result<NewContainer> container = context.containers.make();
        if (!container) return container.error();
        Status status = checkSpace(container->descriptor(), identifier, reader.info());
        if (status) status = unpack(*container, reader, record.get());
        // Other installs that came at the same time may have taken the room.
        if (!status && again && makesRoomAfter(context, status.error())) continue;
        if (!status) return status;
        JointCommits::Outcome outcome =
            commitInstall(context, reader, *container, installType, alsoCommitted);
        if (outcome.synced) return std::move(outcome.committed);
        if (!again) return std::move(outcome.synced);
    }
    return posixError(EIO, "unpack", identifier);
}

}  // namespace

Status installApplicationWith(const InstallContext& context, const std::string& identifier,
                              const FileURL& package, std::uint64_t installType,
                              const AlsoCommitted& alsoCommitted) {
    Result<PackageReader> reader = openPackage(context, identifier, package);
    if (!reader) return reader.error();
    // Before the sync that the unpacked package goes through, which makes the data durable, too.
    if (Status status = placeRestoredData(context, identifier); !status) return status;
    Status status = unpackAndCommit(context, identifier, *reader, installType, alsoCommitted);
    if (status) dropRestoredData(context, identifier);
    return status;
}

Status installApplication(const InstallContext& context, const std::string& identifier,
                          const FileURL& package, std::uint64_t installType) {
    Status status = installApplicationWith(context, identifier, package, installType, {});
    if (status) return status;
    rememberFailure(context, identifier, status.error());
    if (const auto record = context.progress.record(identifier)) {
        if (record->installState() != kInstallStateCanceled) {
            record->setInstallState(kInstallStateFailed);
        }
    }
    return status;
}

}  // namespace appsync
