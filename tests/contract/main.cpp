#include <cstring>

#include "tests/contract/OurPorts.h"

// Runs the contract's suites over our implementations, like any GoogleTest program; as the kit runs
// them over those of a port when the first argument is --kit.
int main(int argc, char** argv) {
    using namespace appsync;
    const std::vector<ContractPort> ports{
        simulatedPort("Simulation", Scheduling::runToCompletion()),
        simulatedPort("SimulationInterleaved", Scheduling::seeded(1)),
        simulatedPort("SimulationInterleavedOtherwise", Scheduling::seeded(2)), posixPort(),
        referencePort()};
    if (argc > 1 && std::strcmp(argv[1], "--kit") == 0) {
        return runContractKit(argc - 1, argv + 1, ports);
    }
    return runContractSuites(argc, argv, ports);
}
