#pragma once

#include <string>
#include <vector>

#include "device/values/DeviceRecords.h"

namespace appsync {

class PropertyList;
struct Inventory;
struct PackageInfo;
struct WhyAnswer;

// One JSON text each, over several lines, without a line end. Bytes that are not UTF-8 become
// U+FFFD.

[[nodiscard]] std::string jsonText(const std::vector<ApplicationRecord>& records);
[[nodiscard]] std::string jsonText(const std::vector<HistoryRecord>& records);
[[nodiscard]] std::string jsonText(const std::vector<CoordinatorRecord>& records);
[[nodiscard]] std::string jsonText(const Inventory& inventory);
[[nodiscard]] std::string jsonText(const WhyAnswer& answer);
[[nodiscard]] std::string jsonText(const PackageInfo& info);
/// Data becomes a map {"data": base64}, a date {"date": ISO 8601}.
[[nodiscard]] std::string jsonText(const PropertyList& value);

}  // namespace appsync
