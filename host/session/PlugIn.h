#pragma once

#include <memory>

#include "host/console/Console.h"
#include "host/watch/SyncDaemon.h"
#include "platform/Platform.h"
#include "platform/PlugInTable.h"
#include "platform/Result.h"

namespace appsync {

class AppRegistry;
class Device;
class JsonLogFacility;
class RecordedClient;
class Recording;
class RecordingPlatform;
class RecordingSink;
class SessionFacts;
class SessionWatch;
class SyncClient;
class SyncEvents;

/// Whether and how a session is recorded.
struct RecordingOrder {
    /// Null: it is not. It must outlive the plug-in.
    RecordingSink* sink = nullptr;
    bool isAnonymous = false;
};

/// The plug-in, loaded on a device: what the sync daemon does at its start. Its log is the
/// device's; what cannot be written to it is told on the console, at the end. The device and the
/// console's streams must outlive it, and so must the module that a table is of; without one it is
/// the plug-in that is built in.
class PlugIn {
  public:
    [[nodiscard]] static Result<std::unique_ptr<PlugIn>> load(Device& device,
                                                              const Console& console);
    /// For a session: with a watch between plug-in and device, and told that the daemon has started
    /// up, upon which it attaches to the coordination service. Coordinated installs are held: the
    /// session lets them go. Events and facts must outlive it.
    [[nodiscard]] static Result<std::unique_ptr<PlugIn>> load(
        Device& device, SyncEvents& events, SessionFacts& facts, const Console& console,
        const PlugInTable& table = *appsyncPlugInTable(), const RecordingOrder& order = {});
    /// In the process that restores backups, which is not the sync daemon.
    [[nodiscard]] static Result<std::unique_ptr<PlugIn>> loadForRestore(
        Device& device, const Console& console, const PlugInTable& table = *appsyncPlugInTable(),
        const RecordingOrder& order = {});
    ~PlugIn();

    [[nodiscard]] SyncClient& client();
    /// The device's own services, as the plug-in has them.
    [[nodiscard]] const Platform& platform() const { return *platform_; }
    /// Only of one that was loaded with a watch.
    [[nodiscard]] SessionWatch& watch() { return *watch_; }
    [[nodiscard]] const SyncHost& host() const { return daemon_; }
    /// What the device may stop or bring forward.
    [[nodiscard]] TransferQueue& transfers() { return daemon_.transfers(); }

  private:
    PlugIn(SyncDaemon::Process process, const Console& console, const PlugInTable& table);
    [[nodiscard]] static Result<std::unique_ptr<PlugIn>> loadIn(SyncDaemon::Process process,
                                                                Device& device,
                                                                const Console& console,
                                                                const PlugInTable& table);
    [[nodiscard]] static Result<std::unique_ptr<PlugIn>> loadPlain(SyncDaemon::Process process,
                                                                   Device& device,
                                                                   const Console& console,
                                                                   const PlugInTable& table,
                                                                   const RecordingOrder& order);
    Status makeClient(const Platform& platform, const RecordingOrder& order);
    void letClientGo();
    Status openLog(Device& device);
    void tellLogLoss() const;

    SyncDaemon daemon_;
    const Console console_;
    Device* device_ = nullptr;
    AppRegistry* registry_ = nullptr;  // the one that the client observes
    const PlugInTable& table_;
    std::unique_ptr<JsonLogFacility> log_;
    std::unique_ptr<const Platform> platform_;
    std::unique_ptr<SessionWatch> watch_;
    // Of a session that is recorded.
    std::shared_ptr<Recording> recording_;
    std::unique_ptr<RecordingPlatform> recordingPlatform_;
    std::unique_ptr<RecordedClient> recordedClient_;
    PlugInClient client_;  // goes first
};

}  // namespace appsync
