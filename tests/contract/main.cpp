#include <string_view>

#include "tests/contract/BadPorts.h"
#include "tests/contract/OurPorts.h"

// Runs the contract's suites over our implementations, like any GoogleTest program; as the kit runs
// them over those of a port when the first argument is --kit, and so over bad ones when it is
// --kit-over-bad-ports.
int main(int argc, char** argv) {
    using namespace appsync;
    const std::string_view how = argc > 1 ? argv[1] : "";
    if (how == "--kit-over-bad-ports") return runContractKit(argc - 1, argv + 1, badPorts());
    const std::vector<ContractPort> ports{
        simulatedPort("Simulation", Scheduling::runToCompletion()),
        simulatedPort("SimulationInterleaved", Scheduling::seeded(1)),
        simulatedPort("SimulationInterleavedOtherwise", Scheduling::seeded(2)), posixPort(),
        referencePort()};
    if (how == "--kit") return runContractKit(argc - 1, argv + 1, ports);
    return runContractSuites(argc, argv, ports);
}
