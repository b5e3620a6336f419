#pragma once

#include <cstdint>
#include <string>
#include <unordered_set>

#include "platform/PropertyList.h"

namespace appsync {

/// Which applications had been demoted when the backup was taken.
class DemotedApps {
  public:
    /// `list` is the demoted-apps list, or anything else: then nothing is demoted.
    explicit DemotedApps(const PropertyList& list);

    /// The demotion status of an application (restore/RestoredApp.h). One that was demoted both
    /// ways counts as automatically demoted.
    [[nodiscard]] std::uint64_t statusOf(const std::string& identifier) const;

  private:
    std::unordered_set<std::string> automatically_;
    std::unordered_set<std::string> intentionally_;
};

}  // namespace appsync
