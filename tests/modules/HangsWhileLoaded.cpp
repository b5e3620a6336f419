#include <unistd.h>

#include "platform/PlugInTable.h"

namespace {

int begin() {
    while (true) ::pause();
}

[[maybe_unused]] const int kBegun = begin();

}  // namespace

const appsync::PlugInTable* appsyncPlugInTable() noexcept { return nullptr; }
