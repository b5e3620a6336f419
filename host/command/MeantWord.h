#pragma once

#include <string>
#include <vector>

namespace appsync {

/// Which of the words somebody meant who typed one that is none of them: the one that it begins, or
/// that is closest to it. Empty where none is close, or several are as close.
[[nodiscard]] std::string meantWord(const std::string& typed,
                                    const std::vector<std::string>& known);

}  // namespace appsync
