#pragma once

#include <stdlib.h>

#include <filesystem>
#include <stdexcept>
#include <string>

namespace appsync {

/// A directory of this machine, below TMPDIR, that lives as long as the object: for implementations
/// that need one.
class TemporaryMachineDirectory {
  public:
    TemporaryMachineDirectory() {
        std::string pattern = std::filesystem::temp_directory_path() / "appsync-contract-XXXXXX";
        if (::mkdtemp(pattern.data()) == nullptr)
            throw std::runtime_error("no temporary directory");
        path_ = pattern;
    }
    ~TemporaryMachineDirectory() {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }
    TemporaryMachineDirectory(const TemporaryMachineDirectory&) = delete;
    TemporaryMachineDirectory& operator=(const TemporaryMachineDirectory&) = delete;

    [[nodiscard]] const std::string& path() const { return path_; }

  private:
    std::string path_;
};

}  // namespace appsync
