#include <ostream>
#include <string_view>

#include "device/package/PackageReader.h"
#include "device/package/PackageWriter.h"
#include "host/command/Commands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/file/HostFile.h"
#include "host/output/JsonRecords.h"
#include "host/output/PropertyListOutline.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

constexpr std::uint64_t kLargestPropertyList = std::uint64_t{1} << 30;

std::string packageText(const PackageInfo& info) {
    return printable(info.identifier) + " " + printable(info.version) + " (" +
           printable(info.displayName) + "), " + std::to_string(info.entryCount) +
           " files and directories, " + formatBytes(info.packedBytes) + ", unpacked " +
           formatBytes(info.unpackedBytes) + "\n";
}

Result<PropertyList> readPropertyList(const std::string& file) {
    const Result<Bytes> bytes = readHostFile(file, kLargestPropertyList);
    if (!bytes) return bytes.error();
    Result<PropertyList> value = SystemPropertyLists().parse(*bytes);
    if (!value) return failure(value.error().withContext(file).description(), "correct it there");
    return value;
}

}  // namespace

int runPackageMake(const std::string& folder, const std::string& package, bool asJson,
                   const Console& console) {
    SystemPropertyLists codec;
    const Result<PackageInfo> info = writePackage(folder, package, codec);
    if (!info) return console.fail(info.error());
    console.out << (asJson ? jsonText(*info) + "\n"
                           : printable(package) + ": " + packageText(*info));
    return kExitDone;
}

int runPackageShow(const std::string& package, bool asJson, const Console& console) {
    SystemPropertyLists codec;
    const Result<PackageReader> reader = PackageReader::open(package, codec);
    if (!reader) return console.fail(reader.error());
    console.out << (asJson ? jsonText(reader->info()) + "\n" : packageText(reader->info()));
    return kExitDone;
}

int runPropertyListShow(const std::string& file, bool asJson, const Console& console) {
    const Result<PropertyList> value = readPropertyList(file);
    if (!value) return console.fail(value.error());
    console.out << (asJson ? jsonText(*value) + "\n" : propertyListOutline(*value));
    return kExitDone;
}

int runPropertyListConvert(const std::string& file, PropertyListFormat format,
                           const std::optional<std::string>& output, const Console& console) {
    const Result<PropertyList> value = readPropertyList(file);
    if (!value) return console.fail(value.error());
    const Result<Bytes> bytes = SystemPropertyLists().serialize(*value, format);
    if (!bytes) return console.fail(bytes.error().withContext(file));
    if (output) {
        const Status written = writeHostFile(*output, *bytes);
        return written ? kExitDone : console.fail(written.error());
    }
    const std::string text(bytes->begin(), bytes->end());
    console.out.write(text.data(), static_cast<std::streamsize>(text.size()));
    return kExitDone;
}

}  // namespace appsync
