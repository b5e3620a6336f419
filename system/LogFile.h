#pragma once

#include <sys/stat.h>
#include <sys/types.h>

#include <chrono>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "system/file/UniqueFd.h"

namespace appsync {

/// How large a log may grow.
struct LogLimits {
    /// Bytes of one part.
    off_t part = off_t{16} << 20U;
    /// Where less than that is free on the disk, a part ends at the next multiple of `shortPart`.
    off_t scarceSpace = off_t{4} << 20U;
    off_t shortPart = off_t{256} << 10U;
    /// How long it may take to find out that others have put the file aside, added to it, or
    /// removed it.
    std::chrono::milliseconds unawareness{20};
};

/// Where the older part of the log at that path stands.
[[nodiscard]] inline std::string olderPartOf(const std::string& path) { return path + ".1"; }

/// A log in at most two files: the one that lines are appended to and, beside it, the older part.
/// A line that would make the file too long turns it into the older part, in place of the one
/// before, whose space comes free; so that takes none.
///
/// Several processes may append to the same log: each line is one write, one of them at a time puts
/// the file aside, and the others find that out soon (their lines are in the older part until
/// then). Not safe for use by several threads at once.
class LogFile {
  public:
    /// Of the log at that path, in a directory that is made if it is lost. There is none where
    /// something else than a directory or a regular file stands in their place, a link for
    /// instance: nothing is written elsewhere, and a pipe is not waited on. Where the file cannot
    /// be opened for another reason, each line tries again.
    [[nodiscard]] static std::optional<LogFile> open(const std::string& path,
                                                     const LogLimits& limits = {});

    /// Adds a line, whose end it writes. Gives the errno value of the failure, or 0.
    [[nodiscard]] int append(std::string_view line);

  private:
    LogFile(std::string directory, std::string name, const LogLimits& limits)
        : directoryPath_(std::move(directory)), name_(std::move(name)), limits_(limits) {}

    int openDirectory();
    int openFile();
    int openFileInDirectory();
    int makeRoom(off_t size);
    int putAside();
    int look();
    [[nodiscard]] std::optional<off_t> sizeIfCurrent() const;
    [[nodiscard]] bool isFull(off_t size, off_t added) const;
    [[nodiscard]] bool isSpaceScarce() const;

    std::string directoryPath_;
    std::string name_;
    LogLimits limits_;
    UniqueFd directory_;
    UniqueFd file_;
    struct stat opened_ {};  // what file_ is
    off_t size_ = 0;         // as last looked at, and with what was added since
    std::chrono::steady_clock::time_point nextLook_{};
    bool lineIsCutOff_ = false;  // the last line has no end
};

}  // namespace appsync
