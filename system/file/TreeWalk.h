#pragma once

#include <functional>
#include <string>
#include <string_view>

#include "platform/Result.h"

namespace appsync {

/// What a walk does. Each action gets an open directory and a name in it, and gives an errno value
/// or 0.
struct TreeActions {
    using Action = std::function<int(int directory, const std::string& name)>;

    /// For everything that is not a directory. EISDIR says that by now it is one: it is entered.
    Action item;
    /// For a directory, after everything in it. ENOTEMPTY says that something is left in it: it is
    /// visited again, a bounded number of times.
    Action afterDirectory;
};

/// Walks the directory `name` of the open directory `parent`, and everything below it, at whatever
/// depth: it needs no more than a few descriptors, and no stack that grows. No link is followed; a
/// directory that was moved away when `afterDirectory` does not find it, or when the walk has to
/// find the way back from far below, ends the walk with EAGAIN. What vanishes meanwhile is passed
/// over.
///
/// Ends with the first failure, told as `operation` on the place below `path`.
Status walkTree(int parent, const std::string& name, const TreeActions& actions,
                std::string_view operation, const std::string& path);

}  // namespace appsync
