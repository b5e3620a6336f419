#pragma once

#include <string>
#include <string_view>

#include "platform/Error.h"

namespace appsync {

/// The operating system's sentence for an errno value. Any thread.
[[nodiscard]] std::string posixReason(int code);

/// A path as it stands in a message: control characters are written as `\xNN`, and the middle of a
/// very long path is left out, so that a message stays one readable line. An empty one is '', which
/// can be seen.
[[nodiscard]] std::string displayPath(std::string_view path);

/// The error of a failed system call, in `kPosixErrorDomain`: "cannot <operation> <path>:
/// <reason>". `code` is the errno value, `operation` a verb such as "read".
[[nodiscard]] ErrorRecord posixError(int code, std::string_view operation, std::string_view path);

/// The same with a reason that says more than the errno value does.
[[nodiscard]] ErrorRecord posixError(int code, std::string_view operation, std::string_view path,
                                     std::string_view reason);

/// The error of an operation between two paths: "cannot <operation> <from> to <to>: <reason>".
[[nodiscard]] ErrorRecord posixErrorBetween(int code, std::string_view operation,
                                            std::string_view from, std::string_view to);

/// Whether it is the error of a call that needed a name which something of another kind has, or a
/// link that leads nowhere.
[[nodiscard]] bool isInTheWay(const ErrorRecord& error);

}  // namespace appsync
