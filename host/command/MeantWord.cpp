#include "host/command/MeantWord.h"

#include <algorithm>
#include <cstddef>

namespace appsync {
namespace {

constexpr std::size_t kLongestWord = 32;  // what is longer is no slip of a command or an option

// How many letters were left out, put in, changed or swapped with the next.
std::size_t slipsBetween(const std::string& one, const std::string& other) {
    std::vector<std::vector<std::size_t>> slips(one.size() + 1,
                                                std::vector<std::size_t>(other.size() + 1));
    for (std::size_t i = 0; i <= one.size(); ++i) {
        for (std::size_t j = 0; j <= other.size(); ++j) {
            if (i == 0 || j == 0) {
                slips[i][j] = i + j;
                continue;
            }
            const std::size_t change = one[i - 1] == other[j - 1] ? 0 : 1;
            slips[i][j] =
                std::min({slips[i - 1][j] + 1, slips[i][j - 1] + 1, slips[i - 1][j - 1] + change});
            const bool areSwapped =
                i > 1 && j > 1 && one[i - 1] == other[j - 2] && one[i - 2] == other[j - 1];
            if (areSwapped) slips[i][j] = std::min(slips[i][j], slips[i - 2][j - 2] + 1);
        }
    }
    return slips[one.size()][other.size()];
}

// The beginning of a word of some length is as good as one slip.
std::size_t distanceOf(const std::string& typed, const std::string& word) {
    const std::size_t slips = slipsBetween(typed, word);
    return typed.size() > 2 && word.starts_with(typed) ? std::min<std::size_t>(slips, 1) : slips;
}

}  // namespace

std::string meantWord(const std::string& typed, const std::vector<std::string>& known) {
    if (typed.size() > kLongestWord) return {};
    // Of a short word one slip leaves too little to know it by.
    std::size_t least = typed.size() > 3 ? 3 : 2;
    std::string meant;
    for (const std::string& word : known) {
        const std::size_t distance = distanceOf(typed, word);
        if (distance > least) continue;
        meant = distance == least ? "" : word;
        least = distance;
    }
    return meant;
}

}  // namespace appsync
