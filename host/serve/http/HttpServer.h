#pragma once

// host/serve/http: HTTP on the loopback address, for pages that only look. cpp-httplib reads the
// requests and writes the answers; the sockets, the threads and every bound on them are this room's
// own (Connection.h), as a pool of threads would be used up by the readers of events. Knows nothing
// of devices: a handler is asked for each request.

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/Result.h"

namespace appsync {

/// A request that has passed: GET or HEAD, without a body, from a page of this server's own or from
/// none.
struct HttpRequest {
    /// The path's pieces between its slashes, decoded; none for "/".
    std::vector<std::string> path;
    /// The query's values by name, decoded; of several of one name, one.
    std::map<std::string, std::string> query;
};

/// Events that a reader gets as they come.
class EventStream {
  public:
    virtual ~EventStream() = default;
    /// Waits for what is to be sent next. Gives something at least every ten seconds, so that a
    /// reader that has gone away is noticed; nothing when the stream is over.
    [[nodiscard]] virtual std::optional<std::string> next() = 0;
};

struct HttpAnswer {
    int status = 200;
    std::string type = "application/json";
    std::string body = {};
    /// For how many seconds it may be kept; 0: not at all.
    int keptSeconds = 0;
    /// What it may do as a document of its own; empty: what the page may.
    std::string policy = {};
    /// In place of a body.
    std::shared_ptr<EventStream> events = nullptr;
};

/// An answer that says what is wrong: {"message": "..."}.
[[nodiscard]] HttpAnswer refusal(int status, const std::string& message);

/// Serves on 127.0.0.1.
class HttpServer {
  public:
    /// Called on many threads at once.
    using Handler = std::function<HttpAnswer(const HttpRequest& request)>;

    /// Takes the port, or with 0 one that is free.
    [[nodiscard]] static Result<std::unique_ptr<HttpServer>> open(std::uint16_t port,
                                                                  Handler handler);
    ~HttpServer();
    HttpServer(const HttpServer&) = delete;
    HttpServer& operator=(const HttpServer&) = delete;

    [[nodiscard]] std::uint16_t port() const noexcept;
    /// Serves until it is stopped; then no connection is left. `ending` is called once it is to
    /// stop: no stream of events may wait any longer.
    void run(const std::function<void()>& ending);
    /// Callable on any thread, before `run` too.
    void stop();

  private:
    struct State;
    explicit HttpServer(std::unique_ptr<State> state);

    const std::unique_ptr<State> state_;
};

}  // namespace appsync
