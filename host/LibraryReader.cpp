#include "host/LibraryReader.h"

#include <algorithm>
#include <filesystem>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>

#include "device/PackageReader.h"
#include "host/HostFile.h"
#include "host/Problem.h"
#include "platform/PropertyListSerialization.h"

namespace appsync {
namespace {

constexpr std::uint64_t kBlockBytes = 4096;
constexpr std::uint64_t kMaximumIconOrderBytes = std::uint64_t{16} << 20;

// "A.ZIP" counts too: a package that is passed over would look like one to remove.
bool isPackageName(const std::string& name) {
    constexpr std::string_view suffix = ".zip";
    if (name.size() < suffix.size() || name.front() == '.') return false;
    return std::equal(suffix.rbegin(), suffix.rend(), name.rbegin(), [](char wanted, char found) {
        return wanted == found || (wanted >= 'a' && wanted - 'a' + 'A' == found);
    });
}

Result<std::vector<std::string>> packageFiles(const std::string& folder) {
    std::error_code code;
    std::vector<std::string> names;
    std::filesystem::directory_iterator iterator(folder, code);
    for (; !code && iterator != std::filesystem::directory_iterator(); iterator.increment(code)) {
        const std::string name = iterator->path().filename().string();
        if (isPackageName(name)) names.push_back(name);
    }
    if (code) {
        return unusable("cannot read the library " + folder + ": " + code.message(),
                        "name a folder of packages");
    }
    std::sort(names.begin(), names.end());
    return names;
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

void readIconOrder(Library& library, PropertyListSerialization& propertyLists) {
    const std::string name(kIconOrderFile);
    const std::string path = library.folder + "/" + name;
    std::error_code code;
    if (!std::filesystem::exists(path, code) && !code) return;
    Result<Bytes> bytes = readHostFile(path, kMaximumIconOrderBytes);
    if (!bytes) {
        library.faults.push_back({name, bytes.error().description()});
        return;
    }
    const Result<PropertyList> order = propertyLists.parse(*bytes);
    const std::string problem =
        order ? iconOrderProblem(*order) : order.error().withContext(path).description();
    if (problem.empty()) {
        library.iconOrder = *std::move(bytes);
    } else {
        library.faults.push_back({name, problem});
    }
}

}  // namespace

std::uint64_t bytesOnDevice(const PackageInfo& info) {
    return info.unpackedBytes + info.entryCount * kBlockBytes;  // each file fills its last block
}

Result<Library> readLibrary(const std::string& folder, PropertyListSerialization& propertyLists) {
    const Result<std::vector<std::string>> names = packageFiles(folder);
    if (!names) return names.error();
    Library library;
    library.folder = folder;
    std::vector<LibraryPackage> packages;
    for (const std::string& name : *names) {
        std::string file = folder;
        file.append("/").append(name);
        const Result<PackageReader> package = PackageReader::open(file, propertyLists);
        if (package) {
            packages.push_back(packageOf(package->info(), file));
        } else {
            library.faults.push_back({name, package.error().description()});
        }
    }
    library.packages = keepHighestVersions(std::move(packages), library.notes);
    readIconOrder(library, propertyLists);
    return library;
}

}  // namespace appsync
