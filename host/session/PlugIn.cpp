#include "host/session/PlugIn.h"

#include <optional>
#include <string>
#include <utility>

#include "device/Device.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/watch/SessionWatch.h"
#include "platform/Notifications.h"
#include "recording/RecordedClient.h"
#include "recording/Recording.h"
#include "recording/RecordingPlatform.h"
#include "system/JsonLogFacility.h"

namespace appsync {
namespace {

Platform watched(const Platform& platform, SessionWatch& watch) {
    return {platform.host,          platform.log,           watch.registry(),
            platform.installer,     watch.coordination(),   watch.policy(),
            platform.backup,        watch.homeScreen(),     platform.icons,
            platform.transactions,  platform.queues,        platform.files,
            platform.propertyLists, platform.notifications, platform.notificationCenter};
}

}  // namespace

PlugIn::PlugIn(SyncDaemon::Process process, const Console& console, const PlugInTable& table)
    : daemon_(process), console_(console), table_(table) {}

// The device may be in the middle of telling the client something.
PlugIn::~PlugIn() {
    if (watch_ != nullptr) {
        watch_->closeCoordination();
    } else {
        device_->closeCoordination();
    }
    letClientGo();
    if (recording_ != nullptr) recording_->finish();
    tellLogLoss();
}

void PlugIn::letClientGo() {
    std::optional<SpanRecord> span;
    if (recording_ != nullptr) span.emplace(*recording_, "host", "destroyClient", 0);
    // Or else the client might go on the registry's thread, after what it stands on.
    if (client_.client != nullptr) registry_->removeObserver(client_.observer);
    table_.destroyClient(client_);  // its last messages come now
}

Status PlugIn::openLog(Device& device) {
    const std::string path = device.logPath();
    std::optional<LogFile> file = LogFile::open(path);
    if (!file) {
        return unusable("the device's log " + path + " is not a regular file", "remove it");
    }
    log_ = std::make_unique<JsonLogFacility>(*std::move(file));
    return {};
}

void PlugIn::tellLogLoss() const {
    if (log_ == nullptr) return;
    const JsonLogFacility::Loss loss = log_->loss();
    if (loss.messages == 0) return;
    console_.complain(std::to_string(loss.messages) +
                      " messages could not be written to the device's log: " + loss.reason);
}

Result<std::unique_ptr<PlugIn>> PlugIn::loadIn(SyncDaemon::Process process, Device& device,
                                               const Console& console, const PlugInTable& table) {
    std::unique_ptr<PlugIn> plugIn(new PlugIn(process, console, table));
    plugIn->device_ = &device;
    const Status status = plugIn->openLog(device);
    if (!status) return status.error();
    plugIn->platform_ =
        std::make_unique<const Platform>(device.platform(plugIn->daemon_, *plugIn->log_));
    return plugIn;
}

Status PlugIn::makeClient(const Platform& platform, const RecordingOrder& order) {
    if (order.sink == nullptr) {
        registry_ = &platform.registry;
        client_ = table_.makeClient(platform);
    } else {
        RecordingOptions options;
        options.isAnonymous = order.isAnonymous;
        recording_ = std::make_shared<Recording>(*order.sink, daemon_, table_.plugInVersion,
                                                 std::move(options));
        recordingPlatform_ = std::make_unique<RecordingPlatform>(platform, *recording_);
        registry_ = &recordingPlatform_->services().registry;
        const SpanRecord span(*recording_, "host", "makeClient", 0);
        client_ = table_.makeClient(recordingPlatform_->services());
        if (client_.client != nullptr) {
            recordedClient_ = std::make_unique<RecordedClient>(*client_.client, *recording_);
        }
    }
    if (client_.client != nullptr) return {};
    return failure("out of means: the plug-in cannot make its client", "run it again");
}

Result<std::unique_ptr<PlugIn>> PlugIn::loadPlain(SyncDaemon::Process process, Device& device,
                                                  const Console& console, const PlugInTable& table,
                                                  const RecordingOrder& order) {
    Result<std::unique_ptr<PlugIn>> plugIn = loadIn(process, device, console, table);
    if (!plugIn) return plugIn;
    const Status made = (*plugIn)->makeClient((*plugIn)->platform(), order);
    if (!made) return made.error();
    return plugIn;
}

Result<std::unique_ptr<PlugIn>> PlugIn::load(Device& device, const Console& console) {
    return loadPlain(SyncDaemon::Process::Daemon, device, console, *appsyncPlugInTable(), {});
}

Result<std::unique_ptr<PlugIn>> PlugIn::loadForRestore(Device& device, const Console& console,
                                                       const PlugInTable& table,
                                                       const RecordingOrder& order) {
    return loadPlain(SyncDaemon::Process::Restore, device, console, table, order);
}

Result<std::unique_ptr<PlugIn>> PlugIn::load(Device& device, SyncEvents& events,
                                             SessionFacts& facts, const Console& console,
                                             const PlugInTable& table,
                                             const RecordingOrder& order) {
    Result<std::unique_ptr<PlugIn>> loaded =
        loadIn(SyncDaemon::Process::Daemon, device, console, table);
    if (!loaded) return loaded;
    PlugIn& plugIn = **loaded;
    plugIn.watch_ = std::make_unique<SessionWatch>(device, plugIn.platform(), events, facts);
    const Status made = plugIn.makeClient(watched(plugIn.platform(), *plugIn.watch_), order);
    if (!made) return made.error();
    // What an interrupted session has delivered must not end while the plug-in looks what there is.
    device.holdCoordinatedInstalls();
    plugIn.platform().notificationCenter.post(kStartupCompleteNotification);
    return loaded;
}

SyncClient& PlugIn::client() {
    return recordedClient_ != nullptr ? *recordedClient_ : *client_.client;
}

}  // namespace appsync
