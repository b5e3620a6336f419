#pragma once

#include <string>
#include <string_view>

#include "host/replay/RecordingReader.h"

namespace appsync {

/// What the line tells of, in one line: "FileSystem.itemExists("/var/a") -> true".
[[nodiscard]] std::string recordText(const RecordLine& line);
/// The same of a call that no line tells of; `arguments` is a list.
[[nodiscard]] std::string callText(std::string_view name, std::uint64_t object,
                                   const nlohmann::json& arguments);

/// "FileSystem" of "FileSystem.itemExists"; "SyncClient" where the host calls.
[[nodiscard]] std::string_view serviceOf(const RecordLine& line);

/// Whether an identifier stands in what the line holds: as a text, or as a part of a path.
[[nodiscard]] bool mentions(const RecordLine& line, std::string_view identifier);

}  // namespace appsync
