#include "host/plan/InterruptedStaging.h"

#include <map>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "client/Paths.h"
#include "client/TodoList.h"
#include "device/Device.h"
#include "host/plan/SyncPlan.h"
#include "platform/FileSystem.h"
#include "platform/PropertyListSerialization.h"

namespace appsync {
namespace {

// Of the record of a session on an area that a host has staged.
constexpr std::string_view kEntries = "entries";    // its todo list when it began
constexpr std::string_view kVersions = "versions";  // what was installed then

std::string recordIn(std::string_view directory) {
    return std::string(directory) + "/" + std::string(kHostRecordName);
}

std::optional<PropertyList> load(Device& device, const std::string& path) {
    const Result<Bytes> bytes = device.files().readFile(path);
    if (!bytes) return std::nullopt;
    Result<PropertyList> value = device.propertyLists().parse(*bytes);
    if (!value) return std::nullopt;
    return *std::move(value);
}

Status save(Device& device, const std::string& path, const PropertyList& value) {
    const Result<Bytes> bytes = device.propertyLists().serialize(value, PropertyListFormat::Binary);
    if (!bytes) return bytes.error();
    return device.files().writeFileAtomically(path, *bytes);
}

std::string entryIdentifier(const PropertyList& entry) {
    const std::string* text = entry.findString(kTodoIdentifierKey);
    return text != nullptr ? *text : std::string();
}

// The plug-in changes the operations of a list and nothing else.
bool areOfOneList(const PropertyList& staged, const PropertyList& now) {
    if (!staged.isArray() || !now.isArray() || staged.size() != now.size()) return false;
    for (std::size_t index = 0; index < now.size(); ++index) {
        const PropertyList* before = staged.elements()[index].find(kTodoIdentifierKey);
        const PropertyList* after = now.elements()[index].find(kTodoIdentifierKey);
        if ((before == nullptr) != (after == nullptr)) return false;
        if (before != nullptr && *before != *after) return false;
    }
    return true;
}

// What the session has installed, as the plug-in has noted or, where it had no time to, as the
// device shows: what has come whole and stands there in another version than before.
class Installed {
  public:
    Installed(const PropertyList& record, const PropertyList& now,
              const std::vector<ApplicationRecord>& present)
        : before_(record.find(kVersions)) {
        for (const ApplicationRecord& each : present) {
            if (!each.isPlaceholder) present_[each.identifier] = each.version.value_or("");
        }
        // Of several entries of one application it is always the first that is changed.
        const auto staged = record.find(kEntries)->elements();
        for (std::size_t index = 0; index < now.size(); ++index) {
            const PropertyList& entry = now.elements()[index];
            const std::string identifier = entryIdentifier(entry);
            const bool isNoted =
                hasOperation(entry, kTodoInstalled) && !hasOperation(staged[index], kTodoInstalled);
            const bool isSeen = hasOperation(entry, kTodoDownloaded) && hasChanged(identifier);
            if (isNoted || isSeen) installed_.insert(identifier);
        }
    }

    [[nodiscard]] bool contains(const std::string& identifier) const {
        return installed_.contains(identifier);
    }

  private:
    [[nodiscard]] bool hasChanged(const std::string& identifier) const {
        const auto found = present_.find(identifier);
        if (found == present_.end()) return false;
        const std::string* before = before_ ? before_->findString(identifier) : nullptr;
        return before == nullptr || *before != found->second;
    }

    const PropertyList* before_;
    std::map<std::string, std::string> present_;  // versions
    std::set<std::string> installed_;
};

PropertyList openAgain(const PropertyList& record, const PropertyList& now,
                       const std::vector<ApplicationRecord>& present) {
    const Installed installed(record, now, present);
    const auto staged = record.find(kEntries)->elements();
    PropertyList list = PropertyList::array(now.size());
    for (std::size_t index = 0; index < now.size(); ++index) {
        PropertyList entry = now.elements()[index];
        if (hasOperation(staged[index], kTodoInstall)) {
            const bool isDone = installed.contains(entryIdentifier(entry));
            entry.set(kTodoOperationKey, isDone ? kTodoInstalled : kTodoInstall);
        }
        list.append(std::move(entry));
    }
    return list;
}

std::set<std::string> installedUnasked(const SyncPlan& plan) {
    std::set<std::string> identifiers;
    for (const auto* installs : {&plan.install, &plan.update}) {
        for (const PlannedInstall& each : *installs) {
            if (each.isInstalledUnasked) identifiers.insert(each.identifier);
        }
    }
    return identifiers;
}

PropertyList withoutUnasked(const PropertyList& todoList, const SyncPlan& plan) {
    const std::set<std::string> unasked = installedUnasked(plan);
    PropertyList list = PropertyList::array(todoList.size());
    for (PropertyList entry : todoList.elements()) {
        if (hasOperation(entry, kTodoInstall) && unasked.contains(entryIdentifier(entry))) {
            entry.set(kTodoOperationKey, kTodoDownloaded);
        }
        list.append(std::move(entry));
    }
    return list;
}

}  // namespace

PropertyList hostRecordOfLibrary() { return PropertyList("library"); }

std::optional<PropertyList> interruptedTodoList(Device& device) {
    if (device.files().itemExists(std::string(kStagingArea))) return std::nullopt;
    const std::optional<PropertyList> record = load(device, recordIn(kTodoDirectory));
    if (!record || record->find(kEntries) == nullptr) return std::nullopt;
    const std::optional<PropertyList> now = load(device, std::string(kTodoListPath));
    if (!now || !areOfOneList(*record->find(kEntries), *now)) return std::nullopt;
    const Result<std::vector<ApplicationRecord>> present = device.applications();
    if (!present) return std::nullopt;
    return openAgain(*record, *now, *present);
}

// An interruption between the steps finds the same list to take up.
Status stageAgain(Device& device, const PropertyList& todoList, const SyncPlan& plan) {
    const PropertyList list = withoutUnasked(todoList, plan);
    const Status saved = save(device, std::string(kTodoListPath), list);
    if (!saved) return saved;
    const std::string place(kStagingArea);
    device.files().removeItem(place).ignore();  // a link that leads nowhere is in the way, too
    return device.files().moveItem(std::string(kTodoDirectory), place);
}

Status beginStagedSession(Device& device, PropertyList todoList) {
    const Result<std::vector<ApplicationRecord>> present = device.applications();
    if (!present) return present.error();
    PropertyList versions = PropertyList::map();
    for (const ApplicationRecord& each : *present) {
        if (!each.isPlaceholder) versions.set(each.identifier, each.version.value_or(""));
    }
    PropertyList record = PropertyList::map();
    record.set(kEntries, std::move(todoList));
    record.set(kVersions, std::move(versions));
    return save(device, recordIn(kStagingArea), record);
}

void endStagedSession(Device& device) {
    device.files().removeItem(recordIn(kTodoDirectory)).ignore();
}

StagedWork stagedWorkOn(Device& device) {
    const std::string place(kStagingArea);
    if (!device.files().itemExists(place)) {
        return interruptedTodoList(device) ? StagedWork::Interrupted : StagedWork::None;
    }
    const std::optional<PropertyList> record = load(device, recordIn(kStagingArea));
    const bool isOwn = record && *record == hostRecordOfLibrary();
    return isOwn ? StagedWork::None : StagedWork::Waiting;
}

}  // namespace appsync
