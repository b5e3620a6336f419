#pragma once

// host/serve: a page that shows devices as they are, live, to a browser of this machine. `LivePage`
// (this header) knows the addresses. ServedDevices.h are the devices; each has one thread that
// looks at it (ServedDevice.h), when its stamp (DeviceStamp.h) or somebody's question asks for it,
// and makes what is shown of what it reads (DeviceReading.h, DeviceView.h). ChangeEvents.h tells
// those who listen, LogPage.h finds lines of the log, PageFiles.h are the page itself. HTTP is
// spoken in the room host/serve/http. Nothing here changes a device.

#include <cstddef>
#include <memory>
#include <string>

#include "host/serve/ChangeBell.h"
#include "host/serve/ServedDevices.h"
#include "host/serve/http/HttpServer.h"
#include "platform/Result.h"

namespace appsync {

/// Answers what a browser asks. Callable on any thread.
class LivePage {
  public:
    /// `version` is the command's.
    [[nodiscard]] static Result<std::unique_ptr<LivePage>> open(const std::string& path,
                                                                ServedDevices::IsDevice isDevice,
                                                                std::string version);

    [[nodiscard]] HttpAnswer answer(const HttpRequest& request);
    /// How many devices of the folder are not shown, as there are too many.
    [[nodiscard]] std::size_t leftOut();
    /// Ends all events.
    void end();

  private:
    explicit LivePage(std::string version) : version_(std::move(version)) {}

    [[nodiscard]] HttpAnswer devicesAnswer();
    [[nodiscard]] HttpAnswer deviceAnswer(const HttpRequest& request);
    [[nodiscard]] HttpAnswer ofDevice(const std::shared_ptr<ServedDevice>& device,
                                      const HttpRequest& request);

    const std::string version_;
    ChangeBell bell_;
    std::unique_ptr<ServedDevices> devices_;
};

}  // namespace appsync
