#pragma once

#include <chrono>
#include <optional>
#include <string>

#include "platform/Result.h"

namespace appsync {

class Device;
struct ApplicationStatus;
struct DeviceSettings;

/// What an application waits for.
struct AwaitedThing {
    /// "termination", "policy", "transfer", "install", "sync", "restore data", "store" or
    /// "promise".
    std::string what;
    /// Who has to do something: an identifier, "host", "device", "store", or "client N" of the
    /// coordination service.
    std::string who;
    /// The promise of a coordinated install that is not kept yet, where it is one that is missing.
    std::optional<std::string> promise;
    std::optional<std::chrono::system_clock::time_point> nextTry;
    /// The same as a sentence, with what a person can do.
    std::string sentence;
};

/// Everything about one application in one answer.
struct WhyAnswer {
    std::string identifier;
    /// "installed", "placeholder" or "absent".
    std::string state;
    std::optional<AwaitedThing> waitsFor;
    std::optional<std::string> lastError;
    /// A sentence for people about the state.
    std::string sentence;
};

/// `packageWaits`: the package of a restored application has come, and waits for its data.
[[nodiscard]] WhyAnswer explain(const std::string& identifier, const ApplicationStatus& status,
                                const DeviceSettings& settings, bool packageWaits = false);

/// The answer of a device; an error where it knows nothing of the application.
[[nodiscard]] Result<WhyAnswer> whyOf(Device& device, const std::string& identifier);

/// The answer for people; ends with a line end.
[[nodiscard]] std::string whyText(const WhyAnswer& answer);

}  // namespace appsync
