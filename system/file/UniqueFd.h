#pragma once

#include <utility>

namespace appsync {

/// Owns a file descriptor and closes it. Not safe for use by several threads at once.
class UniqueFd {
  public:
    UniqueFd() = default;
    /// Takes `descriptor` over; a negative one is none.
    explicit UniqueFd(int descriptor) noexcept : descriptor_(descriptor) {}
    UniqueFd(UniqueFd&& other) noexcept : descriptor_(other.release()) {}
    UniqueFd& operator=(UniqueFd&& other) noexcept {
        if (this != &other) reset(other.release());
        return *this;
    }
    UniqueFd(const UniqueFd&) = delete;
    UniqueFd& operator=(const UniqueFd&) = delete;
    ~UniqueFd() { reset(); }

    /// The descriptor, still owned; -1 when there is none.
    [[nodiscard]] int get() const noexcept { return descriptor_; }
    [[nodiscard]] bool valid() const noexcept { return descriptor_ >= 0; }
    explicit operator bool() const noexcept { return valid(); }

    /// Hands the descriptor to the caller, who closes it.
    [[nodiscard]] int release() noexcept { return std::exchange(descriptor_, -1); }
    /// Closes what it holds and takes `descriptor` over. errno is left as it was.
    void reset(int descriptor = -1) noexcept;

  private:
    int descriptor_ = -1;
};

}  // namespace appsync
