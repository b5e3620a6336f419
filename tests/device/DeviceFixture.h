#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "device/Device.h"
#include "device/values/DeviceError.h"
#include "platform/AppRegistry.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {

/// What is on the devices of the tests.
inline constexpr const char* kAtlas = "com.example.atlas";
inline constexpr const char* kBoat = "com.example.boat";
inline constexpr const char* kBrook = "com.example.brook";
inline constexpr const char* kCrane = "com.example.crane";

/// A directory of its own for each test, an empty device in it, and packages for it.
class DeviceFixture : public ::testing::Test {
  protected:
    DeviceFixture();
    ~DeviceFixture() override;

    /// The device, opened for a session with the first call.
    [[nodiscard]] Device& device();
    /// Ends the session, if there is one.
    void close() { device_.reset(); }
    /// Another handle on the device.
    [[nodiscard]] std::unique_ptr<Device> look() const;

    /// A path of this machine: of the test's directory, of the device, of the device's root.
    [[nodiscard]] std::string path(std::string_view name) const;
    [[nodiscard]] std::string devicePath(std::string_view name = "") const;
    [[nodiscard]] std::string rootPath(std::string_view devicePath) const;

    /// Puts a package into the public staging directory. Gives its device path.
    std::string stagePackage(const std::string& identifier, const std::string& version = "1.0");
    Status install(const std::string& identifier, const std::string& version = "1.0");
    /// Installs what the options name from the file at a device path.
    Status installFrom(const std::string& package, const std::string& identifier);

    /// Makes a placeholder bundle in the temporary directory. Gives its device path.
    std::string stagePlaceholder(const std::string& identifier, const std::string& version = "1.0");
    Status installPlaceholder(const std::string& identifier,
                              std::uint64_t installType = kInstallTypeSync);

    [[nodiscard]] std::optional<AppProxy> application(const std::string& identifier);
    /// What answers when placeholders are looked at too.
    [[nodiscard]] std::optional<AppProxy> either(const std::string& identifier);
    /// The progress record of the identifier; null when there is none.
    [[nodiscard]] std::shared_ptr<InstallProgressRecord> progressOf(const std::string& identifier);

    /// The names of the containers on disk.
    [[nodiscard]] std::vector<std::string> containers() const;
    [[nodiscard]] std::string read(const std::string& devicePath) const;
    void write(const std::string& devicePath, std::string_view contents) const;
    [[nodiscard]] bool exists(const std::string& devicePath) const;

    /// Runs a statement on the database of the device, which may be open.
    void sql(const std::string& statement) const;
    [[nodiscard]] std::int64_t number(const std::string& query) const;

  private:
    std::string directory_;
    std::unique_ptr<Device> device_;
};

/// An Info.plist of these values, as XML.
[[nodiscard]] std::string infoOf(const std::string& identifier, const std::string& version);
/// The bytes of a package of these values.
[[nodiscard]] std::string packageOf(const std::string& identifier, const std::string& version);

[[nodiscard]] ::testing::AssertionResult succeeded(const Status& status);
/// Whether it failed with that error, by a sentence that holds the text.
[[nodiscard]] ::testing::AssertionResult refusedBy(const Status& status, RegistryErrorCode code,
                                                   std::string_view text = "");
[[nodiscard]] ::testing::AssertionResult unusable(const Result<std::unique_ptr<Device>>& device,
                                                  DeviceErrorCode code, std::string_view text = "");

}  // namespace appsync
