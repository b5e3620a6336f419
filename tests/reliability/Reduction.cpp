#include "tests/reliability/Reduction.h"

#include <algorithm>
#include <array>
#include <set>

namespace appsync {
namespace {

using Draws = std::set<std::size_t>;

constexpr std::size_t kMostTries = 5000;

// In the order in which they are put to rest: most often the later ones are what is needed.
constexpr std::array kKindsOfUnrest = {&SessionChanges::turns, &SessionChanges::faults,
                                       &SessionChanges::choices};

Draws without(const std::vector<std::size_t>& draws, std::size_t begin, std::size_t count) {
    Draws left(draws.begin(), draws.end());
    for (std::size_t i = begin; i < std::min(begin + count, draws.size()); ++i) {
        left.erase(draws[i]);
    }
    return left;
}

// Delta debugging: leaves out ever smaller pieces, as long as it fails without one.
Draws fewest(const Draws& all, const std::function<bool(const Draws&)>& fails) {
    if (all.empty() || fails({})) return {};
    std::vector<std::size_t> left(all.begin(), all.end());
    for (std::size_t pieces = 2; left.size() > 1;) {
        const std::size_t size = (left.size() + pieces - 1) / pieces;
        bool isSmaller = false;
        for (std::size_t begin = 0; begin < left.size() && !isSmaller; begin += size) {
            const Draws rest = without(left, begin, size);
            if (!fails(rest)) continue;
            left.assign(rest.begin(), rest.end());
            isSmaller = true;
        }
        if (isSmaller) {
            pieces = std::max<std::size_t>(pieces - 1, 2);
        } else if (size == 1) {
            break;
        } else {
            pieces = std::min(pieces * 2, left.size());
        }
    }
    return {left.begin(), left.end()};
}

std::size_t sizeOf(const SessionChanges& changes) {
    return changes.choices.kept->size() + changes.faults.kept->size() + changes.turns.kept->size();
}

// Of two sessions the same invariant was broken where this is the same.
std::string withoutNumbers(std::string text) {
    std::erase_if(text, [](char each) { return each >= '0' && each <= '9'; });
    return text;
}

bool breaksTheSame(const std::vector<std::string>& violations, const std::string& wanted) {
    return std::ranges::any_of(violations, [&](const std::string& each) {
        return withoutNumbers(each) == withoutNumbers(wanted);
    });
}

bool isOfAName(char each) { return (each >= 'a' && each <= 'z') || (each >= '0' && each <= '9'); }

std::size_t applicationsIn(const std::vector<std::string>& trace) {
    constexpr std::string_view kPrefix = "com.example.";
    std::set<std::string> identifiers;
    for (const std::string& line : trace) {
        for (std::size_t at = line.find(kPrefix); at != std::string::npos;) {
            const std::size_t begin = at + kPrefix.size();
            const auto end = std::find_if_not(line.begin() + static_cast<std::ptrdiff_t>(begin),
                                              line.end(), isOfAName);
            identifiers.insert(std::string(line.begin() + static_cast<std::ptrdiff_t>(begin), end));
            at = line.find(kPrefix, begin);
        }
    }
    return identifiers.size();
}

}  // namespace

SessionChanges reduced(SessionChanges whole,
                       const std::function<bool(const SessionChanges&)>& fails) {
    for (std::size_t before = sizeOf(whole) + 1; sizeOf(whole) < before;) {
        before = sizeOf(whole);
        for (const auto source : kKindsOfUnrest) {
            const Draws all = *(whole.*source).kept;
            (whole.*source).kept = fewest(all, [&](const Draws& some) {
                SessionChanges changes = whole;
                (changes.*source).kept = some;
                return fails(changes);
            });
        }
    }
    for (const auto source : kKindsOfUnrest) {
        std::erase_if((whole.*source).replaced, [&](const auto& replaced) {
            return !(whole.*source).kept->contains(replaced.first);
        });
    }
    return whole;
}

ReducedSession reducedSession(std::uint64_t seed, const SessionChanges& given) {
    RandomSession session(seed, given);
    ReducedSession result;
    result.violations = session.run();
    result.changes = session.unrest();
    if (result.violations.empty()) return result;
    const std::string wanted = result.violations.front();
    result.changes = reduced(result.changes, [&](const SessionChanges& changes) {
        if (++result.tries > kMostTries) return false;
        RandomSession smaller(seed, changes);
        return breaksTheSame(smaller.run(), wanted);
    });
    RandomSession smallest(seed, result.changes);
    result.violations = smallest.run();
    result.applications = applicationsIn(smallest.trace());
    return result;
}

}  // namespace appsync
