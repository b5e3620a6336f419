#include "host/plan/LibraryReader.h"

#include <algorithm>
#include <array>
#include <filesystem>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>

#include "device/package/PackageReader.h"
#include "host/console/Problem.h"
#include "host/file/HostFile.h"
#include "host/plan/TransferError.h"
#include "platform/PropertyListSerialization.h"
#include "system/file/PosixError.h"

namespace appsync {
namespace {

constexpr std::uint64_t kMaximumIconOrderBytes = std::uint64_t{16} << 20;

// "A.ZIP" counts too: a package that is passed over would look like one to remove.
bool isPackageName(const std::string& name) {
    constexpr std::string_view suffix = ".zip";
    if (name.size() < suffix.size() || name.front() == '.') return false;
    return std::equal(suffix.rbegin(), suffix.rend(), name.rbegin(), [](char wanted, char found) {
        return wanted == found || (wanted >= 'a' && wanted - 'a' + 'A' == found);
    });
}

LibraryPackage packageOf(const PackageInfo& info, std::string file) {
    return {info.identifier, info.version,     info.displayName,
            std::move(file), info.packedBytes, bytesOnDevice(info)};
}

std::string iconOrderProblem(const PropertyList& order) {
    if (!order.isArray()) return "it is not a list of bundle identifiers";
    const auto elements = order.elements();
    const bool strings = std::all_of(elements.begin(), elements.end(),
                                     [](const PropertyList& each) { return each.isString(); });
    return strings ? "" : "it holds something that is not a bundle identifier";
}

// The files of a staging area stand beside the directories that are named by applications.
bool isStagingFileName(std::string_view identifier) {
    constexpr std::array<std::string_view, 4> names = {
        "ApplicationsSync.plist", "ApplicationsSync.plist-debug.plist", "AssetSortOrder.plist",
        "DeskoraIconState.plist"};
    return std::find(names.begin(), names.end(), identifier) != names.end();
}

Result<LibraryPackage> usablePackage(LibraryPackage described) {
    if (!isStagingFileName(described.identifier)) return described;
    return failure(
        "the device keeps a file under the name " + described.identifier + " when it syncs",
        "give the application another identifier");
}

}  // namespace

Result<std::vector<std::string>> packageNamesIn(const std::string& folder) {
    std::error_code code;
    std::vector<std::string> names;
    std::filesystem::directory_iterator iterator(folder, code);
    for (; !code && iterator != std::filesystem::directory_iterator(); iterator.increment(code)) {
        const std::string name = iterator->path().filename().string();
        if (isPackageName(name)) names.push_back(name);
    }
    if (code) {
        return unusable("cannot read the library " + displayPath(folder) + ": " + code.message(),
                        "name a folder of packages");
    }
    std::sort(names.begin(), names.end());
    return names;
}

Result<std::optional<Bytes>> readIconOrder(const std::string& folder,
                                           PropertyListSerialization& propertyLists) {
    const std::string path = folder + "/" + std::string(kIconOrderFile);
    std::error_code code;
    if (!std::filesystem::exists(path, code) && !code) return std::optional<Bytes>();
    Result<Bytes> bytes = readHostFile(path, kMaximumIconOrderBytes);
    if (!bytes) return bytes.error();
    const Result<PropertyList> order = propertyLists.parse(*bytes);
    const std::string problem =
        order ? iconOrderProblem(*order) : order.error().withContext(path).description();
    if (problem.empty()) return std::optional<Bytes>(*std::move(bytes));
    return ErrorRecord::make(kPropertyListErrorDomain, 0, problem + "; correct it, or remove it");
}

Result<LibraryPackage> readPackage(const std::string& file,
                                   PropertyListSerialization& propertyLists) {
    const Result<PackageReader> package = PackageReader::open(file, propertyLists);
    if (!package) return package.error();
    return usablePackage(packageOf(package->info(), file));
}

Result<LibraryPackage> readWholePackage(const std::string& file,
                                        PropertyListSerialization& propertyLists,
                                        const std::function<void(std::uint64_t bytes)>& progress) {
    Result<PackageReader> package = PackageReader::open(file, propertyLists);
    if (!package) return package.error();
    Result<LibraryPackage> described = usablePackage(packageOf(package->info(), file));
    if (!described) return described;
    const Status verified = package->verify(progress);
    if (!verified) return verified.error();
    return described;
}

namespace {

// ID.zip, or the first of that name but for the case of its end.
std::optional<std::string> fileNamedFor(const std::string& folder, const std::string& identifier) {
    std::string plain = folder + "/" + identifier + ".zip";
    std::error_code code;
    if (std::filesystem::exists(plain, code)) return plain;
    const Result<std::vector<std::string>> names = packageNamesIn(folder);
    if (!names) return std::nullopt;
    for (const std::string& name : *names) {
        const bool isNamedSo = name.size() == identifier.size() + 4 && name.starts_with(identifier);
        if (isNamedSo) return std::string(folder).append("/").append(name);
    }
    return std::nullopt;
}

}  // namespace

Result<std::string> packageFileFor(const Library& library, const std::string& identifier) {
    if (const LibraryPackage* package = library.find(identifier)) return package->file;
    if (std::optional<std::string> file = fileNamedFor(library.folder, identifier)) {
        return *std::move(file);
    }
    return ErrorRecord::make(
        kTransferErrorDomain, kTransferNoPackage,
        "the library has no package of " + identifier + ": put one into " + library.folder);
}

Result<LibraryPackage> packageFor(const Library& library, const std::string& identifier,
                                  PropertyListSerialization& propertyLists) {
    if (const LibraryPackage* known = library.find(identifier)) return *known;
    Result<std::string> file = packageFileFor(library, identifier);
    if (!file) return file.error();
    const Result<PackageReader> package = PackageReader::open(*file, propertyLists);
    if (!package) return package.error();
    if (package->info().identifier != identifier) {
        return failure(*file + " is a package of " + package->info().identifier,
                       "put one of " + identifier + " in its place");
    }
    return packageOf(package->info(), *std::move(file));
}

Status verifyPackage(const std::string& file, const std::string& identifier,
                     PropertyListSerialization& propertyLists) {
    Result<PackageReader> package = PackageReader::open(file, propertyLists);
    if (!package) return package.error();
    const Status expected = package->expectIdentifier(identifier);
    return expected ? package->verify() : expected;
}

std::uint64_t bytesOnDevice(const PackageInfo& info) {
    return info.unpackedBytes + info.entryCount * kBlockBytes;  // each file fills its last block
}

namespace {

// The package in a file of the library, read only where the index does not know it.
Result<LibraryPackage> indexedPackage(LibraryIndex& index, const std::string& name,
                                      const std::string& file,
                                      PropertyListSerialization& propertyLists) {
    // Before it is read: what changes it meanwhile changes the stamp that is found next time.
    const std::optional<FileStamp> stamp = stampOf(file);
    if (stamp) {
        if (std::optional<LibraryPackage> known = index.take(name, *stamp)) {
            known->file = file;
            return usablePackage(*std::move(known));
        }
    }
    Result<LibraryPackage> package = readPackage(file, propertyLists);
    if (package && stamp) index.keep(name, *stamp, *package);
    return package;
}

}  // namespace

Result<Library> readLibrary(const std::string& folder, PropertyListSerialization& propertyLists,
                            const StepProgress& progress, const LibraryIndexPlace& indexPlace) {
    const Result<std::vector<std::string>> names = packageNamesIn(folder);
    if (!names) return names.error();
    Library library;
    library.folder = folder;
    LibraryIndex index(indexPlace, folder, names->size());
    std::vector<LibraryPackage> packages;
    packages.reserve(names->size());
    std::size_t done = 0;
    for (const std::string& name : *names) {
        if (progress) progress(done++, names->size());
        std::string file = folder;
        file.append("/").append(name);
        Result<LibraryPackage> package = indexedPackage(index, name, file, propertyLists);
        if (package) {
            packages.push_back(*std::move(package));
        } else {
            library.faults.push_back({name, package.error().description()});
        }
    }
    if (progress) progress(done, names->size());
    index.save();
    library.packages = keepHighestVersions(std::move(packages), library.notes);
    Result<std::optional<Bytes>> iconOrder = readIconOrder(folder, propertyLists);
    if (iconOrder) {
        library.iconOrder = *std::move(iconOrder);
    } else {
        library.faults.push_back({std::string(kIconOrderFile), iconOrder.error().description()});
    }
    return library;
}

}  // namespace appsync
