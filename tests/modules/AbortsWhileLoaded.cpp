#include <cstdlib>

#include "platform/PlugInTable.h"

namespace {

int begin() { std::abort(); }

[[maybe_unused]] const int kBegun = begin();

}  // namespace

const appsync::PlugInTable* appsyncPlugInTable() noexcept { return nullptr; }
