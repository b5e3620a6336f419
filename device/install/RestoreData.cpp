#include "device/install/RestoreData.h"

#include <cerrno>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/RegistryTables.h"
#include "device/install/BundleRemoval.h"
#include "device/install/DurabilityBarrier.h"
#include "device/install/InstallContext.h"
#include "device/install/KeptBundles.h"
#include "device/package/DataArchive.h"
#include "device/values/DeviceError.h"
#include "device/values/DevicePaths.h"
#include "device/values/PackageIdentifier.h"
#include "system/file/RootDirectory.h"
#include "system/file/RootedFileSystem.h"

namespace appsync {

namespace {

Status removeIfThere(const InstallContext& context, const std::string& path) {
    Status removed = context.files.removeItem(path);
    if (!removed && removed.error().code == ENOENT) return {};
    return removed;
}

std::string placeOfNewData(const std::string& identifier) {
    return std::string(kUnpackedDataDirectory) + "/" + identifier;
}

Status fillAnew(const InstallContext& context, const std::string& directory, const DataFill& fill) {
    if (Status status = removeIfThere(context, directory); !status) return status;
    if (Status status = context.files.createDirectory(directory, true, nullptr); !status) {
        return status;
    }
    const Result<UniqueFd> opened = context.files.root().openDirectory(directory);
    return opened ? fill(opened->get()) : Status(opened.error());
}

// What updates have replaced is kept only as long as nothing else needs the room.
Status fillWithRoom(const InstallContext& context, const std::string& directory,
                    const DataFill& fill) {
    Status status = fillAnew(context, directory, fill);
    if (status || !makesRoomAfter(context, status.error())) return status;
    return fillAnew(context, directory, fill);
}

Status replaceData(const InstallContext& context, const std::string& from, const std::string& to) {
    Status status = context.files.createDirectory(std::string(kDataDirectory), true, nullptr);
    if (status) status = removeIfThere(context, to);
    return status ? context.files.moveItem(from, to) : status;
}

}  // namespace

std::string restoreArchiveOf(const std::string& identifier) {
    return std::string(kRestoreDataDirectory) + "/" + archiveNameOf(identifier);
}

Status placeRestoredData(const InstallContext& context, const std::string& identifier) {
    const std::string path = restoreArchiveOf(identifier);
    const Result<RegularFile> archive = context.files.root().openRegularFile(path);
    if (!archive) return archive.error().code == ENOENT ? Status() : Status(archive.error());
    const std::string unpacked = placeOfNewData(identifier);
    Status status = fillWithRoom(context, unpacked, [&](int directory) {
        return unpackDataArchive(archive->descriptor.get(), archiveNameOf(identifier), directory);
    });
    if (status) status = replaceData(context, unpacked, dataDirectoryOf(identifier));
    if (status) return status;
    context.files.removeItem(unpacked).ignore();
    const ErrorRecord error =
        status.error().withContext("the data of " + identifier + " cannot be restored");
    if (error.domain != kInstallerErrorDomain) return error;
    return ErrorRecord::make(error.domain, error.code,
                             error.description() + "; restore it from another backup");
}

namespace {

// What a sync's placeholder stands for may never come, and nobody would remove its data.
Status requireOwner(Database& database, const std::string& identifier) {
    const Result<bool> installed = isInstalled(database, identifier);
    if (!installed) return installed.error();
    if (*installed) return {};
    const auto placeholder = findBundle(database, BundleTable::Placeholders, identifier);
    if (!placeholder) return placeholder.error();
    if (*placeholder && (*placeholder)->installType != kInstallTypeSync) return {};
    return registryError(RegistryErrorCode::NothingInstalled,
                         identifier + " is not on the device; appsync apps shows what is");
}

Status requireAtRest(Database& database, const std::string& identifier) {
    Query rows = database.query("SELECT 1 FROM running WHERE identifier = ?");
    rows.bind(identifier);
    if (!rows.next()) return rows.status();
    return registryError(RegistryErrorCode::Running,
                         identifier + " is running; quit it (appsync quit DEVICE " + identifier +
                             "), and replace its data then");
}

Status requireNoneWaiting(const InstallContext& context, Database& database,
                          const std::string& identifier) {
    Query rows = database.query("SELECT 1 FROM restore_data WHERE identifier = ?");
    rows.bind(identifier);
    const bool isExpected = rows.next();
    if (Status status = rows.status(); !status) return status;
    if (!isExpected && !context.files.itemExists(restoreArchiveOf(identifier))) return {};
    return registryError(RegistryErrorCode::UpdateUnderWay,
                         "a restore brings data of " + identifier +
                             " that would take the place of any other; install the application "
                             "first");
}

Status requireReplaceable(const InstallContext& context, Database& database,
                          const std::string& identifier) {
    Status status = requireOwner(database, identifier);
    if (status) status = requireAtRest(database, identifier);
    return status ? requireNoneWaiting(context, database, identifier) : status;
}

}  // namespace

Status checkDataReplaceable(const InstallContext& context, const std::string& identifier) {
    return asRegistryStatus(context.database.read(
        [&](Database& database) { return requireReplaceable(context, database, identifier); }));
}

Status replaceDataWith(const InstallContext& context, const std::string& identifier,
                       const DataFill& fill) {
    if (Status status = checkDataReplaceable(context, identifier); !status) return status;
    const std::string made = placeOfNewData(identifier);
    const std::string place = dataDirectoryOf(identifier);
    Status status = fillWithRoom(context, made, fill);
    if (status) status = context.barrier.pass();
    if (status) {
        // In a transaction: nobody can begin to run it, or uninstall it, between look and exchange.
        status = context.database.change(Durability::Soon, [&](Database& database) {
            Status exchanging = requireReplaceable(context, database, identifier);
            return exchanging ? context.files.exchangeItem(made, place) : exchanging;
        });
    }
    if (status) status = context.barrier.pass();
    // What has failed, or what stood there before.
    context.files.removeItem(made).ignore();
    return asRegistryStatus(status);
}

void dropRestoredData(const InstallContext& context, const std::string& identifier) {
    context.files.removeItem(restoreArchiveOf(identifier)).ignore();
}

}  // namespace appsync
