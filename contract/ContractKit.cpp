#include "contract/ContractKit.h"

#include <gtest/gtest.h>

#include <utility>

#include "contract/ContractPorts.h"
#include "contract/ContractSuites.h"

namespace appsync {

int runContractSuites(int argc, char** argv, std::vector<ContractPort> ports) {
    linkContractSuites();
    setContractPorts(std::move(ports));
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}

}  // namespace appsync
