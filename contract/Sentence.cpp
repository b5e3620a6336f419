#include "contract/Sentence.h"

#include <mutex>
#include <utility>

namespace appsync {
namespace {

struct LookedAt {
    std::mutex mutex;
    // Protected by mutex.
    ContractSentence sentence;
    std::function<void(const ContractSentence&)> hear;
};

LookedAt& lookedAt() {
    static LookedAt now;
    return now;
}

}  // namespace

void checks(std::string_view header, std::string_view sentence) {
    LookedAt& now = lookedAt();
    const std::lock_guard guard(now.mutex);
    now.sentence = {std::string(header), std::string(sentence)};
    if (now.hear) now.hear(now.sentence);
}

ContractSentence sentenceLookedAt() {
    LookedAt& now = lookedAt();
    const std::lock_guard guard(now.mutex);
    return now.sentence;
}

void onSentence(std::function<void(const ContractSentence&)> hear) {
    LookedAt& now = lookedAt();
    const std::lock_guard guard(now.mutex);
    now.hear = std::move(hear);
}

}  // namespace appsync
