#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/LegalIdentifier.h"
#include "platform/Result.h"

namespace appsync {

/// What a legal identifier consists of, for the sentences that refuse one.
inline constexpr std::string_view kIdentifierRule = "1 to 255 letters, digits, '.', '-' and '_'";

/// An error of `kRegistryErrorDomain` unless the identifier is a legal one.
Status requireLegalIdentifier(const std::string& identifier);

/// The name of the file in which the package of an application, or its data, travels and waits: the
/// identifier and ".zip". No file name is longer than 255 bytes: where that would be, it is the
/// identifier alone, and a ".zip" that this ends in becomes "~zip". No two identifiers share one.
[[nodiscard]] std::string archiveNameOf(const std::string& identifier);

/// The identifier whose archive is named so; nothing when no identifier's is.
[[nodiscard]] std::optional<std::string> identifierOfArchive(std::string_view name);

}  // namespace appsync
