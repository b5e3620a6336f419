#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <random>
#include <set>
#include <utility>
#include <vector>

namespace appsync {

/// What becomes of the draws of a `Chance`, by their numbers; the first is 0.
struct ChanceChanges {
    /// Those that are not at rest. Nothing: all.
    std::optional<std::set<std::size_t>> kept{};
    /// Those that another number than the seed's decides: its lower half the draw itself, its upper
    /// half what more is asked about it.
    std::map<std::size_t, std::uint64_t> replaced{};
};

/// Numbers that a seed decides, and of which all but some can be put to rest, or some be replaced:
/// so it shows which of them something depends on. Used by the one thread of a simulation.
class Chance {
  public:
    explicit Chance(std::uint64_t seed, ChanceChanges changes = {})
        : generator_(seed), changes_(std::move(changes)) {}

    /// The next draw: a number below `bound`, which is not 0. `atRest` is the one with which the
    /// least happens.
    std::uint64_t below(std::uint64_t bound, std::uint64_t atRest);
    /// True once in so many times, which are more than one.
    bool oneIn(std::uint64_t count, bool atRest = false);
    /// More about the draw that was just made: a number below `bound`. No draw of its own; one that
    /// was replaced tells it, too, so that those after it stay as they are.
    std::uint64_t detail(std::uint64_t bound);
    /// A seed for another source. Never at rest, and no draw that is counted.
    std::uint64_t seed() { return generator_(); }
    /// How many draws there were.
    [[nodiscard]] std::size_t draws() const { return draws_; }

    /// The numbers of the draws so far that gave something else than at rest, ascending.
    [[nodiscard]] const std::vector<std::size_t>& unrest() const { return unrest_; }

  private:
    // The number behind the next draw. One is taken from the seed in any case, so that those after
    // it stay as they are.
    std::uint64_t draw();
    // Counts that draw. Whether it gives what was drawn: that differs from rest, and is kept.
    bool counts(bool differs);

    std::mt19937_64 generator_;
    const ChanceChanges changes_;
    std::size_t draws_ = 0;
    std::optional<std::uint64_t> replacement_;  // behind the last draw
    std::vector<std::size_t> unrest_;
};

}  // namespace appsync
