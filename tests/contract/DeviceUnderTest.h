#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

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

/// What a package or placeholder bundle says of itself.
struct BundleInfo {
    std::string identifier;
    std::string version = "1.0";
    std::string displayName = "Example";
};

/// One implementation of a device's services, and what the contract tests need to do beside them.
/// Made anew for each test: an empty device.
///
/// Whoever ports the plug-in writes one of these and adds it to `deviceImplementations()`.
class DeviceUnderTest {
  public:
    virtual ~DeviceUnderTest() = default;

    /// Lives as long as this object.
    virtual Platform services() = 0;

    /// Puts a package that can be installed on the device. Gives its device path.
    virtual std::string addPackage(const BundleInfo& info) = 0;

    // What a person or a manager does on the device.
    /// Starts an application that is installed. False when something keeps it from running.
    virtual bool run(const std::string& identifier) = 0;
    virtual void quit(const std::string& identifier) = 0;
    virtual void uninstallAsPerson(const std::string& identifier) = 0;
    virtual void setPolicy(PolicyFeature feature, PolicyAnswer answer) = 0;
    virtual void addRestoreData(const std::string& identifier) = 0;

    /// The transaction log's scenarios: "scenario|identifier|yes|description", oldest first.
    virtual std::vector<std::string> scenarios() = 0;
};

struct DeviceImplementation {
    std::string name;
    std::function<std::unique_ptr<DeviceUnderTest>()> make;
};

inline std::ostream& operator<<(std::ostream& out, const DeviceImplementation& implementation) {
    return out << implementation.name;
}

/// Every implementation that the contract tests run over.
std::vector<DeviceImplementation> deviceImplementations();

/// Those of them that can coordinate installs.
std::vector<DeviceImplementation> coordinatingDeviceImplementations();

/// The name of a parameterised test: that of the implementation.
inline std::string nameOfDevice(const testing::TestParamInfo<DeviceImplementation>& info) {
    return info.param.name;
}

/// A test of the contract of one of a device's services.
class DeviceContract : public testing::TestWithParam<DeviceImplementation> {
  protected:
    DeviceContract();

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

/// Install options of a package, and of a placeholder.
[[nodiscard]] PropertyList packageOptions(const std::string& identifier);
[[nodiscard]] PropertyList placeholderOptions(const std::string& identifier,
                                              std::uint64_t installType);

}  // namespace appsync
