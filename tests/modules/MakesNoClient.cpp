#include "platform/PlugInTable.h"

namespace {

appsync::PlugInClient makeNone(const appsync::Platform& /*platform*/) noexcept { return {}; }
void destroyNone(appsync::PlugInClient /*made*/) noexcept {}

constexpr appsync::PlugInTable kBarren = {appsync::kModuleMajorVersion,
                                          appsync::kModuleMinorVersion, "0", makeNone, destroyNone};

}  // namespace

const appsync::PlugInTable* appsyncPlugInTable() noexcept { return &kBarren; }
