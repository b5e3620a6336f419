#include "simulation/scheduling/Chance.h"

namespace appsync {
namespace {

constexpr unsigned kHalf = 32;
constexpr std::uint64_t kLowerHalf = (std::uint64_t{1} << kHalf) - 1;

}  // namespace

std::uint64_t Chance::below(std::uint64_t bound, std::uint64_t atRest) {
    const std::uint64_t drawn = draw() % bound;
    return counts(drawn != atRest) ? drawn : atRest;
}

bool Chance::oneIn(std::uint64_t count, bool atRest) {
    const bool drawn = draw() % count == 0;
    return counts(drawn != atRest) ? drawn : atRest;
}

std::uint64_t Chance::draw() {
    const std::uint64_t drawn = generator_();
    const auto replaced = changes_.replaced.find(draws_);
    replacement_.reset();
    if (replaced == changes_.replaced.end()) return drawn;
    replacement_ = replaced->second;
    return *replacement_ & kLowerHalf;
}

std::uint64_t Chance::detail(std::uint64_t bound) {
    return (replacement_ ? *replacement_ >> kHalf : generator_()) % bound;
}

bool Chance::counts(bool differs) {
    const std::size_t number = draws_++;
    const bool isKept = !changes_.kept || changes_.kept->contains(number);
    if (!differs || !isKept) return false;
    unrest_.push_back(number);
    return true;
}

}  // namespace appsync
