#include "host/PlugIn.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <utility>

#include "client/AppsClient.h"
#include "device/Device.h"
#include "host/HostFile.h"
#include "host/Problem.h"
#include "host/SessionWatch.h"
#include "system/JsonLogFacility.h"

namespace appsync {
namespace {

Platform watched(const Platform& platform, SessionWatch& watch) {
    return {platform.host,          platform.log,           watch.registry(),
            platform.installer,     platform.coordination,  platform.policy,
            platform.backup,        watch.homeScreen(),     platform.icons,
            platform.transactions,  platform.queues,        platform.files,
            platform.propertyLists, platform.notifications, platform.notificationCenter};
}

}  // namespace

PlugIn::PlugIn() = default;
PlugIn::~PlugIn() = default;

Status PlugIn::openLog(Device& device) {
    const std::string path = device.logPath();
    ::mkdir(path.substr(0, path.rfind('/')).c_str(), 0755);  // it may have been tidied away
    UniqueFd file(::open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644));
    if (!file) return unusable(systemError(errno, "cannot write the device's log " + path));
    log_ = std::make_unique<JsonLogFacility>(std::move(file));
    return {};
}

Result<std::unique_ptr<PlugIn>> PlugIn::load(Device& device) {
    std::unique_ptr<PlugIn> plugIn(new PlugIn());
    const Status status = plugIn->openLog(device);
    if (!status) return status.error();
    plugIn->client_ = AppsClient::create(device.platform(plugIn->daemon_, *plugIn->log_));
    return plugIn;
}

Result<std::unique_ptr<PlugIn>> PlugIn::load(Device& device, SyncEvents& events,
                                             SessionFacts& facts) {
    std::unique_ptr<PlugIn> plugIn(new PlugIn());
    const Status status = plugIn->openLog(device);
    if (!status) return status.error();
    const Platform platform = device.platform(plugIn->daemon_, *plugIn->log_);
    plugIn->watch_ = std::make_unique<SessionWatch>(device, platform.registry, platform.homeScreen,
                                                    events, facts);
    plugIn->client_ = AppsClient::create(watched(platform, *plugIn->watch_));
    return plugIn;
}

SyncClient& PlugIn::client() { return *client_; }

}  // namespace appsync
