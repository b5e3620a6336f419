#include "client/TodoListFile.h"

#include <utility>

#include "client/Paths.h"
#include "client/TodoList.h"
#include "platform/FileSystem.h"
#include "platform/Platform.h"

namespace appsync {

void TodoListFile::read(const Platform& platform) {
    Result<Bytes> bytes = platform.files.readFile(std::string(kTodoListPath));
    if (bytes && list_ && *bytes == bytes_) return;
    list_.reset();
    indexes_.clear();
    if (!bytes || bytes->empty()) return;
    list_ = parseListFile(platform, *bytes, &PropertyList::isArray, kTodoListMessages, nullptr);
    if (!list_) return;
    bytes_ = *std::move(bytes);
    isOwn_ = false;
    std::size_t index = 0;
    for (const PropertyList& entry : list_->elements()) {
        const std::string* identifier = entry.findString(kTodoIdentifierKey);
        if (identifier != nullptr) indexes_.try_emplace(*identifier, index);
        ++index;
    }
}

std::optional<const PropertyList*> TodoListFile::operationOf(const std::string& identifier) const {
    const auto found = indexes_.find(identifier);
    if (found == indexes_.end()) return std::nullopt;
    return list_->at(found->second)->find(kTodoOperationKey);
}

void TodoListFile::setOperation(const Platform& platform, const std::string& identifier,
                                std::string_view operation) {
    const std::size_t index = indexes_.at(identifier);
    PropertyList entry = list_->take(index);
    entry.set(kTodoOperationKey, operation);
    list_->set(index, std::move(entry));
    const bool replaced =
        isOwn_ && platform.propertyLists.replaceText(bytes_, index, kTodoOperationKey, operation);
    if ((replaced || serialize(platform)) &&
        platform.files.writeFileAtomically(std::string(kTodoListPath), bytes_)) {
        return;
    }
    list_.reset();
}

bool TodoListFile::serialize(const Platform& platform) {
    Result<Bytes> bytes = platform.propertyLists.serialize(*list_, PropertyListFormat::Binary);
    if (!bytes) return false;
    bytes_ = *std::move(bytes);
    isOwn_ = true;
    return true;
}

}  // namespace appsync
