#pragma once

#include <cstdint>
#include <string>

#include "platform/Result.h"

namespace appsync {

/// What tells whether a file is still the same.
struct FileSum {
    std::uint64_t size = 0;
    std::string sha256;  // 64 hexadecimal digits

    friend bool operator==(const FileSum&, const FileSum&) = default;
};

/// Reads a file of this machine in pieces.
[[nodiscard]] Result<FileSum> sumOfFile(const std::string& path);

}  // namespace appsync
