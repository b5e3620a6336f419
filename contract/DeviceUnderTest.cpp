#include "contract/DeviceUnderTest.h"

#include "platform/PropertyList.h"
#include "platform/PropertyListSerialization.h"

namespace appsync {

Bytes DeviceUnderTest::iconState(const std::vector<std::string>& identifiers) {
    Result<Bytes> bytes = services().propertyLists.serialize(PropertyList::strings(identifiers),
                                                             PropertyListFormat::Xml);
    return bytes ? *std::move(bytes) : Bytes{};
}

}  // namespace appsync
