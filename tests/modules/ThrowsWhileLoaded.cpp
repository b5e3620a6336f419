#include <stdexcept>

#include "platform/PlugInTable.h"

namespace {

int begin() { throw std::runtime_error("no licence"); }

[[maybe_unused]] const int kBegun = begin();

}  // namespace

const appsync::PlugInTable* appsyncPlugInTable() noexcept { return nullptr; }
