#include "system/file/RandomBytes.h"

#include <algorithm>
#include <array>
#include <cstddef>

#include <sys/random.h>
#include <sys/types.h>

namespace appsync {

namespace {

/// What a thread has asked for and not used yet.
struct RandomStore {
    std::array<std::uint8_t, 256> bytes{};
    std::size_t left = 0;
};

thread_local RandomStore randomStore;

// So many at once come whole, whatever signals come.
bool refill(RandomStore& store) {
    const auto size = static_cast<ssize_t>(store.bytes.size());
    if (::getrandom(store.bytes.data(), store.bytes.size(), 0) != size) return false;
    store.left = store.bytes.size();
    return true;
}

}  // namespace

bool fillWithRandomBytes(std::span<std::uint8_t> bytes) {
    RandomStore& store = randomStore;
    if (bytes.size() > store.bytes.size()) return false;
    if (bytes.size() > store.left && !refill(store)) return false;
    store.left -= bytes.size();
    const auto from = store.bytes.begin() + static_cast<std::ptrdiff_t>(store.left);
    std::copy_n(from, bytes.size(), bytes.begin());
    return true;
}

}  // namespace appsync
