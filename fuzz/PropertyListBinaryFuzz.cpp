#include <cstddef>
#include <cstdint>

#include "fuzz/PropertyListFuzz.h"
#include "system/PropertyListBinaryReader.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto value = appsync::readBinaryPropertyList({data, size});
    if (value) {
        appsync::requireRoundTrip(*value);
    } else {
        appsync::require(value.error().userInfo.find("offset") != nullptr);
    }
    return 0;
}
