#include "host/command/argument/WrittenFile.h"

#include <ostream>

#include <nlohmann/json.hpp>

#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/Text.h"
#include "host/file/HostFile.h"

namespace appsync {

Result<WrittenFile> writeOutput(const std::string& path, ByteView contents) {
    const bool hasReplaced = isHostFile(path);
    const Status written = writeHostFile(path, contents);
    if (!written) return written.error();
    return WrittenFile{path, contents.size(), hasReplaced};
}

void tellWritten(const WrittenFile& file, bool asJson, const Console& console) {
    if (asJson) {
        console.out << indented({{"file", file.path},
                                 {"bytes", file.bytes},
                                 {"replaced", file.hasReplaced}})
                    << '\n';
    } else {
        console.out << printable(file.path) << replacementText(file.hasReplaced) << ": "
                    << formatBytes(file.bytes) << '\n';
    }
}

const char* replacementText(bool hasReplaced) {
    return hasReplaced ? " is replaced" : " is written";
}

}  // namespace appsync
