#include "device/package/PackageReader.h"

#include <utility>

#include "device/archive/PackageArchive.h"
#include "device/archive/PackageError.h"
#include "device/archive/PackageFile.h"
#include "device/package/BundleSum.h"
#include "device/package/PackageInfo.h"
#include "device/package/PackageUnpacker.h"
#include "device/values/PackageText.h"
#include "platform/PropertyListSerialization.h"

namespace appsync {

namespace {

std::string inBundle(std::string_view bundle, std::string_view fileName) {
    return std::string(bundle) + "/" + std::string(fileName);
}

Result<Bytes> readInfo(PackageArchive& archive, std::string_view bundle,
                       const PackageLimits& limits) {
    const PackageEntry* entry = archive.find(inBundle(bundle, kInfoPropertyListName));
    if (entry == nullptr || entry->isDirectory) {
        return packageError(PackageErrorCode::NoInfoPropertyList,
                            "there is no file Info.plist in " + quotedName(bundle) +
                                "; add it and make the package again");
    }
    return archive.read(*entry, limits.propertyListBytes);
}

Result<PackageInfo> describe(PackageArchive& archive, PropertyListSerialization& propertyLists,
                             const PackageLimits& limits) {
    const Result<std::string> bundle = bundleDirectoryOf(archive.entries());
    if (!bundle) return bundle.error();
    const Result<Bytes> bytes = readInfo(archive, *bundle, limits);
    if (!bytes) return bytes.error();
    Result<PropertyList> list = propertyLists.parse(*bytes);
    if (!list) {
        return packageError(PackageErrorCode::DamagedInfoPropertyList,
                            "Info.plist cannot be read: " + list.error().description() +
                                "; correct it and make the package again");
    }
    Result<PackageInfo> info = packageInfoFrom(*std::move(list), *bundle, limits);
    if (!info) return info;
    info->unpackedBytes = archive.unpackedBytes();
    info->packedBytes = archive.packedBytes();
    info->entryCount = archive.entries().size();
    info->hasStoreMetadata = archive.find(kStoreMetadataName) != nullptr;
    return info;
}

}  // namespace

PackageReader::PackageReader(std::unique_ptr<PackageArchive> archive, PackageInfo info,
                             const PackageLimits& limits)
    : archive_(std::move(archive)), info_(std::move(info)), limits_(limits) {}

PackageReader::PackageReader(PackageReader&& other) noexcept = default;
PackageReader& PackageReader::operator=(PackageReader&& other) noexcept = default;
PackageReader::~PackageReader() = default;

Result<PackageReader> PackageReader::open(const std::string& path,
                                          PropertyListSerialization& propertyLists,
                                          const PackageLimits& limits) {
    Result<PackageFile> file = PackageFile::open(path);
    if (!file) return file.error();
    return open(*std::move(file), propertyLists, limits);
}

Result<PackageReader> PackageReader::open(int fileDescriptor, std::string_view name,
                                          PropertyListSerialization& propertyLists,
                                          const PackageLimits& limits) {
    Result<PackageFile> file = PackageFile::duplicate(fileDescriptor, name);
    if (!file) return file.error();
    return open(*std::move(file), propertyLists, limits);
}

Result<PackageReader> PackageReader::open(RegularFile opened, std::string_view name,
                                          PropertyListSerialization& propertyLists,
                                          const PackageLimits& limits) {
    Result<PackageFile> file = PackageFile::take(std::move(opened), name);
    if (!file) return file.error();
    return open(*std::move(file), propertyLists, limits);
}

Result<PackageReader> PackageReader::open(PackageFile file,
                                          PropertyListSerialization& propertyLists,
                                          const PackageLimits& limits) {
    Result<std::unique_ptr<PackageArchive>> archive = PackageArchive::open(std::move(file), limits);
    if (!archive) return archive.error();
    Result<PackageInfo> info = describe(**archive, propertyLists, limits);
    if (!info) return (*archive)->named(info.error());
    return PackageReader(*std::move(archive), *std::move(info), limits);
}

std::uint64_t PackageReader::bundleSum() const {
    return sumOfEntries(archive_->entries(), info_.bundleDirectoryName);
}

Status PackageReader::expectIdentifier(std::string_view identifier) const {
    if (info_.identifier == identifier) return {};
    return archive_->named(
        packageError(PackageErrorCode::IdentifierMismatch,
                     "it holds " + info_.identifier + ", not " + quotedName(identifier) +
                         ", which was asked for; send the package of that application"));
}

Status PackageReader::verify(const std::function<void(std::uint64_t bytes)>& progress) {
    const Status verified = archive_->verify(progress);
    return verified ? verified : Status(archive_->named(verified.error()));
}

Result<Bytes> PackageReader::readFile(std::string_view entryName, std::uint64_t maximumBytes) {
    const PackageEntry* entry = archive_->find(entryName);
    if (entry == nullptr || entry->isDirectory) {
        return archive_->named(packageError(
            PackageErrorCode::NoSuchEntry, "there is no file " + quotedName(entryName) + " in it"));
    }
    Result<Bytes> contents = archive_->read(*entry, maximumBytes);
    if (!contents) return archive_->named(contents.error());
    return contents;
}

Result<Bytes> PackageReader::readStoreMetadata() {
    return readFile(kStoreMetadataName, limits_.propertyListBytes);
}

Result<Bytes> PackageReader::readInfoPropertyList() {
    return readBundleFile(kInfoPropertyListName, limits_.propertyListBytes);
}

Result<Bytes> PackageReader::readBundleFile(std::string_view fileName, std::uint64_t maximumBytes) {
    return readFile(inBundle(info_.bundleDirectoryName, fileName), maximumBytes);
}

Status PackageReader::unpackInto(int directoryDescriptor, const PackageUnpackOptions& options) {
    Status status = PackageUnpacker(*archive_, directoryDescriptor, options).run();
    if (!status) return archive_->named(status.error());
    return status;
}

}  // namespace appsync
