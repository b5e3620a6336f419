#include <ostream>

#include "host/command/Commands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/file/HostFile.h"
#include "host/output/JsonRecords.h"
#include "host/output/PropertyListOutline.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

constexpr std::uint64_t kLargestPropertyList = std::uint64_t{1} << 30;

Result<PropertyList> readPropertyList(const std::string& file) {
    const Result<Bytes> bytes = readHostFile(file, kLargestPropertyList);
    if (!bytes) return bytes.error();
    Result<PropertyList> value = SystemPropertyLists().parse(*bytes);
    if (!value) return failure(value.error().withContext(file).description(), "correct it there");
    return value;
}

}  // namespace

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
