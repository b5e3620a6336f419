#include "host/serve/http/Connection.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <utility>

namespace appsync {
namespace {

using ConnectionClock = std::chrono::steady_clock;

constexpr std::string_view kEndOfHead = "\r\n\r\n";
constexpr std::chrono::milliseconds kLongestFarewell{200};
constexpr int kMostFarewells = 64;

}  // namespace

Connection::Connection(UniqueFd socket) : socket_(std::move(socket)) {}

Connection::Head Connection::readHead() {
    buffer_.erase(0, std::exchange(headSize_, 0));
    taken_ = 0;
    Time deadline = ConnectionClock::now() + kLongestIdle;
    bool hasBegun = !buffer_.empty();
    std::size_t looked = 0;
    for (;;) {
        const std::size_t end = buffer_.find(kEndOfHead, looked);
        looked = buffer_.size() - std::min(buffer_.size(), kEndOfHead.size() - 1);
        if (end <= kLongestHead) {
            headSize_ = end + kEndOfHead.size();
            return Head::Whole;
        }
        if (buffer_.size() > kLongestHead) return Head::TooLong;
        const Arrival arrival = receive(deadline);
        if (arrival == Arrival::End) return Head::Gone;
        if (arrival == Arrival::Late) return hasBegun ? Head::TooSlow : Head::Gone;
        if (!std::exchange(hasBegun, true)) deadline = ConnectionClock::now() + kLongestSending;
    }
}

std::string_view Connection::rest() const {
    return std::string_view(buffer_).substr(taken_, headSize_ - taken_);
}

void Connection::take(std::size_t count) { taken_ += std::min(count, headSize_ - taken_); }

bool Connection::write(std::string_view bytes) {
    const Time deadline =
        ConnectionClock::now() + kLongestSending + std::chrono::seconds(bytes.size() / kLeastRate);
    while (!bytes.empty()) {
        const ssize_t count =
            ::send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
        if (count > 0) {
            bytes.remove_prefix(static_cast<std::size_t>(count));
            continue;
        }
        if (count < 0 && errno == EINTR) continue;
        if (count < 0 && errno != EAGAIN && errno != EWOULDBLOCK) return false;
        if (!waitFor(POLLOUT, deadline)) return false;
    }
    return true;
}

void Connection::shutDown() const { ::shutdown(socket_.get(), SHUT_RDWR); }

void Connection::close() {
    ::shutdown(socket_.get(), SHUT_WR);
    const Time deadline = ConnectionClock::now() + kLongestFarewell;
    for (int each = 0; each < kMostFarewells && receive(deadline) == Arrival::Piece; ++each) {
        buffer_.clear();
    }
}

Connection::Arrival Connection::receive(Time deadline) {
    std::array<char, 4096> piece{};
    for (;;) {
        const ssize_t count = ::recv(socket_.get(), piece.data(), piece.size(), MSG_DONTWAIT);
        if (count > 0) {
            buffer_.append(piece.data(), static_cast<std::size_t>(count));
            return Arrival::Piece;
        }
        if (count == 0) return Arrival::End;
        if (errno == EINTR) continue;
        if (errno != EAGAIN && errno != EWOULDBLOCK) return Arrival::End;
        if (!waitFor(POLLIN, deadline)) return Arrival::Late;
    }
}

bool Connection::waitFor(short event, Time deadline) const {
    for (;;) {
        const auto left =
            std::chrono::ceil<std::chrono::milliseconds>(deadline - ConnectionClock::now());
        if (left.count() <= 0) return false;
        pollfd source = {socket_.get(), event, 0};
        const int ready = ::poll(&source, 1, static_cast<int>(left.count()));
        if (ready > 0) return true;
        if (ready < 0 && errno != EINTR) return false;
    }
}

}  // namespace appsync
