#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace appsync {

class Device;

/// The archive of an application's data that a restore puts on a device.
struct DataToPlace {
    std::string identifier;
    std::string file;  // of this machine
};

/// The bytes that the device must have free for all of them: each archive, until its application is
/// installed, and what it holds, unpacked. What an earlier restore has left in their places goes,
/// and counts as free. An archive that cannot be looked at takes nothing: it is not placed either.
[[nodiscard]] std::uint64_t bytesNeededFor(const std::vector<DataToPlace>& data, Device& device);

}  // namespace appsync
