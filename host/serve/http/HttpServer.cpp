#include "host/serve/http/HttpServer.h"

#include <arpa/inet.h>
#include <httplib.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <list>
#include <mutex>
#include <set>
#include <string_view>
#include <system_error>
#include <thread>
#include <utility>

#include <nlohmann/json.hpp>

#include "host/console/JsonWriting.h"
#include "host/serve/http/Connection.h"
#include "host/serve/http/PercentDecoding.h"
#include "system/file/PosixError.h"
#include "system/file/UniqueFd.h"

namespace appsync {
namespace {

// Each has a thread. Readers of events leave half of them to those who ask for the rest.
constexpr std::size_t kMostConnections = 512;
constexpr int kMostEventStreams = 256;
// Of those that are too many, so many are told so.
constexpr std::size_t kMostRefusals = 64;
constexpr int kBacklog = 512;
constexpr int kPortOfHttp = 80;
constexpr std::chrono::milliseconds kWithoutMeans{50};

constexpr std::string_view kContentPolicy =
    "default-src 'none'; script-src 'self'; style-src 'self'; img-src 'self'; connect-src 'self'; "
    "base-uri 'none'; form-action 'none'; frame-ancestors 'none'";

std::string messageBody(const std::string& message) { return dumped({{"message", message}}); }

std::string messageFor(int status) {
    switch (status) {
        case 404:
            return "there is nothing under this address";
        case 414:
            return "the address is too long";
        case 500:
            return "the request could not be answered: out of means";
        default:
            return "the request is none that this server knows";
    }
}

// What httplib reads a request from, and writes the answer to.
class HeadAndAnswer final : public httplib::Stream {
  public:
    explicit HeadAndAnswer(Connection& connection) : connection_(connection) {}

    [[nodiscard]] bool is_readable() const override { return !connection_.rest().empty(); }
    [[nodiscard]] bool is_writable() const override { return true; }
    // The end of the head is the end of what there is.
    ssize_t read(char* to, std::size_t size) override {
        const std::string_view rest = connection_.rest().substr(0, size);
        std::copy(rest.begin(), rest.end(), to);
        connection_.take(rest.size());
        return static_cast<ssize_t>(rest.size());
    }
    ssize_t write(const char* from, std::size_t size) override {
        return connection_.write({from, size}) ? static_cast<ssize_t>(size) : -1;
    }
    void get_remote_ip_and_port(std::string& address, int& port) const override {
        address = "127.0.0.1";
        port = 0;
    }
    void get_local_ip_and_port(std::string& address, int& port) const override {
        get_remote_ip_and_port(address, port);
    }
    [[nodiscard]] socket_t socket() const override { return connection_.descriptor(); }

  private:
    Connection& connection_;
};

bool isLook(const httplib::Request& request) {
    return request.method == "GET" || request.method == "HEAD";
}

bool hasBody(const httplib::Request& request) {
    const std::string length = request.get_header_value("Content-Length");
    return request.has_header("Transfer-Encoding") || (!length.empty() && length != "0");
}

// Takes what is served whole or not at all.
void leaveOutWhatIsNotServed(httplib::Request& request) {
    // Packing takes longer than the way to this machine.
    request.headers.erase("Accept-Encoding");
    request.headers.erase("Range");
    request.ranges.clear();
    request.headers.erase("Expect");
}

void endAfterwards(httplib::Request& request) {
    request.headers.erase("Connection");
    request.headers.emplace("Connection", "close");
}

// The part of HTTP that is httplib's: of a connection whose bytes are somebody else's.
class Protocol final : public httplib::Server {
  public:
    Protocol() { svr_sock_ = 0; }  // else it would take itself for one that is shutting down

    void end() { svr_sock_ = INVALID_SOCKET; }

    // Whether another request may follow.
    bool exchange(Connection& connection) {
        HeadAndAnswer stream(connection);
        bool isLast = false;
        bool isPlain = false;
        const auto prepare = [&isPlain](httplib::Request& request) {
            isPlain = isLook(request) && !hasBody(request);
            leaveOutWhatIsNotServed(request);
            if (!isPlain) endAfterwards(request);
        };
        return process_request(stream, false, isLast, prepare) && isPlain && !isLast;
    }
};

class EventsInFlight {
  public:
    explicit EventsInFlight(std::atomic<int>& count) : count_(count) { ++count_; }
    EventsInFlight(const EventsInFlight&) = delete;
    EventsInFlight& operator=(const EventsInFlight&) = delete;
    ~EventsInFlight() { --count_; }

  private:
    std::atomic<int>& count_;
};

struct Served {
    explicit Served(UniqueFd socket) : connection(std::move(socket)) {}

    Connection connection;
    std::atomic<bool> isOver = false;
    std::thread thread;
};

// Where no thread or no memory is left for what it looks at, it is over; who reads it asks again.
std::optional<std::string> nextOf(EventStream& events) {
    try {
        return events.next();
    } catch (const std::exception&) {
        return std::nullopt;
    }
}

}  // namespace

HttpAnswer refusal(int status, const std::string& message) {
    return {.status = status, .body = messageBody(message)};
}

struct HttpServer::State {
    Handler handler;
    UniqueFd listener;
    UniqueFd stopped;  // readable once it is to stop
    std::uint16_t port = 0;
    std::set<std::string> hosts;
    Protocol protocol;
    std::atomic<int> eventStreams = 0;
    std::list<Served> served;  // used by the thread of `run` alone

    void setUp();
    [[nodiscard]] std::optional<HttpAnswer> refusedAtDoor(const httplib::Request& request) const;
    [[nodiscard]] HttpAnswer answerTo(const httplib::Request& request) const;
    void give(const httplib::Request& request, HttpAnswer answer, httplib::Response& response);
    void giveEvents(const std::shared_ptr<EventStream>& events, httplib::Response& response);

    void serve(Connection& connection);
    void accept();
    void begin(UniqueFd socket);
    void forgetOver();
};

namespace {

void refuseAtOnce(Connection& connection, int status, std::string_view reason,
                  const std::string& message) {
    const std::string body = messageBody(message);
    const bool isTold =
        connection.write("HTTP/1.1 " + std::to_string(status) + " " + std::string(reason) +
                         "\r\nContent-Type: application/json\r\nX-Content-Type-Options: nosniff\r\n"
                         "Content-Security-Policy: " +
                         std::string(kContentPolicy) +
                         "\r\nCache-Control: no-store\r\nConnection: close\r\nContent-Length: " +
                         std::to_string(body.size()) + "\r\n\r\n" + body);
    if (isTold) connection.close();
}

httplib::Headers headersOfAll() {
    return {{"Content-Security-Policy", std::string(kContentPolicy)},
            {"X-Content-Type-Options", "nosniff"},
            {"Referrer-Policy", "no-referrer"},
            {"Cross-Origin-Resource-Policy", "same-origin"}};
}

Result<UniqueFd> listenOnLoopback(std::uint16_t port) {
    const std::string place = "port " + std::to_string(port) + " of 127.0.0.1";
    UniqueFd listener(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!listener) return posixError(errno, "open", place);
    const int yes = 1;
    ::setsockopt(listener.get(), SOL_SOCKET, SO_REUSEADDR, &yes, sizeof(yes));
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(port);
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    const auto* generic = reinterpret_cast<const sockaddr*>(&address);
    if (::bind(listener.get(), generic, sizeof(address)) != 0 ||
        ::listen(listener.get(), kBacklog) != 0) {
        return posixError(errno, "listen on", place);
    }
    return listener;
}

Result<std::uint16_t> portOf(const UniqueFd& listener) {
    sockaddr_in address{};
    socklen_t size = sizeof(address);
    auto* generic = reinterpret_cast<sockaddr*>(&address);
    if (::getsockname(listener.get(), generic, &size) != 0) {
        return posixError(errno, "look at", "the port");
    }
    return ntohs(address.sin_port);
}

}  // namespace

void HttpServer::State::setUp() {
    for (const std::string name : {"127.0.0.1", "localhost", "[::1]"}) {
        hosts.insert(name + ":" + std::to_string(port));
        // Browsers leave out the port that an address without one means.
        if (port == kPortOfHttp) hosts.insert(name);
    }
    protocol.set_default_headers(headersOfAll());
    protocol.set_pre_routing_handler(
        [this](const httplib::Request& request, httplib::Response& response) {
            give(request, answerTo(request), response);
            return httplib::Server::HandlerResponse::Handled;
        });
    protocol.set_error_handler([](const httplib::Request&, httplib::Response& response) {
        if (!response.body.empty()) return;
        response.set_header("Cache-Control", "no-store");
        response.set_content(messageBody(messageFor(response.status)), "application/json");
    });
    protocol.set_exception_handler([](const httplib::Request&, httplib::Response& response,
                                      const std::exception_ptr&) { response.status = 500; });
}

std::optional<HttpAnswer> HttpServer::State::refusedAtDoor(const httplib::Request& request) const {
    // A page from elsewhere whose name was made to lead here says so in these.
    const bool isKnownHost = request.get_header_value_count("Host") == 1 &&
                             hosts.contains(request.get_header_value("Host"));
    if (!isKnownHost) return refusal(403, "this server answers to its own name only");
    for (std::size_t each = 0; each < request.get_header_value_count("Origin"); ++each) {
        const std::string origin = request.get_header_value("Origin", each);
        if (!origin.starts_with("http://") || !hosts.contains(origin.substr(7))) {
            return refusal(403, "this server answers to its own page only");
        }
    }
    if (!isLook(request)) return refusal(405, "this server only shows: it knows GET and HEAD");
    if (hasBody(request)) return refusal(413, "this server takes no bodies");
    return std::nullopt;
}

HttpAnswer HttpServer::State::answerTo(const httplib::Request& request) const {
    if (std::optional<HttpAnswer> refused = refusedAtDoor(request)) return *std::move(refused);
    HttpRequest asked;
    std::optional<std::vector<std::string>> path =
        decodedPieces(std::string_view(request.target).substr(0, request.target.find('?')));
    if (!path) return refusal(400, "the address is not one that can be read");
    asked.path = *std::move(path);
    asked.query.insert(request.params.begin(), request.params.end());
    return handler(asked);
}

void HttpServer::State::give(const httplib::Request& request, HttpAnswer answer,
                             httplib::Response& response) {
    if (answer.events && eventStreams >= kMostEventStreams) {
        answer = refusal(503, "too many pages are being kept up to date: close some");
    }
    response.status = answer.status;
    response.set_header("Cache-Control",
                        answer.keptSeconds == 0
                            ? "no-store"
                            : "private, immutable, max-age=" + std::to_string(answer.keptSeconds));
    if (!answer.policy.empty()) {
        response.headers.erase("Content-Security-Policy");
        response.set_header("Content-Security-Policy", answer.policy);
    }
    if (answer.status == 405) response.set_header("Allow", "GET, HEAD");
    if (answer.events && request.method != "HEAD") return giveEvents(answer.events, response);
    response.set_content(answer.body, answer.type);
}

void HttpServer::State::giveEvents(const std::shared_ptr<EventStream>& events,
                                   httplib::Response& response) {
    const auto inFlight = std::make_shared<EventsInFlight>(eventStreams);
    response.set_chunked_content_provider(
        "text/event-stream", [events, inFlight](std::size_t, httplib::DataSink& sink) {
            const std::optional<std::string> next = nextOf(*events);
            if (next) return sink.write(next->data(), next->size());
            sink.done();
            return true;
        });
}

void HttpServer::State::serve(Connection& connection) {
    Connection::Head head = connection.readHead();
    bool goesOn = true;
    while (goesOn && head == Connection::Head::Whole) {
        goesOn = protocol.exchange(connection);
        if (goesOn) head = connection.readHead();
    }
    if (head == Connection::Head::TooLong) {
        return refuseAtOnce(connection, 431, "Request Header Fields Too Large",
                            "the request is too long");
    }
    if (head == Connection::Head::TooSlow) {
        return refuseAtOnce(connection, 408, "Request Timeout", "the request did not come in time");
    }
    connection.close();
}

void HttpServer::State::accept() {
    UniqueFd socket(::accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (socket) return begin(std::move(socket));
    if (errno == EMFILE || errno == ENFILE || errno == ENOMEM || errno == ENOBUFS) {
        std::this_thread::sleep_for(kWithoutMeans);
    }
}

void HttpServer::State::begin(UniqueFd socket) {
    const int yes = 1;
    ::setsockopt(socket.get(), IPPROTO_TCP, TCP_NODELAY, &yes, sizeof(yes));
    if (served.size() >= kMostConnections + kMostRefusals) return;
    const bool isFull = served.size() >= kMostConnections;
    Served& added = served.emplace_back(std::move(socket));
    try {
        added.thread = std::thread([this, &added, isFull] {
            if (isFull) {
                refuseAtOnce(added.connection, 503, "Service Unavailable",
                             "too many connections at once: try again");
            } else {
                serve(added.connection);
            }
            added.connection.shutDown();
            added.isOver = true;
        });
    } catch (const std::system_error&) {
        served.pop_back();  // no thread is to be had
    }
}

void HttpServer::State::forgetOver() {
    served.remove_if([](Served& each) {
        if (!each.isOver) return false;
        each.thread.join();
        return true;
    });
}

HttpServer::HttpServer(std::unique_ptr<State> state) : state_(std::move(state)) {}

HttpServer::~HttpServer() = default;

Result<std::unique_ptr<HttpServer>> HttpServer::open(std::uint16_t port, Handler handler) {
    Result<UniqueFd> listener = listenOnLoopback(port);
    if (!listener) return listener.error();
    const Result<std::uint16_t> taken = portOf(*listener);
    if (!taken) return taken.error();
    auto state = std::make_unique<State>();
    state->handler = std::move(handler);
    state->listener = *std::move(listener);
    state->port = *taken;
    state->stopped = UniqueFd(::eventfd(0, EFD_CLOEXEC));
    if (!state->stopped) return posixError(errno, "make", "an event");
    state->setUp();
    return std::unique_ptr<HttpServer>(new HttpServer(std::move(state)));
}

std::uint16_t HttpServer::port() const noexcept { return state_->port; }

void HttpServer::run(const std::function<void()>& ending) {
    constexpr int kTidyInterval = 1000;  // milliseconds
    std::array<pollfd, 2> sources = {pollfd{state_->listener.get(), POLLIN, 0},
                                     pollfd{state_->stopped.get(), POLLIN, 0}};
    while (sources[1].revents == 0) {
        const bool hasServed = !state_->served.empty();
        if (::poll(sources.data(), sources.size(), hasServed ? kTidyInterval : -1) < 0) continue;
        state_->forgetOver();
        if (sources[0].revents != 0) state_->accept();
    }
    state_->protocol.end();
    state_->listener.reset();
    ending();
    for (const Served& each : state_->served) each.connection.shutDown();
    for (Served& each : state_->served) each.thread.join();
    state_->served.clear();
}

void HttpServer::stop() {
    const std::uint64_t one = 1;
    while (::write(state_->stopped.get(), &one, sizeof(one)) < 0 && errno == EINTR) {
    }
}

}  // namespace appsync
