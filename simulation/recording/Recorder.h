#pragma once

// simulation/recording: what crosses platform/. Every simulated service tells `Recorder` (this
// header) of each call, by way of `RecordedCall` (RecordedCall.h): there it becomes an entry, may
// be refused by a `CallInterceptor` (faults), runs the test's hooks, and lets the scheduler change
// turns. KnownCalls.h are the names of all calls: a test that asks for another has a slip of the
// pen. DurableChanges.h is how services tell what a crash would leave. Includes scheduling and
// platform/.

#include <cstddef>
#include <functional>
#include <iosfwd>
#include <limits>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/Error.h"
#include "platform/LogFacility.h"
#include "simulation/recording/DurableChanges.h"
#include "simulation/scheduling/Scheduler.h"

namespace appsync {

/// One thing that crossed platform/.
struct RecordEntry {
    enum class Kind { Call, Message };

    Kind kind = Kind::Call;
    /// Who was running: "host", "operation 1", "registry", "delayed work".
    std::string task;
    SimulatedTime time{0};

    // Of a call: "AppRegistry", "isApplicationInstalled", "com.example.a", "yes". The result is
    // empty when there is none, or none yet.
    std::string service;
    std::string method;
    std::string arguments;
    std::string result;

    // Of a message. `text` is rendered, without the "bundle identifier|" that every message of the
    // plug-in begins with; `prefix` is that beginning.
    LogLevel level = LogLevel::Default;
    LogCategory category = LogCategory::General;
    std::string format;
    std::string prefix;
    std::string text;

    /// "AppRegistry.isApplicationInstalled(com.example.a) -> yes", or "8 default the text".
    [[nodiscard]] std::string line() const;
};

/// GoogleTest prints entries with it.
std::ostream& operator<<(std::ostream& out, const RecordEntry& entry);

/// Stands in the way of every call across platform/.
class CallInterceptor {
  public:
    virtual ~CallInterceptor() = default;
    /// Like a hook, after it. With an error the call is refused: what it gives back is the error,
    /// or nothing, or no.
    virtual std::optional<ErrorRecord> willCall(const RecordEntry& entry) = 0;
    /// A call that has a result gives it back now.
    virtual void didCall() = 0;
};

/// Keeps, in order, everything that crosses platform/, and makes each of these crossings a point at
/// which the scheduler may switch.
class Recorder {
  public:
    using Hook = std::function<void(const RecordEntry&)>;

    explicit Recorder(Scheduler& scheduler) : scheduler_(scheduler) {}

    /// Switches, records the call and runs its hook. The number is for `end`.
    std::size_t begin(std::string_view service, std::string_view method, std::string arguments);
    /// Fills in the result of a call.
    void end(std::size_t call, std::string result);
    /// Switches and records a message.
    void message(const LogMessage& message);

    /// From now on `hook` runs whenever "Service.method" is called, on the caller's flow of
    /// control, after the call was recorded and before it has any effect. An empty hook ends that.
    void setHook(std::string call, Hook hook);

    /// Borrowed; null ends it.
    void setInterceptor(CallInterceptor* interceptor) { interceptor_ = interceptor; }
    /// Why the call that has just begun is refused. Nothing: it is not.
    [[nodiscard]] std::optional<ErrorRecord> takeRefusal() {
        return std::exchange(refusal_, std::nullopt);
    }

    /// Who hears of what the services change on the device. Borrowed; null ends it.
    void setChangeListener(DurableChangeListener* listener) { changeListener_ = listener; }
    [[nodiscard]] bool isChangeListening() const { return changeListener_ != nullptr; }
    void filesChanged(std::string_view what) {
        if (changeListener_ != nullptr) changeListener_->filesChanged(what);
    }
    void recordsChanged(std::string_view what, Persistence persistence) {
        if (changeListener_ != nullptr) changeListener_->recordsChanged(what, persistence);
    }

    /// Recording costs memory; a long benchmark does without.
    void setEnabled(bool enabled) { enabled_ = enabled; }
    /// Whether anybody wants to know arguments and results.
    [[nodiscard]] bool isListening() const {
        return enabled_ || !hooks_.empty() || interceptor_ != nullptr;
    }
    void clear();
    [[nodiscard]] const std::vector<RecordEntry>& entries() const { return entries_; }
    [[nodiscard]] Scheduler& scheduler() { return scheduler_; }

  private:
    static constexpr std::size_t kNotRecorded = std::numeric_limits<std::size_t>::max();

    [[nodiscard]] Hook hookOf(const RecordEntry& entry) const;

    Scheduler& scheduler_;
    std::vector<RecordEntry> entries_;
    std::size_t forgotten_ = 0;  // how many entries were cleared
    bool enabled_ = true;
    std::map<std::string, Hook, std::less<>> hooks_;
    CallInterceptor* interceptor_ = nullptr;
    DurableChangeListener* changeListener_ = nullptr;
    std::optional<ErrorRecord> refusal_;
};

}  // namespace appsync
