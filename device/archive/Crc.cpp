#include "device/archive/Crc.h"

#include <libdeflate.h>

namespace appsync {

std::uint32_t continueCrc(std::uint32_t before, ByteView bytes) noexcept {
    return libdeflate_crc32(before, bytes.data(), bytes.size());
}

}  // namespace appsync
