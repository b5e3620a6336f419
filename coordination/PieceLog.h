#pragma once

#include <optional>
#include <string>
#include <type_traits>

#include "client/Log.h"
#include "platform/Result.h"

namespace appsync {

/// Tells of the pieces that one run sets on an application's coordinator or placeholder, and
/// remembers the last error. Borrows the identifier.
class PieceLog {
  public:
    using Refusal = LogFormat<true, ErrorRecord, std::string>;

    PieceLog(const Log& log, const std::string& identifier) : log_(log), identifier_(identifier) {}

    /// Whether the piece was taken: `status` is the answer to its being set. Logs `added`, with
    /// `shown` and the identifier; or `refused`, with the error and the identifier.
    template <typename... Shown>
    bool note(const Status& status,
              LogFormat<true, std::type_identity_t<Shown>..., std::string> added, Refusal refused,
              const Shown&... shown) {
        if (!isTaken(status, refused)) return false;
        log_(Level::Default, added, shown..., identifier_);
        return true;
    }

    /// The same where something comes before the message of success.
    bool isTaken(const Status& status, Refusal refused) {
        if (status) return true;
        lastError_ = status.error();
        log_(Level::Error, refused, status.error(), identifier_);
        return false;
    }

    /// The last error of any step; other steps leave theirs here.
    [[nodiscard]] std::optional<ErrorRecord>& lastError() { return lastError_; }

  private:
    const Log log_;
    const std::string& identifier_;
    std::optional<ErrorRecord> lastError_;
};

}  // namespace appsync
