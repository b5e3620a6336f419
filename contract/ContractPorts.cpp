#include "contract/ContractPorts.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace appsync {
namespace {

std::vector<ContractPort>& allPorts() {
    static std::vector<ContractPort> ports;
    return ports;
}

template <typename Made>
std::vector<ContractPort> portsThatMake(std::function<Made()> ContractPort::*made,
                                        const std::vector<OptionalService>& services) {
    std::vector<ContractPort> found;
    std::copy_if(allPorts().begin(), allPorts().end(), std::back_inserter(found),
                 [&](const ContractPort& port) {
                     return port.*made && std::none_of(services.begin(), services.end(),
                                                       [&](OptionalService service) {
                                                           return port.absent.contains(service);
                                                       });
                 });
    return found;
}

}  // namespace

void setContractPorts(std::vector<ContractPort> ports) { allPorts() = std::move(ports); }

std::vector<ContractPort> systemPorts(const std::vector<OptionalService>& services) {
    return portsThatMake(&ContractPort::makeSystem, services);
}

std::vector<ContractPort> devicePorts(const std::vector<OptionalService>& services) {
    return portsThatMake(&ContractPort::makeDevice, services);
}

}  // namespace appsync
