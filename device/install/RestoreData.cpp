#include "device/install/RestoreData.h"

#include <cerrno>

#include "device/install/BundleRemoval.h"
#include "device/install/InstallContext.h"
#include "device/package/DataArchive.h"
#include "device/values/DevicePaths.h"
#include "device/values/PackageIdentifier.h"
#include "system/RootDirectory.h"
#include "system/RootedFileSystem.h"

namespace appsync {

namespace {

Status removeIfThere(const InstallContext& context, const std::string& path) {
    Status removed = context.files.removeItem(path);
    if (!removed && removed.error().code == ENOENT) return {};
    return removed;
}

Status unpackTo(const InstallContext& context, const RegularFile& archive, const std::string& name,
                const std::string& directory) {
    if (Status status = removeIfThere(context, directory); !status) return status;
    if (Status status = context.files.createDirectory(directory, true, nullptr); !status) {
        return status;
    }
    const Result<UniqueFd> opened = context.files.root().openDirectory(directory);
    if (!opened) return opened.error();
    return unpackDataArchive(archive.descriptor.get(), name, opened->get());
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
    const std::string unpacked = std::string(kUnpackedDataDirectory) + "/" + identifier;
    Status status = unpackTo(context, *archive, archiveNameOf(identifier), unpacked);
    if (status) status = replaceData(context, unpacked, dataDirectoryOf(identifier));
    if (status) return status;
    context.files.removeItem(unpacked).ignore();
    const ErrorRecord error =
        status.error().withContext("the data of " + identifier + " cannot be restored");
    if (error.domain != kInstallerErrorDomain) return error;
    return ErrorRecord::make(error.domain, error.code,
                             error.description() + "; restore it from another backup");
}

void dropRestoredData(const InstallContext& context, const std::string& identifier) {
    context.files.removeItem(restoreArchiveOf(identifier)).ignore();
}

}  // namespace appsync
