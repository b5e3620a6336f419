#pragma once

#include <cstddef>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "platform/PropertyList.h"

namespace appsync {

/// A set of identifiers that several threads may use at once. Each call is whole in itself and
/// calls nothing outside, so its mutex is never held across a call of the platform.
class SharedIdentifierSet {
  public:
    void insert(const std::string& identifier) {
        const std::lock_guard guard(mutex_);
        identifiers_.insert(identifier);
    }
    void erase(const std::string& identifier) {
        const std::lock_guard guard(mutex_);
        identifiers_.erase(identifier);
    }
    void clear() {
        const std::lock_guard guard(mutex_);
        identifiers_.clear();
    }
    /// What is in it at this moment.
    [[nodiscard]] std::set<std::string> contents() const {
        const std::lock_guard guard(mutex_);
        return identifiers_;
    }

  private:
    mutable std::mutex mutex_;
    std::set<std::string> identifiers_;  // protected by mutex_
};

/// The identifiers as a list, for messages.
[[nodiscard]] inline PropertyList listOf(const std::set<std::string>& identifiers) {
    return PropertyList::strings(std::vector<std::string>(identifiers.begin(), identifiers.end()));
}

}  // namespace appsync
