#include "tests/reliability/GuidedSearch.h"

#include <algorithm>
#include <cstdint>
#include <functional>
#include <string_view>

namespace appsync {
namespace {

constexpr std::uint64_t kFreshOneIn = 3;
constexpr std::size_t kCandidates = 4;
// Draws that one variation replaces at the most.
constexpr std::uint64_t kFewChanges = 4;
constexpr std::uint64_t kManyChanges = 24;
constexpr std::size_t kFewestDraws = 100;  // where nothing fails yet, nothing was drawn

bool isDigit(char each) { return each >= '0' && each <= '9'; }

// Of a message of the plug-in its first words, of a call that failed its name; nothing of others.
std::string eventOf(std::string_view line) {
    const bool isMessage = !line.empty() && isDigit(line.front());
    if (!isMessage && line.find(" -> Error") == std::string_view::npos) return {};
    constexpr std::size_t kWords = 40;
    const std::size_t names = isMessage ? line.find("com.example") : line.find('(');
    std::string event(line.substr(0, isMessage ? std::min(names, kWords) : names));
    std::erase_if(event, isDigit);
    return event;
}

}  // namespace

std::unordered_set<std::uint64_t> pairsOfEvents(const std::vector<std::string>& trace) {
    std::unordered_set<std::uint64_t> pairs;
    constexpr std::uint64_t kOdd = 0x9E3779B97F4A7C15U;
    std::uint64_t previous = 0;
    for (const std::string& line : trace) {
        const std::string event = eventOf(line);
        if (event.empty()) continue;
        const std::uint64_t number = std::hash<std::string>{}(event);
        pairs.insert(previous * kOdd + number);
        previous = number;
    }
    return pairs;
}

SessionRecipe GuidedSearch::next() {
    if (corpus_.empty() || random_() % kFreshOneIn == 0) return {nextSeed_++, {}};
    return varied(anyKept());
}

// Of a few, the one whose rarest pair was seen least.
const GuidedSearch::Kept& GuidedSearch::anyKept() {
    const Kept* rarest = nullptr;
    for (std::size_t i = 0; i < kCandidates; ++i) {
        const Kept& kept = corpus_[random_() % corpus_.size()];
        if (rarest == nullptr || timesOf(kept) < timesOf(*rarest)) rarest = &kept;
    }
    return *rarest;
}

std::size_t GuidedSearch::timesOf(const Kept& kept) const {
    std::size_t least = SIZE_MAX;
    for (const std::uint64_t pair : kept.pairs) least = std::min(least, times_.at(pair));
    return least;
}

SessionRecipe GuidedSearch::varied(const Kept& kept) {
    SessionRecipe recipe = kept.recipe;
    const auto [choices, faults, turns] = kept.draws;
    const std::uint64_t what = random_() % 4;
    if (what == 0) {
        replaceSome(recipe.changes.turns, turns, kFewChanges);
    } else if (what == 1) {
        replaceSome(recipe.changes.choices, choices, kFewChanges);
    } else {
        replaceSome(recipe.changes.faults, faults, kManyChanges);
    }
    return recipe;
}

// By small numbers half of the time: what happens once in many times does so for 0.
void GuidedSearch::replaceSome(ChanceChanges& changes, std::size_t draws, std::uint64_t most) {
    constexpr unsigned kUpperHalf = 32;
    for (std::uint64_t i = random_() % most + 1; i > 0; --i) {
        const std::size_t draw = random_() % std::max(draws, kFewestDraws);
        const std::uint64_t number = random_();
        changes.replaced[draw] = number % 2 == 0 ? number >> kUpperHalf << kUpperHalf : number;
    }
}

void GuidedSearch::learn(const SessionRecipe& recipe, const RandomSession& session) {
    Kept kept{recipe, session.draws(), {}};
    for (const std::uint64_t pair : pairsOfEvents(session.trace())) {
        if (++times_[pair] == 1) kept.pairs.push_back(pair);
    }
    if (!kept.pairs.empty()) corpus_.push_back(std::move(kept));
}

}  // namespace appsync
