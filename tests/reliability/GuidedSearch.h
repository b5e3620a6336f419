#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <random>
#include <string>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "tests/reliability/RandomSession.h"

namespace appsync {

/// A session that can be made again.
struct SessionRecipe {
    std::uint64_t seed = 0;
    SessionChanges changes;
};

/// Chooses sessions by what earlier ones have reached: those that brought two events one after the
/// other that never were so before are kept, and varied, the more often the rarer these still are.
/// An event is a message of the plug-in, or a call across platform/ that failed.
class GuidedSearch {
  public:
    /// `seed` decides the search; the sessions that it begins with are those of the seeds from it
    /// on.
    explicit GuidedSearch(std::uint64_t seed) : random_(seed), nextSeed_(seed) {}

    /// What to run next.
    [[nodiscard]] SessionRecipe next();
    /// What came of it.
    void learn(const SessionRecipe& recipe, const RandomSession& session);

    /// How many pairs of events have been reached.
    [[nodiscard]] std::size_t reached() const { return times_.size(); }
    /// How many sessions reached something new.
    [[nodiscard]] std::size_t corpus() const { return corpus_.size(); }

  private:
    struct Kept {
        SessionRecipe recipe;
        std::array<std::size_t, 3> draws;
        std::vector<std::uint64_t> pairs;  // that it was the first to reach
    };

    [[nodiscard]] const Kept& anyKept();
    [[nodiscard]] std::size_t timesOf(const Kept& kept) const;
    [[nodiscard]] SessionRecipe varied(const Kept& kept);
    void replaceSome(ChanceChanges& changes, std::size_t draws, std::uint64_t most);

    std::mt19937_64 random_;
    std::uint64_t nextSeed_;
    std::unordered_map<std::uint64_t, std::size_t> times_;  // in how many sessions a pair was
    std::vector<Kept> corpus_;
};

/// The pairs of events in a session, each as a number that is the same in every run of one build.
[[nodiscard]] std::unordered_set<std::uint64_t> pairsOfEvents(
    const std::vector<std::string>& trace);

}  // namespace appsync
