#include "client/TodoList.h"

#include <algorithm>
#include <mutex>
#include <utility>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/SafeIdentifier.h"
#include "client/TodoListFile.h"

namespace appsync {

namespace {

/// What an entry is found by; null when it has none.
const std::string* identifierOf(const PropertyList& entry) {
    return entry.findString(kTodoIdentifierKey);
}

}  // namespace

bool hasOperation(const PropertyList& entry, std::string_view operation) {
    const std::string* own = entry.findString(kTodoOperationKey);
    return own != nullptr && *own == operation;
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

std::optional<std::size_t> indexOfEntry(const PropertyList& todoList, std::string_view identifier) {
    const auto entries = todoList.elements();
    const auto found = std::find_if(entries.begin(), entries.end(), [&](const PropertyList& entry) {
        const std::string* own = identifierOf(entry);
        return own != nullptr && *own == identifier;
    });
    if (found == entries.end()) return std::nullopt;
    return static_cast<std::size_t>(found - entries.begin());
}

TodoIndex::TodoIndex(const PropertyList& todoList) : todoList_(todoList) {
    const auto entries = todoList.elements();
    indexes_.reserve(entries.size());
    for (std::size_t index = 0; index < entries.size(); ++index) {
        const std::string* identifier = identifierOf(entries[index]);
        if (identifier != nullptr) indexes_.try_emplace(*identifier, index);
    }
}

const PropertyList* TodoIndex::find(std::string_view identifier) const {
    const auto found = indexes_.find(identifier);
    return found == indexes_.end() ? nullptr : todoList_.at(found->second);
}

std::optional<std::string> AppsClient::_operationStateForIdentifier(
    const std::string& identifier) const {
    const std::optional<PropertyList> todoList = _loadPlist(platform_, kTodoListPath, nullptr);
    if (!todoList) return std::nullopt;
    const std::optional<std::size_t> index = indexOfEntry(*todoList, identifier);
    const std::string* operation =
        index ? todoList->at(*index)->findString(kTodoOperationKey) : nullptr;
    return operation != nullptr ? std::optional(*operation) : std::nullopt;
}

void AppsClient::changeAssetID(const std::string& identifier, std::string_view toDo) {
    const std::lock_guard guard(*todoListLock_);
    todoListFile_->read(platform_);
    const std::optional<const PropertyList*> operation = todoListFile_->operationOf(identifier);
    if (!operation) return;
    log_(Level::Default, "%s|Changing %{public}@ from %{public}@ to %{public}@", identifier,
         *operation, toDo);
    todoListFile_->setOperation(platform_, identifier, toDo);
}

}  // namespace appsync
