#include "tests/contract/OurPorts.h"

int main(int argc, char** argv) {
    using namespace appsync;
    return runContractSuites(
        argc, argv,
        {simulatedPort("Simulation", Scheduling::runToCompletion()),
         simulatedPort("SimulationInterleaved", Scheduling::seeded(1)),
         simulatedPort("SimulationInterleavedOtherwise", Scheduling::seeded(2)), posixPort(),
         referencePort()});
}
