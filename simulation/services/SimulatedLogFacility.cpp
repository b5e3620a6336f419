#include "simulation/services/SimulatedLogFacility.h"

#include "simulation/recording/RecordedCall.h"

namespace appsync {

void SimulatedLogFacility::write(const LogMessage& message) noexcept { recorder_.message(message); }

std::unique_ptr<LogHandle> SimulatedLogFacility::makeHandle(std::string_view subsystem,
                                                            std::string_view category) {
    RecordedCall call(recorder_, "LogFacility", "makeHandle", subsystem, category);
    return call.result(std::make_unique<SimulatedLogHandle>(subsystem, category), "a handle");
}

}  // namespace appsync
