#pragma once

#include <cstddef>
#include <string>

#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

struct Console;

/// A file of this machine that a command has written.
struct WrittenFile {
    std::string path;
    std::size_t bytes = 0;
    /// One stood there before.
    bool hasReplaced = false;
};

/// Writes it whole, or leaves what stands there as it is.
[[nodiscard]] Result<WrittenFile> writeOutput(const std::string& path, ByteView contents);

/// Says so in one line, or in JSON: file, bytes, replaced.
void tellWritten(const WrittenFile& file, bool asJson, const Console& console);

/// What follows the name of a file in the line that says that it was written.
[[nodiscard]] const char* replacementText(bool hasReplaced);

}  // namespace appsync
