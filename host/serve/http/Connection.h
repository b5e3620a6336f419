#pragma once

#include <chrono>
#include <cstddef>
#include <string>
#include <string_view>

#include "system/file/UniqueFd.h"

namespace appsync {

// What one connection may take. A browser sends heads of one or two KiB.
inline constexpr std::size_t kLongestHead = std::size_t{16} << 10U;
inline constexpr std::chrono::seconds kLongestIdle{5};
inline constexpr std::chrono::seconds kLongestSending{5};
// A piece of an answer has as long, and a second more for each of these bytes of it.
inline constexpr std::size_t kLeastRate = std::size_t{100} << 10U;

/// One connection of a server's: reads no more than the heads of requests, and waits for nobody
/// longer than the bounds above say. Used by one thread; `shutDown` may be called on any.
class Connection {
  public:
    explicit Connection(UniqueFd socket);

    enum class Head {
        Whole,
        Gone,     // the other side has closed, or sent nothing
        TooLong,  // no end within `kLongestHead`
        TooSlow,  // it began, and did not end in time
    };
    /// Waits for the next request and reads its head.
    [[nodiscard]] Head readHead();
    /// The bytes of the head that have not been taken.
    [[nodiscard]] std::string_view rest() const;
    void take(std::size_t count);

    /// Whether all of it went to the system in time.
    [[nodiscard]] bool write(std::string_view bytes);

    /// No more is read or written; whoever waits goes on.
    void shutDown() const;
    /// Ends the answers, and waits a moment for the other side to have read them: what it still
    /// sends would make the system take them back.
    void close();

    [[nodiscard]] int descriptor() const { return socket_.get(); }

  private:
    using Time = std::chrono::steady_clock::time_point;

    enum class Arrival { Piece, End, Late };
    [[nodiscard]] Arrival receive(Time deadline);
    [[nodiscard]] bool waitFor(short event, Time deadline) const;

    const UniqueFd socket_;
    std::string buffer_;        // the head, and what has been received behind it
    std::size_t headSize_ = 0;  // 0 where it is not whole
    std::size_t taken_ = 0;     // of the head
};

}  // namespace appsync
