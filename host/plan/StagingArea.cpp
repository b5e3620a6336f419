#include "host/plan/StagingArea.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <memory>
#include <set>
#include <utility>
#include <vector>

#include "client/Paths.h"
#include "client/TodoList.h"
#include "device/Device.h"
#include "device/package/PackageReader.h"
#include "device/values/PackageIdentifier.h"
#include "host/plan/InterruptedStaging.h"
#include "host/plan/Library.h"
#include "host/plan/SyncPlan.h"
#include "platform/AppRegistry.h"
#include "platform/FileSystem.h"
#include "platform/PropertyListSerialization.h"
#include "system/file/RootDirectory.h"

namespace appsync {
namespace {

constexpr std::uint64_t kMaximumIconBytes = std::uint64_t{8} << 20;
constexpr std::string_view kUnfinishedStagingArea =
    "/var/mobile/Media/PublicStaging/ApplicationSync.new";
constexpr std::string_view kTodoListName = "ApplicationsSync.plist";
// Twice what a device is expected to hold: a session with more would go on for hours. Of entries
// that the device has not marked as done, whatever they ask for, there may be no more either.
constexpr std::size_t kMostInstalls = 20'000;

const FileAttributes kMobile{"mobile", "mobile"};

PropertyList todoEntry(std::string_view identifier, std::string_view operation) {
    return PropertyList::map({{kTodoIdentifierKey, identifier}, {kTodoOperationKey, operation}});
}

PropertyList installEntry(const PlannedInstall& planned) {
    // What has arrived is not asked for; the device notes in the same entry what becomes of it.
    PropertyList entry =
        todoEntry(planned.identifier, planned.isInstalledUnasked ? kTodoDownloaded : kTodoInstall);
    if (!planned.newVersion.empty()) entry.set(kTodoVersionKey, planned.newVersion);
    if (!planned.name.empty()) entry.set(kTodoNameKey, planned.name);
    return entry;
}

enum class StagedFor { ThisSession, Later };

// Writes the files of a staging area that nobody looks at yet. The first failure stays.
class StagingWriter {
  public:
    StagingWriter(Device& device, std::string directory)
        : device_(device), directory_(std::move(directory)) {}

    Status write(const SyncPlan& plan, const Library& library, StagedFor session,
                 const StepProgress& progress) {
        status_ = device_.files().createDirectory(directory_, true, &kMobile);
        if (session == StagedFor::ThisSession) addList(kHostRecordName, hostRecordOfLibrary());
        addList(kTodoListName, todoListOf(plan));
        if (library.iconOrder) add("DeskoraIconState.plist", *library.iconOrder);
        const std::size_t count = plan.install.size() + plan.update.size();
        std::size_t done = 0;
        for (const auto* installs : {&plan.install, &plan.update}) {
            for (const PlannedInstall& each : *installs) {
                if (progress) progress(done++, count);
                if (!each.isLeftOver) addApplication(library, each.identifier);
            }
        }
        if (progress) progress(done, count);
        return status_;
    }

  private:
    void addList(std::string_view name, const PropertyList& list) {
        const Result<Bytes> bytes =
            device_.propertyLists().serialize(list, PropertyListFormat::Binary);
        if (bytes) {
            add(std::string(name), *bytes);
        } else if (status_) {
            status_ = bytes.error();
        }
    }

    void addApplication(const Library& library, const std::string& identifier) {
        const LibraryPackage* known = library.find(identifier);
        if (known == nullptr || !status_) return;
        Result<PackageReader> package = PackageReader::open(known->file, device_.propertyLists());
        if (!package) return;  // the transfer will say so
        status_ = device_.files().createDirectory(directory_ + "/" + identifier, false, &kMobile);
        addIcon(identifier, *package);
        addPart(identifier + "/VessikMetadata.plist", package->readStoreMetadata());
        addPart(identifier + "/Info.plist", package->readInfoPropertyList());
    }

    void addIcon(const std::string& identifier, PackageReader& package) {
        const std::string& name = package.info().iconFile;
        const Result<Bytes> icon = package.readBundleFile(name, kMaximumIconBytes);
        addPart(identifier + "/" + name, icon);
        if (name != "VessikArtwork") addPart(identifier + "/VessikArtwork", icon);
    }

    // What a package lacks, it lacks here too.
    void addPart(const std::string& name, const Result<Bytes>& bytes) {
        if (bytes) add(name, *bytes);
    }

    void add(const std::string& name, ByteView contents) {
        if (!status_) return;
        status_ = device_.files().createFile(directory_ + "/" + name, contents, kMobile);
    }

    Device& device_;
    const std::string directory_;
    Status status_;
};

Status takeIntoPlace(FileSystem& files) {
    const std::string place(kStagingArea);
    // Not only what exists: a link that leads nowhere would be in the way, too.
    files.removeItem(place).ignore();
    return files.moveItem(std::string(kUnfinishedStagingArea), place);
}

// Where the area is built is nobody's business.
ErrorRecord calledByItsPlace(const ErrorRecord& error) {
    std::string text = error.description();
    const std::size_t found = text.find(kUnfinishedStagingArea);
    if (found != std::string::npos) {
        text.replace(found, kUnfinishedStagingArea.size(), kStagingArea);
    }
    return ErrorRecord::make(error.domain, error.code, std::move(text));
}

Status writeArea(Device& device, const SyncPlan& plan, const Library& library, StagedFor session,
                 const StepProgress& progress) {
    const std::string unfinished(kUnfinishedStagingArea);
    device.files().removeItem(unfinished).ignore();
    Status status = StagingWriter(device, unfinished).write(plan, library, session, progress);
    if (status) status = takeIntoPlace(device.files());
    if (status) return {};
    device.files().removeItem(unfinished).ignore();
    return calledByItsPlace(status.error());
}

struct CloseDirectory {
    void operator()(DIR* directory) const { ::closedir(directory); }
};

// The names in a directory of the device; none when there is no such directory.
std::vector<std::string> namesIn(const RootDirectory& root, std::string_view path) {
    std::vector<std::string> names;
    Result<UniqueFd> descriptor = root.openDirectory(std::string(path));
    if (!descriptor) return names;
    const std::unique_ptr<DIR, CloseDirectory> directory(::fdopendir(descriptor->get()));
    if (!directory) return names;
    [[maybe_unused]] const int owned = descriptor->release();  // the directory's now
    while (const dirent* entry = ::readdir(directory.get())) names.emplace_back(entry->d_name);
    return names;
}

void collectPaths(const PropertyList& restoreState, std::set<std::string>& paths) {
    for (const PropertyList::Entry& application : restoreState.entries()) {
        for (const PropertyList::Entry& version : application.value.entries()) {
            if (const std::string* path = version.value.findString("path")) paths.insert(*path);
        }
    }
}

std::set<std::string> packagesThatWait(Device& device) {
    std::set<std::string> paths;
    const Result<Bytes> bytes = device.files().readFile(std::string(kRestoreStatePath));
    if (!bytes) return paths;
    const Result<PropertyList> state = device.propertyLists().parse(*bytes);
    if (state) collectPaths(*state, paths);
    return paths;
}

bool isReceivedPackage(const std::string& name) {
    return name.ends_with(".zip") || identifierOfArchive(name);
}

bool isLink(const RootDirectory& root, const std::string& path) {
    const Result<ItemPlace> place = root.place(path);
    if (!place) return false;
    struct stat attributes {};
    const int found =
        ::fstatat(place->directory.get(), place->name.c_str(), &attributes, AT_SYMLINK_NOFOLLOW);
    return found == 0 && S_ISLNK(attributes.st_mode);
}

Result<PropertyList> loadTodoList(Device& device, const std::string& path) {
    const Result<Bytes> bytes = device.files().readFile(path);
    if (!bytes) return bytes.error();
    return device.propertyLists().parse(*bytes);
}

std::size_t installsIn(const PropertyList& todoList) {
    return static_cast<std::size_t>(std::ranges::count_if(
        todoList.elements(),
        [](const PropertyList& entry) { return hasOperation(entry, kTodoInstall); }));
}

bool isDone(const PropertyList& entry) {
    return std::ranges::any_of(std::array{kTodoSent, kTodoDownloaded, kTodoInstalled, kTodoFailed},
                               [&](std::string_view mark) { return hasOperation(entry, mark); });
}

// Why a session could not do all that the list asks for; empty when it can.
std::string excessOf(const PropertyList& todoList) {
    const std::string most = ", and " + std::to_string(kMostInstalls) + " are the most";
    const std::size_t installs = installsIn(todoList);
    if (installs > kMostInstalls) {
        return "it asks for " + std::to_string(installs) + " installs" + most;
    }
    const auto entries = todoList.elements();
    const auto done = std::ranges::count_if(entries, isDone);
    const std::size_t open = entries.size() - static_cast<std::size_t>(done);
    if (open <= kMostInstalls) return {};
    return "it has " + std::to_string(open) + " entries that are not done" + most;
}

}  // namespace

PropertyList todoListOf(const SyncPlan& plan) {
    PropertyList list = PropertyList::array(plan.remove.size() + plan.install.size());
    for (const std::string& identifier : plan.remove)
        list.append(todoEntry(identifier, kTodoRemove));
    for (const auto* installs : {&plan.install, &plan.update}) {
        for (const PlannedInstall& each : *installs) {
            if (!each.isLeftOver) list.append(installEntry(each));
        }
    }
    return list;
}

Status writeStagingArea(Device& device, const SyncPlan& plan, const Library& library,
                        const StepProgress& progress) {
    return writeArea(device, plan, library, StagedFor::ThisSession, progress);
}

Result<std::string> stageForLater(Device& device, const SyncPlan& plan, const Library& library,
                                  const StepProgress& progress) {
    // What has arrived by now the list asks for all the same: a later session cancels what nobody
    // asks for.
    SyncPlan asked = plan;
    for (auto* installs : {&asked.install, &asked.update}) {
        for (PlannedInstall& each : *installs) each.isInstalledUnasked = false;
    }
    const Status status = writeArea(device, asked, library, StagedFor::Later, progress);
    if (!status) return status.error();
    return std::string(kStagingArea);
}

StagedTodoList readStagedTodoList(Device& device) {
    StagedTodoList staged;
    const std::string place(kStagingArea);
    const bool isWaiting = device.files().itemExists(place);
    if (!isWaiting && isLink(device.root(), place)) {
        staged.error = place + " is a link that leads nowhere";
        return staged;
    }
    std::optional<PropertyList> left = interruptedTodoList(device);
    if (!isWaiting && !left) return staged;
    staged.isTakenUp = left.has_value();
    Result<PropertyList> list =
        left ? Result<PropertyList>(*std::move(left))
             : loadTodoList(device, place + "/" + std::string(kTodoListName));
    if (!list) {
        staged.error = list.error().description();
    } else if (!list->isArray()) {
        staged.error = "it is not a list";
    } else if (std::string excess = excessOf(*list); !excess.empty()) {
        staged.error = std::move(excess);
        staged.isTooLarge = true;
    } else {
        staged.list = *std::move(list);
    }
    return staged;
}

std::optional<std::string> stagedVersion(Device& device, const StagedTodoList& staged,
                                         const std::string& identifier) {
    const std::string area(staged.isTakenUp ? kTodoDirectory : kStagingArea);
    const Result<Bytes> bytes = device.files().readFile(area + "/" + identifier + "/Info.plist");
    if (!bytes) return std::nullopt;
    const Result<PropertyList> info = device.propertyLists().parse(*bytes);
    const std::string* version = info ? info->findString(BundleVersionKey) : nullptr;
    if (version == nullptr || version->empty()) return std::nullopt;
    return *version;
}

Status removeStaleTransfers(Device& device, const std::set<std::string>& arrived) {
    std::set<std::string> waiting = packagesThatWait(device);
    for (const std::string& identifier : arrived) {
        waiting.insert(std::string(kPublicStaging) + "/" + archiveNameOf(identifier));
    }
    device.files().removeItem(std::string(kUnfinishedStagingArea)).ignore();
    for (const std::string& name : namesIn(device.root(), kPublicStaging)) {
        const std::string path = std::string(kPublicStaging) + "/" + name;
        if (!isReceivedPackage(name) || waiting.contains(path)) continue;
        Status removed = device.files().removeItem(path);
        if (!removed) return removed;
    }
    return {};
}

}  // namespace appsync
