#include "client/Log.h"

#include "platform/Platform.h"
#include "platform/SyncHost.h"

namespace appsync {

Log::Log(const Platform& platform) : facility_(platform.log), host_(platform.host) {}

std::string Log::pluginBundleIdentifier() const { return host_.pluginBundleIdentifier(); }

}  // namespace appsync
