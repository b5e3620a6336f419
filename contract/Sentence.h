#pragma once

#include <compare>
#include <functional>
#include <string>
#include <string_view>

namespace appsync {

/// A sentence of a contract, word for word, and the header that it stands in.
struct ContractSentence {
    std::string header;
    std::string text;

    friend auto operator<=>(const ContractSentence&, const ContractSentence&) = default;
};

/// What a test looks at from here on, until it says otherwise: where an expectation fails, this
/// sentence is broken. Said first thing in each test, once for each sentence:
///
///     checks("platform/FileSystem.h", "Renames. EEXIST when something stands at `to`.");
///
/// scripts/check_docs sees to it that the header has those words. Callable on any thread.
void checks(std::string_view header, std::string_view sentence);

/// What is looked at now; of no header before anything is.
[[nodiscard]] ContractSentence sentenceLookedAt();

/// Hears of each sentence from now on, on the thread that says it.
void onSentence(std::function<void(const ContractSentence&)> hear);

}  // namespace appsync
