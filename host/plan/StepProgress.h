#pragma once

#include <cstddef>
#include <functional>

namespace appsync {

/// Hears how many of a number of equal steps are done; first of none, at the end of all of them.
/// It may be empty.
using StepProgress = std::function<void(std::size_t done, std::size_t count)>;

}  // namespace appsync
