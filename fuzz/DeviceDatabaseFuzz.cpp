#include <cstddef>
#include <cstdint>

#include "fuzz/Fuzz.h"
#include "fuzz/readers/DatabaseReader.h"

namespace {

constexpr std::size_t kPageSize = 512;  // of the databases in the corpus

}  // namespace

extern "C" std::size_t LLVMFuzzerMutate(std::uint8_t* data, std::size_t size, std::size_t most);

/// Mostly within one page, so that the others stay where they are looked for.
extern "C" std::size_t LLVMFuzzerCustomMutator(std::uint8_t* data, std::size_t size,
                                               std::size_t most, unsigned int seed) {
    const std::size_t pages = size / kPageSize;
    if (pages == 0 || seed % 4 == 0) return LLVMFuzzerMutate(data, size, most);
    std::uint8_t* page = data + (seed / 4) % pages * kPageSize;
    LLVMFuzzerMutate(page, kPageSize, kPageSize);
    return size;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    return appsync::fuzz({data, size}, {appsync::readDeviceDatabase});
}
