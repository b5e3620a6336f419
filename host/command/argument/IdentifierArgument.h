#pragma once

#include <string>
#include <string_view>

#include "platform/Result.h"

namespace appsync {

// What to do about an identifier that is none: of an application that is to be there, and of any.
inline constexpr std::string_view kGiveAsShown = "give one as appsync apps shows it";
inline constexpr std::string_view kUseLegalCharacters =
    "use 1 to 255 letters, digits, '.', '-' and '_'";

/// Refuses an argument that is no legal identifier: the command is used wrongly. `option` is what
/// it was given with, if it was.
[[nodiscard]] Status checkIdentifier(const std::string& identifier, std::string_view whatToDo,
                                     std::string_view option = {});

/// The identifier as messages name it: one that is empty can be seen, too.
[[nodiscard]] std::string shownArgument(const std::string& identifier);

}  // namespace appsync
