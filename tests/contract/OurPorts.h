#pragma once

#include <memory>
#include <string>

#include "contract/ContractKit.h"
#include "simulation/scheduling/Scheduler.h"

namespace appsync {

/// What makes systems and devices of simulation/.
[[nodiscard]] ContractPort simulatedPort(const std::string& name, Scheduling scheduling);

/// What makes systems of system/ ("Posix"), and devices of device/ ("Reference").
[[nodiscard]] ContractPort posixPort();
[[nodiscard]] ContractPort referencePort();

/// The devices and systems that these are made of.
[[nodiscard]] std::unique_ptr<DeviceUnderTest> makeSimulatedDevice(Scheduling scheduling);
[[nodiscard]] std::unique_ptr<DeviceUnderTest> makeReferenceDevice();
[[nodiscard]] std::unique_ptr<SystemUnderTest> makeSimulatedSystem(Scheduling scheduling);

}  // namespace appsync
