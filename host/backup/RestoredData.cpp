#include "host/backup/RestoredData.h"

#include <algorithm>
#include <filesystem>
#include <system_error>

#include "device/Device.h"
#include "device/package/DataArchive.h"
#include "platform/FileSystem.h"

namespace appsync {
namespace {

std::uint64_t bytesInPlace(const std::string& identifier, Device& device) {
    const Result<ItemAttributes> there =
        device.files().attributes(Device::restoreDataPath(identifier));
    return there && !there->isDirectory ? there->size : 0;
}

}  // namespace

std::uint64_t bytesNeededFor(const std::vector<DataToPlace>& data, Device& device) {
    std::uint64_t archives = 0;
    std::uint64_t unpacked = 0;
    std::uint64_t inPlace = 0;
    for (const DataToPlace& each : data) {
        std::error_code code;
        const std::uint64_t size = std::filesystem::file_size(each.file, code);
        const Result<std::uint64_t> contents = checkDataArchive(each.file);
        if (code || !contents) continue;
        archives += size;
        unpacked += *contents;
        inPlace += bytesInPlace(each.identifier, device);
    }
    return unpacked + archives - std::min(archives, inPlace);
}

}  // namespace appsync
