#include "host/session/Parcels.h"

#include <filesystem>
#include <memory>

#include "client/Paths.h"
#include "device/Device.h"
#include "device/package/DataArchive.h"
#include "device/values/PackageIdentifier.h"
#include "host/console/Problem.h"
#include "host/file/HostFile.h"

namespace appsync {
namespace {

bool beginsAsArchive(const std::string& file) {
    Result<HostFile> opened = HostFile::open(file);
    Bytes begin(2);
    const Result<std::size_t> count = opened ? opened->read(begin) : Result<std::size_t>(0);
    return count && *count == 2 && begin[0] == 'P' && begin[1] == 'K';
}

Session::Parcel parcelOf(const ParcelContents& contents, const std::string& version) {
    Session::Parcel parcel;
    parcel.asset = std::make_shared<SyncAsset>();
    parcel.asset->identifier = contents.identifier;
    parcel.asset->dataclass = kApplicationDataclass;
    parcel.asset->isRestore = contents.isRestore;
    parcel.asset->completedParts = contents.parts;
    parcel.asset->variantOptions.set("AssetParts", contents.parts);
    if (!version.empty()) parcel.asset->variantOptions.set("Version", version);
    parcel.file = contents.file;
    return parcel;
}

}  // namespace

Session::Parcel packageParcel(const ParcelContents& contents, const std::string& version) {
    Session::Parcel parcel = parcelOf(contents, version);
    parcel.directory = kPublicStaging;
    parcel.name = archiveNameOf(contents.identifier);
    return parcel;
}

Result<Session::Parcel> dataParcel(const ParcelContents& contents, const std::string& version) {
    Session::Parcel parcel = parcelOf(contents, version);
    parcel.keepsPath = true;  // the package's, which the plug-in has kept
    const Status isArchive = verifyDataArchive(contents.file);
    if (isArchive) {
        const std::filesystem::path archive = Device::restoreDataPath(contents.identifier);
        parcel.directory = archive.parent_path().native();
        parcel.name = archive.filename().native();
        return parcel;
    }
    if (beginsAsArchive(contents.file)) {
        return failure(contents.file + ": " + isArchive.error().description(),
                       "send the archive of a whole backup");
    }
    parcel.directory = Device::dataPath(contents.identifier);
    parcel.name = std::filesystem::path(contents.file).filename().string();
    return parcel;
}

}  // namespace appsync
