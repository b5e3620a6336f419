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

template <typename Predicate>
std::vector<ContractPort> portsThat(Predicate can) {
    std::vector<ContractPort> found;
    std::copy_if(allPorts().begin(), allPorts().end(), std::back_inserter(found), can);
    return found;
}

}  // namespace

void setContractPorts(std::vector<ContractPort> ports) { allPorts() = std::move(ports); }

std::vector<ContractPort> systemPorts() {
    return portsThat([](const ContractPort& port) { return port.makeSystem != nullptr; });
}

std::vector<ContractPort> devicePorts(const std::vector<OptionalService>& services) {
    return portsThat([&](const ContractPort& port) {
        return port.makeDevice != nullptr &&
               std::none_of(services.begin(), services.end(),
                            [&](OptionalService service) { return port.absent.contains(service); });
    });
}

}  // namespace appsync
