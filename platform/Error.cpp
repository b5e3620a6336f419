#include "platform/Error.h"

namespace appsync {

namespace {
constexpr std::string_view kDescriptionKey = "description";
}

ErrorRecord ErrorRecord::make(std::string_view domain, std::int64_t code,
                              std::string_view description) {
    return {std::string(domain), code, PropertyList::map({{kDescriptionKey, description}})};
}

std::string ErrorRecord::description() const {
    if (const std::string* text = userInfo.findString(kDescriptionKey)) return *text;
    return domain + " error " + std::to_string(code);
}

ErrorRecord ErrorRecord::withContext(std::string_view context) const {
    ErrorRecord result = *this;
    if (!result.userInfo.isMap()) result.userInfo = PropertyList::map();
    result.userInfo.set(kDescriptionKey, std::string(context) + ": " + description());
    return result;
}

}  // namespace appsync
