#include "client/TodoList.h"

#include "client/SafeIdentifier.h"

namespace appsync {

bool hasOperation(const PropertyList& entry, std::string_view operation) {
    const std::string* own = entry.findString(kTodoOperationKey);
    return own != nullptr && *own == operation;
}

std::optional<std::size_t> indexOfEntry(const PropertyList& todoList, std::string_view identifier) {
    const auto entries = todoList.elements();
    for (std::size_t index = 0; index < entries.size(); ++index) {
        const std::string* own = entries[index].findString(kTodoIdentifierKey);
        if (own != nullptr && *own == identifier) return index;
    }
    return std::nullopt;
}

std::vector<std::string> identifiersToRemove(const PropertyList& todoList) {
    constexpr std::size_t initialCapacity = 8;
    std::vector<std::string> identifiers;
    identifiers.reserve(initialCapacity);
    for (const PropertyList& entry : todoList.elements()) {
        const PropertyList* identifier = entry.find(kTodoIdentifierKey);
        if (isSafe(identifier) && hasOperation(entry, kTodoRemove)) {
            identifiers.push_back(*identifier->asString());
        }
    }
    return identifiers;
}

TodoIndex::TodoIndex(const PropertyList& todoList) {
    entries_.reserve(todoList.size());
    for (const PropertyList& entry : todoList.elements()) {
        const std::string* identifier = entry.findString(kTodoIdentifierKey);
        if (identifier != nullptr) entries_.try_emplace(*identifier, &entry);
    }
}

const PropertyList* TodoIndex::find(std::string_view identifier) const {
    const auto found = entries_.find(identifier);
    return found == entries_.end() ? nullptr : found->second;
}

}  // namespace appsync
