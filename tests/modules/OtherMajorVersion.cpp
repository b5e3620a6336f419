#include "platform/PlugInTable.h"

namespace {

// What stands behind the versions may be anything in another major version.
constexpr appsync::PlugInTable kOther = {appsync::kModuleMajorVersion + 41, 3, "9.9.9", nullptr,
                                         nullptr};

}  // namespace

const appsync::PlugInTable* appsyncPlugInTable() noexcept { return &kOther; }
