#include <cstddef>
#include <cstdint>

#include "fuzz/Fuzz.h"
#include "fuzz/readers/FileReaders.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    return appsync::fuzz({data, size}, {appsync::readSessionRecording});
}
