#pragma once

#include <gtest/gtest.h>

#include <ostream>
#include <string>
#include <vector>

#include "contract/ContractKit.h"

namespace appsync {

/// The ports that the suites run over. Set before GoogleTest is initialised, which asks for them.
void setContractPorts(std::vector<ContractPort> ports);

/// Those of them that can make a system, or a device, which has the services.
std::vector<ContractPort> systemPorts(const std::vector<OptionalService>& services = {});
std::vector<ContractPort> devicePorts(const std::vector<OptionalService>& services = {});

inline std::ostream& operator<<(std::ostream& out, const ContractPort& port) {
    return out << port.name;
}

/// The name of a parameterised test: that of the port.
inline std::string nameOfPort(const testing::TestParamInfo<ContractPort>& info) {
    return info.param.name;
}

// Runs the suite over the ports that the generator gives, which may be none.
#define APPSYNC_CONTRACT_SUITE(Suite, ports)              \
    GTEST_ALLOW_UNINSTANTIATED_PARAMETERIZED_TEST(Suite); \
    INSTANTIATE_TEST_SUITE_P(, Suite, testing::ValuesIn(ports), nameOfPort)

}  // namespace appsync
