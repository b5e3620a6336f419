#pragma once

#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/DevicePolicyService.h"
#include "platform/InstallPromises.h"

namespace appsync {

/// What was seen of each application in one session. Callable on any thread.
class SessionFacts {
  public:
    /// Keeps the error unless the application has one already: the first cause is what counts.
    void failed(const std::string& identifier, const std::string& error);
    void installed(const std::string& identifier);
    void removed(const std::string& identifier);
    void requested(const std::string& identifier);
    /// The device has taken over what the host asks for, and done all removals.
    void reconciled();
    void sent(std::uint64_t bytes);
    /// The plug-in was told whether it may; its last answer is what it went by.
    void policyAnswered(PolicyFeature feature, PolicyAnswer answer);
    /// Another client of the coordination service has the install of it in hand.
    void heldByClient(const std::string& identifier, CoordinationClient client);

    [[nodiscard]] std::optional<std::string> firstFailure(const std::string& identifier) const;
    [[nodiscard]] bool wasInstalled(const std::string& identifier) const;
    /// Everything that was.
    [[nodiscard]] std::set<std::string> installedIdentifiers() const;
    [[nodiscard]] std::optional<CoordinationClient> holder(const std::string& identifier) const;
    [[nodiscard]] bool wasReconciled() const;
    [[nodiscard]] bool wasRemoved(const std::string& identifier) const;
    /// In the order in which the device asked.
    [[nodiscard]] std::vector<std::string> requests() const;
    [[nodiscard]] std::uint64_t bytesSent() const;
    [[nodiscard]] bool wasForbidden(PolicyFeature feature) const;

  private:
    mutable std::mutex mutex_;
    // Guarded by mutex_.
    std::map<std::string, std::string> failures_;
    std::set<std::string> installed_;
    std::map<std::string, CoordinationClient> holders_;
    std::set<std::string> removed_;
    std::vector<std::string> requests_;
    bool isReconciled_ = false;
    std::uint64_t bytesSent_ = 0;
    std::map<PolicyFeature, PolicyAnswer> answers_;
};

}  // namespace appsync
