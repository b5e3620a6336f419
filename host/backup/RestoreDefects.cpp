#include "host/backup/RestoreDefects.h"

#include "platform/PropertyList.h"
#include "platform/PropertyListSerialization.h"
#include "restore/RestoredMetadata.h"

namespace appsync {
std::string defectOfRestoreEntry(const PropertyList& entry,
                                 PropertyListSerialization& propertyLists, bool isCoordinated) {
    if (!entry.isMap()) return "its entry in the restore information is no map";
    const PropertyList* stored = entry.find("VessikMetadata");
    if (stored == nullptr) return "its entry in the restore information has no store metadata";
    const Bytes* bytes = stored->asData();
    if (bytes == nullptr) return "its store metadata is no data";
    const Result<PropertyList> metadata = propertyLists.parse(*bytes);
    if (!metadata) return "its store metadata is damaged";
    if (!metadata->isMap()) return "its store metadata is no map";
    if (isCoordinated) return "";
    if (displayTitleOf(*metadata) == nullptr) return "its store metadata has no title";
    return bundleVersionOf(*metadata) != nullptr ? "" : "its store metadata has no version";
}

std::string defectOfDemotedApps(const Result<PropertyList>& list) {
    if (!list) return "it is no property list";
    if (!list->isMap()) return "it is no map";
    for (const char* key : {"AutomaticDowngrades", "IntentionalDowngrades"}) {
        const PropertyList* identifiers = list->find(key);
        if (identifiers != nullptr && !identifiers->isArray()) {
            return std::string("its ") + key + " is no list";
        }
    }
    return "";
}

}  // namespace appsync
