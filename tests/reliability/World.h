#pragma once

#include <memory>
#include <string>
#include <vector>

#include "client/AppsClient.h"
#include "simulation/DeviceImage.h"
#include "simulation/FaultPlan.h"
#include "simulation/SimulatedPlatform.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {

inline constexpr const char* kStartUp = "com.korvu.trd.TRStartupCompleteNotification";

/// A device in memory, a client on it, and what the host does with that client.
struct World {
    explicit World(Scheduling scheduling = Scheduling::runToCompletion());
    ~World();

    World(const World&) = delete;
    World& operator=(const World&) = delete;

    /// Starts the daemon that holds the client.
    void startClient();
    /// Takes over what a crash has left of another world. Before there is a client.
    void reopen(const DeviceImage& image);
    /// Lets everything that is under way come to its end.
    void settle();

    static std::string packagePath(const std::string& identifier);
    static PropertyList entry(const std::string& identifier, const char* operation);
    /// What the host leaves in the staging area, with the side files of each application.
    void stage(const PropertyList& todoList);
    /// The same, with the icon layout of another list.
    void stage(const PropertyList& todoList, const PropertyList& order);
    /// What a backup has brought along.
    void stageRestore(const std::vector<std::string>& identifiers);
    /// The store metadata of each of them.
    [[nodiscard]] Bytes restoreMetadata();
    /// Which of them had been offloaded: by the system, by their user.
    void stageDemoted(const std::vector<std::string>& automatically,
                      const std::vector<std::string>& intentionally);
    /// The package has come to the device whole.
    void receive(const SyncAssetPointer& asset);

    SystemPropertyLists codec;
    SimulatedPlatform platform;
    FaultPlan faults;
    const bool isInterleaved;
    bool coordinated = false;
    /// Whether it is the daemon that holds the client.
    bool isInDaemon = true;
    /// Whether the host looks at the device before it stages a list, as the desktop host does;
    /// otherwise it stages what the scenario wants as it is.
    bool hostPlans = false;
    std::shared_ptr<AppsClient> client;
};

}  // namespace appsync
