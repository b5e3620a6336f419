#pragma once

#include <string>

#include "platform/Bytes.h"
#include "system/file/UniqueFd.h"

namespace appsync {

/// A directory for what is unpacked, in memory where the machine has room there. It goes with the
/// object. Ends the process when there can be none.
class ScratchDirectory {
  public:
    ScratchDirectory();
    ~ScratchDirectory();
    ScratchDirectory(const ScratchDirectory&) = delete;
    ScratchDirectory& operator=(const ScratchDirectory&) = delete;

    [[nodiscard]] const std::string& path() const { return path_; }
    [[nodiscard]] UniqueFd open() const;

    /// What is wrong with what stands in it: links and the like, dangerous modes. Empty when
    /// nothing is. Adds up the sizes of the files.
    [[nodiscard]] std::string findDanger(std::uint64_t& bytes) const;

  private:
    std::string path_;
};

/// A file in memory that holds the bytes. Ends the process when there can be none.
[[nodiscard]] UniqueFd fileOf(ByteView bytes);

}  // namespace appsync
