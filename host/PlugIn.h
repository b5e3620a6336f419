#pragma once

#include <memory>

#include "host/SyncDaemon.h"
#include "platform/Result.h"

namespace appsync {

class AppsClient;
class Device;
class JsonLogFacility;
class SessionFacts;
class SessionWatch;
class SyncClient;
class SyncEvents;

/// The plug-in, loaded on a device: what the sync daemon does at its start. Its log is the
/// device's. The device must outlive it.
class PlugIn {
  public:
    [[nodiscard]] static Result<std::unique_ptr<PlugIn>> load(Device& device);
    /// With a watch between plug-in and device. Events and facts must outlive the plug-in.
    [[nodiscard]] static Result<std::unique_ptr<PlugIn>> load(Device& device, SyncEvents& events,
                                                              SessionFacts& facts);
    ~PlugIn();

    [[nodiscard]] SyncClient& client();
    /// Only of one that was loaded with a watch.
    [[nodiscard]] SessionWatch& watch() { return *watch_; }

  private:
    PlugIn();
    Status openLog(Device& device);

    SyncDaemon daemon_;
    std::unique_ptr<JsonLogFacility> log_;
    std::unique_ptr<SessionWatch> watch_;
    std::shared_ptr<AppsClient> client_;  // goes first
};

}  // namespace appsync
