#pragma once

#include <algorithm>
#include <charconv>
#include <concepts>
#include <cstddef>
#include <string>
#include <string_view>

namespace appsync {

/// Text in the making, of many small pieces: room for a usual line is taken at once.
class LineBuffer {
  public:
    LineBuffer() : room_(kUsualLength, '\0') {}

    [[nodiscard]] std::string_view text() const { return {room_.data(), size_}; }
    [[nodiscard]] bool isEmpty() const { return size_ == 0; }
    /// Of one that is not empty.
    [[nodiscard]] char last() const { return room_[size_ - 1]; }
    void clear() { size_ = 0; }

    void put(char character) {
        makeRoom(1);
        room_[size_++] = character;
    }
    void put(std::string_view text) {
        makeRoom(text.size());
        size_ += text.copy(room_.data() + size_, text.size());
    }
    template <std::integral Number>
    void putNumber(Number number, int base = 10) {
        constexpr std::size_t kLongest = 24;  // of those in use, 10 and 16
        makeRoom(kLongest);
        char* const begin = room_.data() + size_;
        char* const end = std::to_chars(begin, begin + kLongest, number, base).ptr;
        size_ += static_cast<std::size_t>(end - begin);
    }

  private:
    /// Most lines are shorter.
    static constexpr std::size_t kUsualLength = 320;

    void makeRoom(std::size_t count) {
        if (room_.size() - size_ >= count) return;
        room_.resize(std::max(2 * room_.size(), size_ + count));
    }

    std::string room_;
    std::size_t size_ = 0;  // of it that is text
};

}  // namespace appsync
