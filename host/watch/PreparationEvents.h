#pragma once

#include <cstddef>
#include <cstdint>
#include <mutex>
#include <string>

namespace appsync {

class SyncEvents;

/// Tells of what a sync does before its first transfer, in three equal parts: the packages of the
/// library are read, then staged, then the device asks for them. How large the whole is, is known
/// as soon as the packages are counted. Callable on any thread.
class PreparationEvents {
  public:
    /// Tells nobody where there are no events. They must outlive it.
    explicit PreparationEvents(SyncEvents* events) : events_(events) {}

    // In this order; a part may be left out.

    void read(std::size_t done, std::size_t count);
    void staged(std::size_t done, std::size_t count);
    /// One more of so many.
    void asked(std::size_t count);

    /// What came of it, once; nothing is told of it after this. Nothing where it has not begun.
    void finish();
    void fail(const std::string& why);

  private:
    enum class Part { Reading, Staging, Asking };

    [[nodiscard]] static const char* nameOf(Part part);
    void advance(Part part, std::size_t done, std::size_t count);
    void begin(std::size_t packages);
    void end(const std::string& why);

    SyncEvents* const events_;
    std::mutex mutex_;
    // Guarded by mutex_.
    std::uint64_t packages_ = 0;  // of the library: the steps of each part
    std::uint64_t done_ = 0;
    std::uint64_t total_ = 0;  // 0 before it begins
    std::size_t asked_ = 0;
    bool isOver_ = false;
};

}  // namespace appsync
