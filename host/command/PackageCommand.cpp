#include <ostream>

#include "device/package/PackageReader.h"
#include "device/package/PackageWriter.h"
#include "host/command/Commands.h"
#include "host/command/WrittenFile.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/file/HostFile.h"
#include "host/output/JsonRecords.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

std::string packageText(const PackageInfo& info) {
    return printable(info.identifier) + " " + printable(info.version) + " (" +
           printable(info.displayName) + "), " + std::to_string(info.entryCount) +
           " files and directories, " + formatBytes(info.packedBytes) + ", unpacked " +
           formatBytes(info.unpackedBytes) + "\n";
}

}  // namespace

int runPackageMake(const std::string& folder, const std::string& package, bool asJson,
                   const Console& console) {
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
