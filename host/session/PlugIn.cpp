#include "host/session/PlugIn.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <utility>

#include "client/AppsClient.h"
#include "device/Device.h"
#include "host/console/Problem.h"
#include "host/file/HostFile.h"
#include "host/watch/SessionWatch.h"
#include "platform/Notifications.h"
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

PlugIn::PlugIn(SyncDaemon::Process process) : daemon_(process) {}

// The device may be in the middle of telling the client something.
PlugIn::~PlugIn() {
    if (watch_ != nullptr) {
        watch_->closeCoordination();
    } else {
        device_->closeCoordination();
    }
    // Or else the client might go on the registry's thread, after what it stands on.
    if (client_ != nullptr) registry_->removeObserver(client_.get());
}

Status PlugIn::openLog(Device& device) {
    const std::string path = device.logPath();
    const std::size_t slash = path.rfind('/');
    const std::string directory = path.substr(0, slash);
    ::mkdir(directory.c_str(), 0755);  // it may have been tidied away
    // Nothing is written outside the device, and a pipe is not waited on.
    constexpr int kFlags = O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK;
    const UniqueFd folder(
        ::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    UniqueFd file;
    if (folder) file = UniqueFd(::openat(folder.get(), path.c_str() + slash + 1, kFlags, 0644));
    if (!file) {
        return unusable(systemError(errno, "cannot write the device's log " + path));
    }
    struct stat attributes {};
    if (::fstat(file.get(), &attributes) != 0 || !S_ISREG(attributes.st_mode)) {
        return unusable("the device's log " + path + " is not a regular file", "remove it");
    }
    log_ = std::make_unique<JsonLogFacility>(std::move(file));
    return {};
}

Result<std::unique_ptr<PlugIn>> PlugIn::loadIn(SyncDaemon::Process process, Device& device) {
    std::unique_ptr<PlugIn> plugIn(new PlugIn(process));
    plugIn->device_ = &device;
    const Status status = plugIn->openLog(device);
    if (!status) return status.error();
    plugIn->platform_ =
        std::make_unique<const Platform>(device.platform(plugIn->daemon_, *plugIn->log_));
    plugIn->registry_ = &plugIn->platform_->registry;
    return plugIn;
}

Result<std::unique_ptr<PlugIn>> PlugIn::load(Device& device) {
    Result<std::unique_ptr<PlugIn>> plugIn = loadIn(SyncDaemon::Process::Daemon, device);
    if (plugIn) (*plugIn)->client_ = AppsClient::create((*plugIn)->platform());
    return plugIn;
}

Result<std::unique_ptr<PlugIn>> PlugIn::loadForRestore(Device& device) {
    Result<std::unique_ptr<PlugIn>> plugIn = loadIn(SyncDaemon::Process::Restore, device);
    if (plugIn) (*plugIn)->client_ = AppsClient::create((*plugIn)->platform());
    return plugIn;
}

Result<std::unique_ptr<PlugIn>> PlugIn::load(Device& device, SyncEvents& events,
                                             SessionFacts& facts) {
    Result<std::unique_ptr<PlugIn>> loaded = loadIn(SyncDaemon::Process::Daemon, device);
    if (!loaded) return loaded;
    PlugIn& plugIn = **loaded;
    plugIn.watch_ = std::make_unique<SessionWatch>(device, plugIn.platform(), events, facts);
    plugIn.registry_ = &plugIn.watch_->registry();
    plugIn.client_ = AppsClient::create(watched(plugIn.platform(), *plugIn.watch_));
    plugIn.platform().notificationCenter.post(kStartupCompleteNotification);
    return loaded;
}

SyncClient& PlugIn::client() { return *client_; }

}  // namespace appsync
