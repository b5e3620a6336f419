#include "platform/PropertyListKeyIndex.h"

#include <bit>
#include <chrono>
#include <cstring>
#include <exception>
#include <random>
#include <utility>

namespace appsync {

namespace {

/// SipHash-1-3: short, and an attacker who does not know the key cannot make keys collide.
class SipHash {
  public:
    explicit SipHash(const PropertyListKeyIndex::HashKey& key) noexcept
        : a_(key.first ^ 0x736f6d6570736575U),
          b_(key.second ^ 0x646f72616e646f6dU),
          c_(key.first ^ 0x6c7967656e657261U),
          d_(key.second ^ 0x7465646279746573U) {}

    std::uint64_t operator()(std::string_view text) noexcept {
        const char* at = text.data();
        std::size_t left = text.size();
        for (; left >= 8; at += 8, left -= 8) absorb(word<std::uint64_t>(at));
        absorb(tail(at, left) | std::uint64_t{text.size()} << 56U);
        c_ ^= 0xffU;
        for (int i = 0; i < 3; ++i) round();
        return a_ ^ b_ ^ c_ ^ d_;
    }

  private:
    template <typename Word>
    static std::uint64_t word(const char* at) noexcept {
        Word result = 0;
        std::memcpy(&result, at, sizeof(result));
        return result;
    }

    // At most 7 bytes. Loads of fixed sizes, two of which may overlap, cost less than a copy.
    static std::uint64_t tail(const char* at, std::size_t size) noexcept {
        if (size >= 4) {
            return word<std::uint32_t>(at) | word<std::uint32_t>(at + size - 4) << 8 * (size - 4);
        }
        if (size == 0) return 0;
        const auto byte = [at](std::size_t i) { return word<std::uint8_t>(at + i); };
        return byte(0) | byte(size / 2) << 8 * (size / 2) | byte(size - 1) << 8 * (size - 1);
    }

    void absorb(std::uint64_t word) noexcept {
        d_ ^= word;
        round();
        a_ ^= word;
    }

    void round() noexcept {
        a_ += b_, b_ = std::rotl(b_, 13) ^ a_, a_ = std::rotl(a_, 32);
        c_ += d_, d_ = std::rotl(d_, 16) ^ c_;
        a_ += d_, d_ = std::rotl(d_, 21) ^ a_;
        c_ += b_, b_ = std::rotl(b_, 17) ^ c_, c_ = std::rotl(c_, 32);
    }

    std::uint64_t a_, b_, c_, d_;
};

}  // namespace

PropertyListKeyIndex::HashKey PropertyListKeyIndex::drawHashKey(
    const std::function<std::uint32_t()>& random) noexcept {
    try {
        const auto draw = [&random] { return std::uint64_t{random()} << 32U | random(); };
        return {draw(), draw()};
    } catch (const std::exception&) {
        const auto now = std::chrono::steady_clock::now().time_since_epoch().count();
        return {static_cast<std::uint64_t>(now), 0x9e3779b97f4a7c15U};
    }
}

std::uint32_t PropertyListKeyIndex::hashOf(std::string_view text) noexcept {
    static const HashKey key = drawHashKey([] { return std::uint32_t{std::random_device()()}; });
    return static_cast<std::uint32_t>(SipHash(key)(text));
}

void PropertyListKeyIndex::makeRoom() {
    if ((count_ + 1) * 2 > slots_.size()) grow();
}

void PropertyListKeyIndex::add(std::uint32_t hash, std::size_t position) {
    makeRoom();
    place({hash, static_cast<std::uint32_t>(position)});
    ++count_;
}

void PropertyListKeyIndex::erase(std::size_t position) {
    std::vector<Slot> old(slots_.size());
    slots_.swap(old);
    for (Slot slot : old) {
        if (slot.position == kFree || slot.position == position) continue;
        if (slot.position > position) --slot.position;
        place(slot);
    }
    --count_;
}

void PropertyListKeyIndex::place(Slot slot) noexcept {
    const std::size_t mask = slots_.size() - 1;
    std::size_t i = slot.hash & mask;
    while (slots_[i].position != kFree) i = (i + 1) & mask;
    slots_[i] = slot;
}

void PropertyListKeyIndex::grow() {
    std::vector<Slot> old(slots_.empty() ? 64 : slots_.size() * 2);
    slots_.swap(old);
    for (const Slot slot : old) {
        if (slot.position != kFree) place(slot);
    }
}

}  // namespace appsync
