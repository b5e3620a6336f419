#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/Bytes.h"

namespace appsync {

/// Keeps a running application from running until the assertion is released, that is destroyed.
class TerminationAssertion {
  public:
    virtual ~TerminationAssertion() = default;
};

/// The answer to the request for a termination assertion. The numbers are the home screen's; any
/// other than these is an unknown error.
struct TerminationAssertionResult {
    enum Outcome : int { kGranted = 0, kDenied = 1, kNoSuchApplication = 2 };
    int outcome = kNoSuchApplication;
    /// Null when none was created. One may have been whatever the outcome; it is to be released.
    std::unique_ptr<TerminationAssertion> assertion;
};

/// A connection to the home screen whose calls block until it has answered.
class HomeScreenConnection {
  public:
    virtual ~HomeScreenConnection() = default;

    /// Sets the icon layout from bytes that the host left in "DeskoraIconState.plist": the home
    /// screen's own form, which the plug-in does not look into. False when they were not taken.
    /// Bytes of another form are not, and change nothing.
    virtual bool setIconState(ByteView state) = 0;

    /// The icon layout flattened: a property list whose root is an array of bundle identifiers in
    /// home-screen order. Nothing when the home screen does not answer. `variant` is always 1.
    [[nodiscard]] virtual std::optional<Bytes> flattenedIconState(std::uint64_t variant) = 0;
};

/// The home screen. Callable on any thread; nothing throws.
class HomeScreenService {
  public:
    virtual ~HomeScreenService() = default;

    /// The connection; null when the home screen cannot be reached.
    [[nodiscard]] virtual std::shared_ptr<HomeScreenConnection> blockableConnection() = 0;

    /// Asks that the application be ended, if it runs, and kept from running. `reason` says who
    /// asks (the plug-in gives 0, a platform numbers others of its own) and changes nothing in the
    /// answer. Denied while the application goes on running. No such application when it is not
    /// installed. Else granted, with an assertion; several may hold one application.
    [[nodiscard]] virtual TerminationAssertionResult takeTerminationAssertion(
        const std::string& identifier, std::uint64_t reason) = 0;
};

}  // namespace appsync
