#pragma once

#include <string_view>

#include "platform/Result.h"

namespace appsync {

struct Console;

/// What is about to be lost, and what is asked before that.
struct Loss {
    /// One clause: "com.a has data on the device".
    std::string_view what;
    std::string_view question;
    /// How to go on where nobody can be asked.
    std::string_view whatToDo;
};

/// Asks a person at the terminal whether to go on. Success when the answer is yes; a refusal when
/// it is no, or where nobody can be asked.
[[nodiscard]] Status askBeforeLosing(const Loss& loss, const Console& console);

}  // namespace appsync
