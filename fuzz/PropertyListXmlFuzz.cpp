#include <cstddef>
#include <cstdint>

#include "fuzz/PropertyListFuzz.h"
#include "system/PropertyListPlainXmlReader.h"
#include "system/PropertyListXmlReader.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto value = appsync::readXmlPropertyList({data, size});
    const auto plain = appsync::readPlainXmlPropertyList({data, size});
    if (plain) appsync::require(value.ok() && *value == *plain);
    if (value) {
        appsync::requireRoundTrip(*value);
    } else {
        appsync::require(value.error().userInfo.find("line") != nullptr);
    }
    return 0;
}
