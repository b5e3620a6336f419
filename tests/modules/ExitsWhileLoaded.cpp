#include <cstdlib>

#include "platform/PlugInTable.h"

namespace {

int begin() { std::_Exit(3); }

[[maybe_unused]] const int kBegun = begin();

}  // namespace

const appsync::PlugInTable* appsyncPlugInTable() noexcept { return nullptr; }
