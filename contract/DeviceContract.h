#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "contract/ContractPorts.h"
#include "contract/DeviceUnderTest.h"
#include "contract/Sentence.h"
#include "platform/AppRegistry.h"
#include "platform/BackupService.h"
#include "platform/DevicePolicyService.h"
#include "platform/FileSystem.h"
#include "platform/HomeScreenService.h"
#include "platform/IconRenderer.h"
#include "platform/InstallCoordinatorService.h"
#include "platform/InstallTransactionLog.h"
#include "platform/InstallerService.h"
#include "platform/LogFacility.h"
#include "platform/Platform.h"
#include "platform/PropertyListSerialization.h"
#include "platform/WorkQueues.h"

namespace appsync {

/// A test of the contract of one of a device's services.
class DeviceContract : public testing::TestWithParam<ContractPort> {
  protected:
    DeviceContract();
    ~DeviceContract() override;

    Status installPackage(const BundleInfo& info);
    /// Installs what stands at a path as the package of the identifier.
    Status installFrom(const std::string& path, const std::string& identifier);
    /// Builds a placeholder bundle, installs it and removes what was built.
    Status installPlaceholder(const BundleInfo& info, std::uint64_t installType);
    /// Builds a placeholder bundle. Gives its path.
    std::string addPlaceholderBundle(const BundleInfo& info);

    [[nodiscard]] std::optional<AppProxy> application(const std::string& identifier);
    /// What the registry prefers, placeholders included.
    [[nodiscard]] std::optional<AppProxy> preferred(const std::string& identifier);
    /// The progress record; null when no install is under way.
    [[nodiscard]] std::shared_ptr<InstallProgressRecord> progress(const std::string& identifier);
    /// "com.example.a" or "com.example.a (placeholder)", sorted.
    [[nodiscard]] std::vector<std::string> bundles(AppRegistry::BundleType type);

    const std::unique_ptr<DeviceUnderTest> device_;
    const Platform services_;
    AppRegistry& registry_;
};

/// Lets time pass, by the clock of the queues.
void pause(WorkQueues& queues, std::chrono::nanoseconds time);

/// Install options of a package, and of a placeholder.
[[nodiscard]] PropertyList packageOptions(const std::string& identifier);
[[nodiscard]] PropertyList placeholderOptions(const std::string& identifier,
                                              std::uint64_t installType);

}  // namespace appsync
