#pragma once

#include <gtest/gtest.h>

#include <memory>

#include "contract/ContractPorts.h"
#include "contract/Sentence.h"
#include "contract/SystemUnderTest.h"

namespace appsync {

/// A test of the contract of one of these services.
class SystemContract : public testing::TestWithParam<ContractPort> {
  protected:
    SystemContract() : system_(GetParam().makeSystem()) {}
    ~SystemContract() override { checks({}, {}); }

    const std::unique_ptr<SystemUnderTest> system_;
};

}  // namespace appsync
