#include "host/watch/SessionFacts.h"

namespace appsync {

void SessionFacts::failed(const std::string& identifier, const std::string& error) {
    const std::lock_guard guard(mutex_);
    failures_.try_emplace(identifier, error);
}

void SessionFacts::installed(const std::string& identifier) {
    const std::lock_guard guard(mutex_);
    installed_.insert(identifier);
}

void SessionFacts::removed(const std::string& identifier) {
    const std::lock_guard guard(mutex_);
    removed_.insert(identifier);
}

void SessionFacts::requested(const std::string& identifier) {
    const std::lock_guard guard(mutex_);
    requests_.push_back(identifier);
}

void SessionFacts::reconciled() {
    const std::lock_guard guard(mutex_);
    isReconciled_ = true;
}

void SessionFacts::sent(std::uint64_t bytes) {
    const std::lock_guard guard(mutex_);
    bytesSent_ += bytes;
}

std::optional<std::string> SessionFacts::firstFailure(const std::string& identifier) const {
    const std::lock_guard guard(mutex_);
    const auto found = failures_.find(identifier);
    if (found == failures_.end()) return std::nullopt;
    return found->second;
}

void SessionFacts::heldByClient(const std::string& identifier, CoordinationClient client) {
    const std::lock_guard guard(mutex_);
    holders_[identifier] = client;
}

std::optional<CoordinationClient> SessionFacts::holder(const std::string& identifier) const {
    const std::lock_guard guard(mutex_);
    const auto found = holders_.find(identifier);
    return found != holders_.end() ? std::optional(found->second) : std::nullopt;
}

std::set<std::string> SessionFacts::installedIdentifiers() const {
    const std::lock_guard guard(mutex_);
    return installed_;
}

bool SessionFacts::wasInstalled(const std::string& identifier) const {
    const std::lock_guard guard(mutex_);
    return installed_.contains(identifier);
}

bool SessionFacts::wasReconciled() const {
    const std::lock_guard guard(mutex_);
    return isReconciled_;
}

bool SessionFacts::wasRemoved(const std::string& identifier) const {
    const std::lock_guard guard(mutex_);
    return removed_.contains(identifier);
}

std::vector<std::string> SessionFacts::requests() const {
    const std::lock_guard guard(mutex_);
    return requests_;
}

std::uint64_t SessionFacts::bytesSent() const {
    const std::lock_guard guard(mutex_);
    return bytesSent_;
}

void SessionFacts::policyAnswered(PolicyFeature feature, PolicyAnswer answer) {
    const std::lock_guard guard(mutex_);
    answers_[feature] = answer;
}

bool SessionFacts::wasForbidden(PolicyFeature feature) const {
    const std::lock_guard guard(mutex_);
    const auto found = answers_.find(feature);
    return found != answers_.end() && found->second == PolicyAnswer::No;
}

}  // namespace appsync
