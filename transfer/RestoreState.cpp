#include "transfer/RestoreState.h"

#include <mutex>
#include <utility>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/PropertyListFile.h"

namespace appsync {

namespace {

/// Moves the map at `key` out; a new one when there is none.
PropertyList takeMap(PropertyList& parent, std::string_view key) {
    PropertyList child = parent.take(key);
    return child.isMap() ? child : PropertyList::map();
}

}  // namespace

RestoreState::RestoreState(const Platform& platform)
    : RestoreState(platform, platform.files.readFile(std::string(kRestoreStatePath))) {}

RestoreState::RestoreState(const Platform& platform, const Result<Bytes>& file)
    : wasRead_(file.ok()) {
    if (!file) {
        root_ = PropertyList::map();
        return;
    }
    Result<PropertyList> root = platform.propertyLists.parse(*file);
    if (root && root->isMap()) root_ = *std::move(root);
}

const PropertyList* RestoreState::property(std::string_view key, std::string_view identifier,
                                           const std::string* version) const {
    if (!root_ || version == nullptr) return nullptr;
    const PropertyList* versions = root_->find(identifier);
    const PropertyList* properties = versions != nullptr ? versions->find(*version) : nullptr;
    return properties != nullptr ? properties->find(key) : nullptr;
}

void RestoreState::setProperty(const PropertyList& value, std::string_view key,
                               std::string_view identifier, std::string_view version) {
    if (!root_) return;
    PropertyList versions = takeMap(*root_, identifier);
    PropertyList properties = takeMap(versions, version);
    properties.set(key, value);
    versions.set(version, std::move(properties));
    root_->set(identifier, std::move(versions));
}

void RestoreState::erase(std::string_view identifier) {
    if (root_) root_->erase(identifier);
}

void RestoreState::write(const Platform& platform) const {
    if (!root_) return;
    writePropertyListFile(platform, std::string(kRestoreStatePath), *root_, PropertyListFormat::Xml)
        .ignore();
}

std::shared_ptr<const RestoreState> RestoreStateReader::read(const Platform& platform) {
    Result<Bytes> file = platform.files.readFile(std::string(kRestoreStatePath));
    if (!file) return std::make_shared<const RestoreState>(platform, file);
    if (auto known = parsedFrom(*file)) return known;
    auto state = std::make_shared<const RestoreState>(platform, file);
    const std::lock_guard guard(mutex_);
    bytes_ = *std::move(file);
    state_ = state;
    return state;
}

std::shared_ptr<const RestoreState> RestoreStateReader::parsedFrom(const Bytes& bytes) const {
    const std::lock_guard guard(mutex_);
    return state_ != nullptr && bytes_ == bytes ? state_ : nullptr;
}

std::optional<PropertyList> AppsClient::_restoreStatePropertyForKey(
    std::string_view key, const std::string& identifier, const std::string* version) const {
    const std::shared_ptr<const RestoreState> state = restoreStateReader_->read(platform_);
    const PropertyList* value = state->property(key, identifier, version);
    return value != nullptr ? std::optional(*value) : std::nullopt;
}

void AppsClient::_setRestoreStatePropertyValue(const PropertyList& value, std::string_view key,
                                               const std::string& identifier,
                                               const std::string* version) {
    if (version == nullptr) return;
    const std::lock_guard guard(*restoreStateLock_);
    RestoreState state(platform_);
    if (state.isDamaged()) return;
    state.setProperty(value, key, identifier, *version);
    state.write(platform_);
}

void AppsClient::cleanRestoreStateForIdentifier(const std::string& identifier) {
    const std::lock_guard guard(*restoreStateLock_);
    RestoreState state(platform_);
    if (!state.wasRead()) return;
    state.erase(identifier);
    if (state.isEmpty()) {
        platform_.files.removeItem(std::string(kRestoreStatePath)).ignore();
    } else {
        state.write(platform_);
    }
}

}  // namespace appsync
