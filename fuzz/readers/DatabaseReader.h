#pragma once

#include "fuzz/readers/Reading.h"

namespace appsync {

/// The database of a device that has two applications on its disk. Whoever looks at the device, a
/// session on it and a person who removes what it shows get an answer or an error of the device
/// that says why; nothing changes outside of the device, nor of the files on it that are nobody's
/// application.
[[nodiscard]] Reading readDeviceDatabase(ByteView bytes);

}  // namespace appsync
