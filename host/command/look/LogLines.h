#pragma once

#include <cstdint>
#include <deque>
#include <string>
#include <string_view>

#include "host/command/look/LookCommands.h"

namespace appsync {

struct Console;

/// Puts the lines of a log together from the pieces that are read, and shows those that are wanted.
/// Arguments and console outlive it.
class LogLines {
  public:
    LogLines(const LogArguments& arguments, const Console& console)
        : arguments_(arguments), console_(console), isGathering_(arguments.last.has_value()) {}

    /// What is added from now on is of that file, from its beginning.
    void beginFile(std::string path);
    void add(std::string_view piece);
    /// Where only the last lines are wanted: shows them. What comes later is shown as it comes.
    void showLast();

  private:
    void addToLine(std::string_view piece);
    void endLine();
    void take(std::string line);

    const LogArguments& arguments_;
    const Console& console_;
    bool isGathering_;
    std::deque<std::string> last_;
    std::string path_;
    std::string begun_;  // the line that is still being written
    bool isTooLong_ = false;
    std::uint64_t number_ = 0;
};

}  // namespace appsync
