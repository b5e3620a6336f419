#include "tests/contract/BadPorts.h"

#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <functional>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>

#include "contract/forwarding/ForwardingAppRegistry.h"
#include "tests/contract/OurPorts.h"

namespace appsync {
namespace {

using Answer = std::function<bool()>;

class BadRegistry : public ForwardingAppRegistry {
  public:
    BadRegistry(AppRegistry& good, Answer answer)
        : ForwardingAppRegistry(good), answer_(std::move(answer)) {}

    [[nodiscard]] bool isApplicationInstalled(const std::string&) override { return answer_(); }

  private:
    const Answer answer_;
};

class BadDevice : public DeviceUnderTest {
  public:
    explicit BadDevice(Answer answer)
        : good_(makeSimulatedDevice(Scheduling::runToCompletion())),
          registry_(good_->services().registry, std::move(answer)) {}

    Platform services() override {
        const Platform good = good_->services();
        return {good.host,          good.log,           registry_,
                good.installer,     good.coordination,  good.policy,
                good.backup,        good.homeScreen,    good.icons,
                good.transactions,  good.queues,        good.files,
                good.propertyLists, good.notifications, good.notificationCenter};
    }
    std::string addPackage(const BundleInfo& info) override { return good_->addPackage(info); }

  private:
    const std::unique_ptr<DeviceUnderTest> good_;
    BadRegistry registry_;
};

ContractPort badPort(const std::string& name, const Answer& answer) {
    return {name, nullptr, [answer] { return std::make_unique<BadDevice>(answer); }, {}};
}

}  // namespace

std::vector<ContractPort> badPorts() {
    return {badPort("Crashes", []() -> bool { std::abort(); }),
            badPort("Hangs",
                    [] {
                        std::this_thread::sleep_for(std::chrono::hours(1));
                        return false;
                    }),
            badPort("HangsInSilence",
                    [] {
                        ::closefrom(STDIN_FILENO);  // what the kit hears it through, too
                        std::this_thread::sleep_for(std::chrono::hours(1));
                        return false;
                    }),
            badPort("Throws", []() -> bool { throw std::runtime_error("out of order"); }),
            badPort("Denies", [] { return false; })};
}

}  // namespace appsync
