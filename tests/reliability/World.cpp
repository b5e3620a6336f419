#include "tests/reliability/World.h"

#include <chrono>

#include "client/Paths.h"
#include "client/TodoList.h"

namespace appsync {
namespace {

/// What retries for ever passes it.
constexpr std::chrono::minutes kLongestRun{60};
/// Longer than a retry waits and an install takes.
constexpr std::chrono::minutes kSettling{4};

}  // namespace

World::World(Scheduling scheduling)
    : platform(codec, scheduling), faults(platform), isInterleaved(scheduling.interleaved) {
    platform.scheduler.setTimeLimit(kLongestRun);
    platform.files.addDirectory("/var/mobile/Library/Logs/MediaServices");
}

World::~World() { faults.stop(); }

void World::startClient() {
    platform.coordination.setEnabled(coordinated);
    if (!isInDaemon) platform.host.setMainBundleIdentifier("com.example.other");
    client = AppsClient::create(platform.services());
    // There is a daemon all the same, and something in it observes installs.
    if (!isInDaemon) platform.coordination.start();
    platform.notificationCenter.post(kStartUp);
    platform.runUntilIdle();
}

void World::reopen(const DeviceImage& image) {
    platform.reopen(image);
    coordinated = platform.coordination.isEnabled();
}

void World::settle() { platform.advance(kSettling); }

std::string World::packagePath(const std::string& identifier) {
    return std::string(kPublicStaging) + "/" + identifier + ".zip";
}

PropertyList World::entry(const std::string& identifier, const char* operation) {
    return PropertyList::map({{kTodoIdentifierKey, identifier},
                              {kTodoOperationKey, operation},
                              {kTodoVersionKey, "1.0"},
                              {kTodoNameKey, "Example"}});
}

void World::stage(const PropertyList& todoList) { stage(todoList, todoList); }

void World::stage(const PropertyList& todoList, const PropertyList& order) {
    const std::string area(kStagingArea);
    platform.files.remove(area);
    PropertyList layout = PropertyList::array();
    for (const PropertyList& each : order.elements()) {
        layout.append(*each.findString(kTodoIdentifierKey));
    }
    for (const PropertyList& each : todoList.elements()) {
        const std::string& identifier = *each.findString(kTodoIdentifierKey);
        const std::string directory = area + "/" + identifier;
        platform.addPropertyList(directory + "/Info.plist",
                                 PropertyList::map({{"BundleDisplayName", "Shown"}}));
        platform.addPropertyList(directory + "/VessikMetadata.plist",
                                 PropertyList::map({{"itemName", "Sold"}}));
        platform.files.addFile(directory + "/VessikArtwork", "artwork");
    }
    platform.addPropertyList(area + "/DeskoraIconState.plist", layout);
    platform.addPropertyList(area + "/ApplicationsSync.plist", todoList);
}

void World::stageRestore(const std::vector<std::string>& identifiers) {
    const Bytes metadata = restoreMetadata();
    PropertyList info = PropertyList::map();
    for (const std::string& identifier : identifiers) {
        info.set(identifier, PropertyList::map({{"VessikMetadata", metadata},
                                                {"ApplicationSINF", Bytes{9, 8, 7}},
                                                {"PlaceholderIcon", Bytes{1, 2, 3, 4}}}));
    }
    platform.addPropertyList(std::string(kRestoreInfoPath), info, PropertyListFormat::Binary);
}

Bytes World::restoreMetadata() {
    return *codec.serialize(PropertyList::map({{"title", "Shown"}, {"bundleVersion", "1.0"}}),
                            PropertyListFormat::Xml);
}

void World::stageDemoted(const std::vector<std::string>& automatically,
                         const std::vector<std::string>& intentionally) {
    platform.addPropertyList(
        std::string(kDemotedAppsPath),
        PropertyList::map({{"AutomaticDowngrades", PropertyList::strings(automatically)},
                           {"IntentionalDowngrades", PropertyList::strings(intentionally)}}));
}

void World::receive(const SyncAssetPointer& asset) {
    asset->path = asset->identifier + ".zip";
    platform.files.addFile(packagePath(asset->identifier), "package");
}

}  // namespace appsync
