#include "checked/BreachBook.h"

#include <algorithm>
#include <array>
#include <thread>
#include <utility>

#include "platform/Error.h"

namespace appsync {

namespace {

std::uintptr_t threadOfProcess() {
    return static_cast<std::uintptr_t>(std::hash<std::thread::id>()(std::this_thread::get_id()));
}

bool isKnownDomain(std::string_view domain) {
    constexpr std::array known{kPosixErrorDomain, kSyncErrorDomain, kRegistryErrorDomain,
                               kInstallerErrorDomain, kPropertyListErrorDomain};
    return std::find(known.begin(), known.end(), domain) != known.end();
}

}  // namespace

BreachBook::BreachBook(std::function<void(const ContractBreach&)> sink,
                       std::function<std::uintptr_t()> currentThread)
    : sink_(std::move(sink)),
      currentThread_(currentThread ? std::move(currentThread) : threadOfProcess) {}

void BreachBook::broken(std::string_view header, std::string_view sentence,
                        const std::string& seen) {
    const std::lock_guard guard(mutex_);
    if (!told_.insert(std::string(sentence) + seen).second || !sink_) return;
    sink_({std::string(header), std::string(sentence), seen});
}

void BreachBook::checkDomain(const ErrorRecord& error, std::string_view call) {
    if (isKnownDomain(error.domain)) return;
    broken("platform/Error.h",
           "An error as it crosses interfaces: who says it (domain), which one (code), and what a "
           "person or a program may want to know",
           std::string(call) + " gave an error of the unknown domain '" + error.domain + "'");
}

void BreachBook::checkHasDomain(const ErrorRecord& error, std::string_view call) {
    if (!error.domain.empty()) return;
    broken("platform/Error.h",
           "An error as it crosses interfaces: who says it (domain), which one (code), and what a "
           "person or a program may want to know",
           std::string(call) + " gave an error without a domain");
}

}  // namespace appsync
