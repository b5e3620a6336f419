#include "device/Device.h"
#include "device/screen/HomeScreenPicture.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/argument/WrittenFile.h"
#include "host/command/look/LookCommands.h"

namespace appsync {
namespace {

Result<WrittenFile> writeScreen(Device& device, const std::string& picture) {
    const Result<std::vector<HomeScreenItem>> items = device.homeScreen();
    if (!items) return items.error();
    const Result<Bytes> png = drawHomeScreen(*items, "appsync");
    if (!png) return png.error();
    return writeOutput(picture, *png);
}

}  // namespace

int runScreen(const std::string& device, const std::string& picture, bool asJson,
              const Console& console) {
    return lookAt(device, console, [&](Device& opened) -> Status {
        const Result<WrittenFile> written = writeScreen(opened, picture);
        if (!written) return written.error();
        tellWritten(*written, asJson, console);
        return {};
    });
}

}  // namespace appsync
