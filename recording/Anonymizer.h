#pragma once

#include <cstdint>
#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <unordered_set>

namespace appsync {

/// Makes up other words for those of a text, the same for the same ones, others for others. Letters
/// become letters and digits digits, so that identifiers, versions and paths keep their form; what
/// stands between words stays. The words that the system itself uses in paths and domains stay too.
///
/// Callable on any thread.
class Anonymizer {
  public:
    [[nodiscard]] std::string madeUpFor(std::string_view text);

  private:
    [[nodiscard]] const std::string& wordFor(const std::string& word);
    [[nodiscard]] std::string nextWordLike(std::string_view word);

    std::mutex mutex_;
    // Guarded by mutex_.
    std::map<std::string, std::string> words_;
    std::unordered_set<std::string> taken_;
    std::map<std::string, std::uint64_t, std::less<>> counters_;  // for each form of words
};

}  // namespace appsync
