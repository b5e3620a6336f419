#pragma once

// simulation: every service of platform/ in memory, on one thread, by a virtual clock: what the
// tests of the plug-in run on. `SimulatedPlatform` (this header) makes the services of the rooms
// below and wires them:
//
//     scheduling     fibers, turns, virtual time
//     recording      every call across platform/, and every message, as entries that tests look at
//     files          the file system, with links, owners and a journal of what is durable
//     services       the small services, registry and home screen among them
//     coordination   the install-coordination service
//
// FaultPlan.h lets any call fail in each way that its contract allows; DeviceImage.h says what a
// crash leaves, and lets the next process begin with it (docs/reliability.md). Includes platform/
// only, so that a port can use it for its own tests; what reads property lists is borrowed. Called
// by tests/, bench/ and fuzz/readers/.

#include <functional>
#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Platform.h"
#include "platform/PropertyList.h"
#include "platform/PropertyListSerialization.h"
#include "simulation/coordination/SimulatedCoordination.h"
#include "simulation/files/SimulatedFileSystem.h"
#include "simulation/recording/Recorder.h"
#include "simulation/scheduling/Scheduler.h"
#include "simulation/services/SimulatedAppRegistry.h"
#include "simulation/services/SimulatedDeviceServices.h"
#include "simulation/services/SimulatedHomeScreen.h"
#include "simulation/services/SimulatedIconRenderer.h"
#include "simulation/services/SimulatedLogFacility.h"
#include "simulation/services/SimulatedNotifications.h"
#include "simulation/services/SimulatedPropertyLists.h"
#include "simulation/services/SimulatedSyncHost.h"
#include "simulation/services/SimulatedTransferService.h"
#include "simulation/services/SimulatedWorkQueues.h"

namespace appsync {

struct DeviceImage;

/// A whole platform in memory, on one thread, by a virtual clock.
///
///     SystemPropertyLists codec;                      // whatever reads and writes property lists
///     SimulatedPlatform platform(codec);              // or (codec, Scheduling::seeded(7))
///     platform.registry.addApplication("com.example.a", "1.0");
///     platform.homeScreen.scriptTermination("com.example.a", {1, 0});     // denied, then granted
///     platform.files.failNext(FileOperation::MoveItem, kStagingArea, EACCES);
///     platform.onCall("AppRegistry.installPackage", [&](const RecordEntry&) { ... });
///     {
///         const auto client = AppsClient::create(platform.services());
///         client->assetTransferEndedWithSuccess(true);   // blocks: tasks run, time passes
///     }
///     EXPECT_TRUE(platform.hasMessage(LogLevel::Error, LogCategory::Coordination, "..."));
///     EXPECT_THAT(platform.callsTo({"AppRegistry"}), ElementsAre("AppRegistry.addObserver()",
///     ...));
///
/// The test is the host. It runs until it blocks; then tasks run (operations, delayed work,
/// observer callbacks), one after another, each until it blocks. With a seed, any call across
/// platform/ may be where another goes on; the same seed gives the same recording. `runUntilIdle`
/// and `advance` let tasks run while the host has nothing to block on.
///
/// A wait that nothing can end throws a SimulationFailure that names who waits for what. So does
/// the breaking of a rule of platform/, at the offender if that is the host, otherwise at the
/// host's next wait (at the latest the destructor ends the process with it).
///
/// The client and everything that it made must be destroyed first.
class SimulatedPlatform {
  public:
    /// The codec is borrowed.
    explicit SimulatedPlatform(PropertyListSerialization& codec,
                               Scheduling scheduling = Scheduling::runToCompletion());
    ~SimulatedPlatform();

    SimulatedPlatform(const SimulatedPlatform&) = delete;
    SimulatedPlatform& operator=(const SimulatedPlatform&) = delete;

    /// What a client is created with.
    [[nodiscard]] Platform services();

    // Time and turns; see Scheduler.
    [[nodiscard]] SimulatedTime now() const { return scheduler.now(); }
    void runUntilIdle() { scheduler.runUntilIdle(); }
    void advance(SimulatedTime duration) { scheduler.advance(duration); }

    // The recording. Calls read "AppRegistry.isApplicationInstalled(com.example.a) -> yes".
    [[nodiscard]] const std::vector<RecordEntry>& recording() const { return recorder.entries(); }
    /// Calls and messages as lines, in order.
    [[nodiscard]] std::vector<std::string> lines() const;
    /// Every call, in order.
    [[nodiscard]] std::vector<std::string> calls() const;
    /// The calls to some services ("AppRegistry"; "WaitGroup#1", or "WaitGroup" for all of them),
    /// or to single methods of them ("FileSystem.moveItem"), in order.
    [[nodiscard]] std::vector<std::string> callsTo(
        std::initializer_list<std::string_view> names) const;
    /// The texts of the messages, without the bundle identifier that they begin with.
    [[nodiscard]] std::vector<std::string> messages() const;
    /// The messages as "8 default text".
    [[nodiscard]] std::vector<std::string> messageLines() const;
    [[nodiscard]] bool hasMessage(LogLevel level, LogCategory category,
                                  std::string_view text) const;
    /// How many messages have this text, whatever their level and category.
    [[nodiscard]] std::size_t countMessages(std::string_view text) const;
    void clearRecording() { recorder.clear(); }

    /// From now on `hook` runs at each call of "Service.method", before it has any effect.
    void onCall(std::string call, Recorder::Hook hook);

    /// Takes over what a crash has left, and puts it in order as the opening of a device does. The
    /// platform is as it was made. Applications that ran run no more.
    void reopen(const DeviceImage& image);

    // Property lists as files.
    void addPropertyList(const std::string& path, const PropertyList& value,
                         PropertyListFormat format = PropertyListFormat::Xml);
    /// Nothing when there is no file, or it is not a property list.
    [[nodiscard]] std::optional<PropertyList> propertyListAt(const std::string& path);

    Scheduler scheduler;
    Recorder recorder;
    SimulatedTransferService transfers;  // the host's
    SimulatedSyncHost host;
    SimulatedLogFacility log;
    SimulatedWorkQueues queues;
    SimulatedFileSystem files;
    SimulatedPropertyLists propertyLists;
    SimulatedAppRegistry registry;
    SimulatedInstaller installer;
    SimulatedCoordination coordination;
    SimulatedDevicePolicy policy;
    SimulatedBackupService backup;
    SimulatedHomeScreen homeScreen;
    SimulatedIconRenderer icons;
    SimulatedTransactionLog transactions;
    SimulatedNamedNotifications notifications;
    SimulatedNotificationCenter notificationCenter;
};

}  // namespace appsync
