#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <string>

#include "simulation/SimulatedPlatform.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {

inline constexpr const char* kA = "com.example.a";
inline constexpr const char* kB = "com.example.b";

/// A platform in memory, without a client.
class SimulationFixture : public testing::Test {
  protected:
    explicit SimulationFixture(Scheduling scheduling = Scheduling::runToCompletion())
        : platform_(codec_, scheduling) {}

    /// The message of the failure that the action ends in.
    static std::string failureOf(const std::function<void()>& action) {
        try {
            action();
        } catch (const SimulationFailure& failure) {
            return failure.what();
        }
        return "no failure";
    }

    SystemPropertyLists codec_;
    SimulatedPlatform platform_;
};

}  // namespace appsync
