#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>
#include <vector>

namespace appsync {

/// Finds texts by content among texts that somebody else numbers and keeps: the keys of a large
/// map, the strings of a property list. Constant time whatever texts somebody chose, since their
/// hash is keyed with a number drawn once per process.
///
/// Not thread-safe beside an edit.
class PropertyListKeyIndex {
  public:
    /// Positions are smaller than this.
    static constexpr std::size_t kMaximumSize = UINT32_MAX;

    [[nodiscard]] static std::uint32_t hashOf(std::string_view text) noexcept;

    /// What hashes are keyed with.
    struct HashKey {
        std::uint64_t first = 0;
        std::uint64_t second = 0;
        friend bool operator==(const HashKey&, const HashKey&) = default;
    };
    /// A new key of random numbers; where `random` throws, since there are none to be had, one that
    /// changes with the clock.
    [[nodiscard]] static HashKey drawHashKey(const std::function<std::uint32_t()>& random) noexcept;

    /// The position of `text`, whose hash is `hash`; `textAt(position)` gives a text that was
    /// added.
    template <typename TextAt>
    [[nodiscard]] std::optional<std::size_t> find(std::uint32_t hash, std::string_view text,
                                                  const TextAt& textAt) const noexcept {
        if (empty()) return std::nullopt;
        const std::size_t mask = slots_.size() - 1;
        for (std::size_t i = hash & mask; slots_[i].position != kFree; i = (i + 1) & mask) {
            const Slot slot = slots_[i];
            if (slot.hash == hash && textAt(slot.position) == text) return slot.position;
        }
        return std::nullopt;
    }

    /// Has the next `add` need no memory, so that it cannot fail.
    void makeRoom();
    /// Learns that a text of this hash stands at `position`. The text is not there yet.
    void add(std::uint32_t hash, std::size_t position);

    /// Forgets the text at `position`; those behind it have moved one forward.
    void erase(std::size_t position);

    [[nodiscard]] bool empty() const noexcept { return count_ == 0; }

  private:
    static constexpr std::uint32_t kFree = UINT32_MAX;
    struct Slot {
        std::uint32_t hash = 0;
        std::uint32_t position = kFree;
    };

    void place(Slot slot) noexcept;
    void grow();

    std::vector<Slot> slots_;  // a power of two, at most half of them taken
    std::size_t count_ = 0;
};

}  // namespace appsync
