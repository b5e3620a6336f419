#include "device/Device.h"
#include "device/screen/HomeScreenPicture.h"
#include "host/command/Commands.h"
#include "host/command/OpenDevice.h"
#include "host/file/HostFile.h"

namespace appsync {
namespace {

Status writeScreen(Device& device, const std::string& picture) {
    const Result<std::vector<HomeScreenItem>> items = device.homeScreen();
    if (!items) return items.error();
    const Result<Bytes> png = drawHomeScreen(*items, "appsync");
    if (!png) return png.error();
    return writeHostFile(picture, *png);
}

}  // namespace

int runScreen(const std::string& device, const std::string& picture, const Console& console) {
    return lookAt(device, console,
                  [&](Device& opened) -> Status { return writeScreen(opened, picture); });
}

}  // namespace appsync
