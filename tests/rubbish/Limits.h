#pragma once

#include <cstdint>
#include <string>

namespace appsync {

/// Holds a reading to its limits: a second of the processor, and 64 MiB of memory. The second holds
/// where no sanitizer adds to it. In a release build the memory is what the process has grown by
/// since it began; under AddressSanitizer what the reading has asked for and not given back at any
/// time; under ThreadSanitizer, whose own memory grows with what the program has ever touched,
/// nothing.
class Limits {
  public:
    /// Begins the measurement of one reading.
    Limits();
    /// What has been exceeded since; empty when nothing has.
    [[nodiscard]] std::string exceeded() const;

  private:
    std::uint64_t begin_;
    [[maybe_unused]] std::int64_t memoryAtBegin_;
};

/// Whether AddressSanitizer or ThreadSanitizer is built in.
[[nodiscard]] bool isSanitized() noexcept;

}  // namespace appsync
