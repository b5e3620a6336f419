#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "contract/TemporaryMachineDirectory.h"
#include "device/Device.h"
#include "host/console/Console.h"

namespace appsync {

/// A directory of its own for each test, with an empty device and an empty library in it.
class HostFixture : public testing::Test {
  protected:
    explicit HostFixture(bool coordination = false);

    /// Runs a command of appsync. Gives its exit status; `out` and `err` hold what it printed.
    int run(std::vector<std::string> arguments);
    /// `sync` of the library, printing JSON.
    int sync(std::vector<std::string> options = {});

    /// Puts an application's package into the library, as ID.zip.
    void addPackage(const std::string& identifier, const std::string& version);
    /// The same under a file name of its own.
    void addPackageAs(const std::string& file, const std::string& identifier,
                      const std::string& version);
    void write(const std::string& path, std::string_view contents);
    [[nodiscard]] std::unique_ptr<Device> open(DeviceAccess access);
    /// "identifier version" of each application, "identifier placeholder" of each placeholder.
    [[nodiscard]] std::vector<std::string> applications();

    const TemporaryMachineDirectory directory;
    const std::string device = directory.path() + "/device";
    const std::string library = directory.path() + "/library";
    const std::string root = device + "/root";
    std::ostringstream out;
    std::ostringstream err;
};

}  // namespace appsync
