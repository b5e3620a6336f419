#include <ostream>
#include <string_view>

#include "host/command/argument/WrittenFile.h"
#include "host/command/file/FileCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/PropertyListReading.h"
#include "host/file/HostFile.h"
#include "host/output/JsonRecords.h"
#include "host/output/PropertyListOutline.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

constexpr std::uint64_t kLargestPropertyList = std::uint64_t{1} << 30;
constexpr std::string_view kStandardStream = "-";

std::string sourceName(const std::string& file) {
    return file == kStandardStream ? "standard input" : file;
}

// An error says what to do.
Result<PropertyList> parsePropertyList(const Bytes& bytes) {
    const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    if (looksLikeJson(text)) return propertyListOfJson(text);
    Result<PropertyList> value = SystemPropertyLists().parse(bytes);
    if (value) return value;
    return failure(value.error().description(), "correct it there");
}

Result<PropertyList> readPropertyList(const std::string& file) {
    const bool isStandard = file == kStandardStream;
    const Result<Bytes> bytes = isStandard ? readStandardInput(kLargestPropertyList)
                                           : readHostFile(file, kLargestPropertyList);
    if (!bytes) return bytes.error();
    Result<PropertyList> value = parsePropertyList(*bytes);
    if (value) return value;
    return value.error().withContext(sourceName(file));
}

}  // namespace

int runPropertyListShow(const std::string& file, bool asJson, const Console& console) {
    const Result<PropertyList> value = readPropertyList(file);
    if (!value) return console.fail(value.error());
    console.out << (asJson ? jsonText(*value) + "\n" : propertyListOutline(*value));
    return kExitDone;
}

int runPropertyListConvert(const ConvertArguments& arguments, const Console& console) {
    const bool isPrinted =
        arguments.output.value_or(std::string(kStandardStream)) == kStandardStream;
    if (isPrinted && arguments.asJson) {
        return console.fail(wrongUsage("--json tells of the file that is written",
                                       "name one with --out; plist show --json shows a list"));
    }
    const Result<PropertyList> value = readPropertyList(arguments.file);
    if (!value) return console.fail(value.error());
    const Result<Bytes> bytes = SystemPropertyLists().serialize(*value, arguments.format);
    if (!bytes) return console.fail(bytes.error().withContext(sourceName(arguments.file)));
    if (isPrinted) {
        console.out.write(reinterpret_cast<const char*>(bytes->data()),
                          static_cast<std::streamsize>(bytes->size()));
        return kExitDone;
    }
    const Result<WrittenFile> written = writeOutput(*arguments.output, *bytes);
    if (!written) return console.fail(written.error());
    tellWritten(*written, arguments.asJson, console);
    return kExitDone;
}

}  // namespace appsync
