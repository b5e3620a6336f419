#include <cstddef>
#include <cstdint>

#include "fuzz/Fuzz.h"
#include "fuzz/readers/PluginReaders.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace appsync;
    return fuzz({data, size}, {readOnDevice<readRestoreState, Installs::Direct>,
                               readOnDevice<readRestoreState, Installs::Coordinated>});
}
