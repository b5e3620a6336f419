#include "host/JsonWriting.h"

#include <nlohmann/json.hpp>

namespace appsync {

using Json = nlohmann::ordered_json;

std::string dumped(const Json& value) {
    return value.dump(-1, ' ', false, Json::error_handler_t::replace);
}

std::string indented(const Json& value) {
    return value.dump(2, ' ', false, Json::error_handler_t::replace);
}

}  // namespace appsync
