#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "platform/PropertyList.h"

namespace appsync {

// Keys of an entry of the todo list. The list is an array in the host's order; what is not a map in
// it is an entry that says nothing.
inline constexpr std::string_view kTodoIdentifierKey = "identifier";
inline constexpr std::string_view kTodoOperationKey = "operation";
inline constexpr std::string_view kTodoVersionKey = "version";
inline constexpr std::string_view kTodoNameKey = "name";

// Operations that the host writes.
inline constexpr std::string_view kTodoInstall = "install";
inline constexpr std::string_view kTodoRemove = "remove";
// Operations that the device writes: what has become of the entry.
inline constexpr std::string_view kTodoSent = "SENT";
inline constexpr std::string_view kTodoDownloaded = "DOWNLOADED";
inline constexpr std::string_view kTodoInstalled = "INSTALLED";
inline constexpr std::string_view kTodoFailed = "FAILED";

/// Whether the entry's operation is exactly this one.
[[nodiscard]] bool hasOperation(const PropertyList& entry, std::string_view operation);

/// The identifiers that the list asks to remove and that are safe, in its order.
[[nodiscard]] std::vector<std::string> identifiersToRemove(const PropertyList& todoList);

/// Where the first entry with this identifier stands; nothing when there is none. Goes through the
/// list: for many look-ups in one list there is `TodoIndex`.
[[nodiscard]] std::optional<std::size_t> indexOfEntry(const PropertyList& todoList,
                                                      std::string_view identifier);

/// Finds first entries by identifier, at a cost that does not grow with the list. Borrows the list.
class TodoIndex {
  public:
    explicit TodoIndex(const PropertyList& todoList);

    /// The first entry with this identifier; null when there is none.
    [[nodiscard]] const PropertyList* find(std::string_view identifier) const;

  private:
    const PropertyList& todoList_;
    std::unordered_map<std::string_view, std::size_t> indexes_;
};

}  // namespace appsync
