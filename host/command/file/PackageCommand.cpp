#include <filesystem>
#include <ostream>
#include <string>
#include <system_error>

#include "device/package/PackageReader.h"
#include "device/package/PackageWriter.h"
#include "host/command/argument/WrittenFile.h"
#include "host/command/file/FileCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/file/HostFile.h"
#include "host/output/JsonRecords.h"
#include "system/file/PosixError.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

std::string packageText(const PackageInfo& info) {
    return printable(info.identifier) + " " + printable(info.version) + " (" +
           printable(info.displayName) + "), " + std::to_string(info.entryCount) +
           " files and directories, " + formatBytes(info.packedBytes) + ", unpacked " +
           formatBytes(info.unpackedBytes) + "\n";
}

// Whether the package would be a part of the bundle that it is made of.
bool liesInBundle(const std::string& package, const std::string& folder) {
    namespace fs = std::filesystem;
    std::error_code code;
    const fs::path top = fs::weakly_canonical(folder, code);
    fs::path place = fs::weakly_canonical(package, code).parent_path();
    bool isInBundle = false;
    for (; place != top && place != place.parent_path(); place = place.parent_path()) {
        isInBundle = isInBundle || place.extension() == ".app";
    }
    return place == top && (isInBundle || top.extension() == ".app");
}

}  // namespace

int runPackageMake(const std::string& folder, const std::string& package, bool asJson,
                   const Console& console) {
    if (liesInBundle(package, folder)) {
        return console.fail(failure(displayPath(package) + " lies in the bundle that is packed",
                                    "name a place outside of it"));
    }
    SystemPropertyLists codec;
    const bool hasReplaced = isHostFile(package);
    const Result<PackageInfo> info = writePackage(folder, package, codec);
    if (!info) return console.fail(info.error());
    console.out << (asJson ? jsonText(*info, hasReplaced) + "\n"
                           : printable(package) + replacementText(hasReplaced) + ": " +
                                 packageText(*info));
    return kExitDone;
}

int runPackageShow(const std::string& package, bool asJson, const Console& console) {
    SystemPropertyLists codec;
    const Result<PackageReader> reader = PackageReader::open(package, codec);
    if (!reader) return console.fail(reader.error());
    console.out << (asJson ? jsonText(reader->info()) + "\n" : packageText(reader->info()));
    return kExitDone;
}

}  // namespace appsync
