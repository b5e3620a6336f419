#pragma once

#include <string>
#include <string_view>
#include <vector>

#include <nlohmann/json_fwd.hpp>

#include "device/values/DeviceRecords.h"

namespace appsync {

class PropertyList;
struct AwaitedThing;
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
/// The same of a package that was written, and whether one was replaced.
[[nodiscard]] std::string jsonText(const PackageInfo& info, bool hasReplaced);

// The same of one record, for a text that holds more.

[[nodiscard]] nlohmann::ordered_json jsonOf(const ApplicationRecord& record);
[[nodiscard]] nlohmann::ordered_json jsonOf(const HistoryRecord& record);
[[nodiscard]] nlohmann::ordered_json jsonOf(const CoordinatorRecord& record);
[[nodiscard]] nlohmann::ordered_json jsonOf(const AwaitedThing& thing);
[[nodiscard]] nlohmann::ordered_json jsonOf(const WhyAnswer& answer);

/// What a placeholder stands for: "offloaded", "restored" by a backup, or "arriving" with a sync or
/// from the store.
[[nodiscard]] std::string_view placeholderKind(const ApplicationRecord& record);

/// Whether all of a coordinated install is there, or what it waits for; a sentence.
[[nodiscard]] std::string coordinatorState(const CoordinatorRecord& record);

/// Data becomes a map {"data": base64}, a date {"date": ISO 8601}.
[[nodiscard]] std::string jsonText(const PropertyList& value);

}  // namespace appsync
