#pragma once

#include <string>

namespace appsync {

/// A sentence of a contract that was broken.
struct ContractBreach {
    /// The header that it stands in: "platform/AppRegistry.h".
    std::string header;
    /// The sentence, word for word.
    std::string sentence;
    /// What was seen.
    std::string seen;
};

}  // namespace appsync
