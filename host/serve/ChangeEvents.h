#pragma once

#include <memory>

#include "host/serve/http/HttpServer.h"

namespace appsync {

class ChangeBell;
class ServedDevice;
class ServedDevices;

/// Events that tell of the changes of one device, the first at once. What they get outlives them.
[[nodiscard]] std::shared_ptr<EventStream> eventsOf(std::shared_ptr<ServedDevice> device,
                                                    const ChangeBell& bell);

/// The same of all devices that are served, new ones among them.
[[nodiscard]] std::shared_ptr<EventStream> eventsOf(ServedDevices& devices, const ChangeBell& bell);

}  // namespace appsync
