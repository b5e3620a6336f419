// prove: runs the contract kit over the device.

#include <stdlib.h>

#include "Device.h"
#include "contract/ContractKit.h"

using namespace appsync;

namespace {

/// A new device for each test, in a directory that goes with it.
class DeviceToProve : public DeviceUnderTest {
  public:
    ~DeviceToProve() override {
        device_.reset();
        std::filesystem::remove_all(directory_);
    }

    Platform services() override { return device_->platform(); }

    bool reopen() override {
        device_.reset();
        device_ = std::make_unique<port::Device>(directory_);
        return true;
    }

    std::string addPackage(const BundleInfo& info) override {
        const Platform platform = services();
        const auto bytes = platform.propertyLists.serialize(
            PropertyList::map({{BundleIdentifierKey, info.identifier},
                               {BundleVersionKey, info.version},
                               {BundleDisplayNameKey, info.displayName}}),
            PropertyListFormat::Binary);
        const std::string path = platform.files.temporaryDirectory() + "/" + info.identifier;
        platform.files.createFile(path, *bytes, {}).ignore();
        return path;
    }

  private:
    static std::string makeDirectory() {
        std::string pattern = std::filesystem::temp_directory_path() / "port-XXXXXX";
        return ::mkdtemp(pattern.data());
    }

    const std::string directory_ = makeDirectory();
    std::unique_ptr<port::Device> device_ = std::make_unique<port::Device>(directory_);
};

}  // namespace

int main(int argc, char** argv) {
    using enum OptionalService;
    return runContractKit(
        argc, argv,
        {{.name = "Port",
          .makeSystem = {},  // that of system/, which is proven
          .makeDevice = [] { return std::make_unique<DeviceToProve>(); },
          .absent = {Coordination, Transfers, HomeScreen, Icons, Policy, Backup, UninstalledList,
                     TransactionLog, Notifications, NotificationCenter}}});
}
