#pragma once

#include <string>

#include <nlohmann/json_fwd.hpp>

namespace appsync {

/// The value on one line; bytes that are not UTF-8 become U+FFFD.
[[nodiscard]] std::string dumped(const nlohmann::ordered_json& value);
/// The same over several lines, for people too.
[[nodiscard]] std::string indented(const nlohmann::ordered_json& value);

}  // namespace appsync
