#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>

#include "client/PropertyListFile.h"
#include "platform/Bytes.h"
#include "platform/PropertyList.h"

namespace appsync {

struct Platform;

/// What is logged of a todo list, or of the last-sync app state, that is none.
inline constexpr ListFileMessages kTodoListMessages{"%s|couldn't parse todo list",
                                                    "%s|todo list is not an array"};

/// The todo list for those who edit it again and again: each time the file is read, but it is
/// parsed again only when its bytes are others than those that were written last. One thread at a
/// time.
class TodoListFile {
  public:
    /// Takes up the file as it is now. What is no list has no entries, and is logged as
    /// `_loadPlist` does.
    void read(const Platform& platform);
    /// The operation of the first entry with this identifier, and null when it has none; nothing
    /// when there is no such entry. Borrowed until the next call.
    [[nodiscard]] std::optional<const PropertyList*> operationOf(
        const std::string& identifier) const;
    /// Changes it, in the file too. There is such an entry. A file that cannot be written stays as
    /// it is.
    void setOperation(const Platform& platform, const std::string& identifier,
                      std::string_view operation);

  private:
    bool serialize(const Platform& platform);

    Bytes bytes_;         // of the file that the list was read from, or written to
    bool isOwn_ = false;  // the bytes were serialised here
    std::optional<PropertyList> list_;
    std::unordered_map<std::string, std::size_t> indexes_;  // of first entries
};

}  // namespace appsync
