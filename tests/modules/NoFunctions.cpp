#include "platform/PlugInTable.h"

namespace {

constexpr appsync::PlugInTable kEmpty = {appsync::kModuleMajorVersion, appsync::kModuleMinorVersion,
                                         "0", nullptr, nullptr};

}  // namespace

const appsync::PlugInTable* appsyncPlugInTable() noexcept { return &kEmpty; }
