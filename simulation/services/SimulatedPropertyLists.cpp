#include "simulation/services/SimulatedPropertyLists.h"

#include <string_view>

#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {

constexpr std::string_view kPropertyLists = "PropertyListSerialization";

ErrorRecord takeFirst(std::deque<ErrorRecord>& errors) {
    ErrorRecord error = std::move(errors.front());
    errors.pop_front();
    return error;
}

}  // namespace

Result<PropertyList> SimulatedPropertyLists::parse(ByteView bytes) {
    RecordedCall call(recorder_, kPropertyLists, "parse", bytes);
    if (!parseFailures_.empty()) {
        return call.result(Result<PropertyList>(takeFirst(parseFailures_)));
    }
    return call.result(codec_.parse(bytes));
}

Result<Bytes> SimulatedPropertyLists::serialize(const PropertyList& value,
                                                PropertyListFormat format) {
    RecordedCall call(recorder_, kPropertyLists, "serialize", value,
                      format == PropertyListFormat::Xml ? "XML" : "binary");
    if (!serializeFailures_.empty()) {
        return call.result(Result<Bytes>(takeFirst(serializeFailures_)));
    }
    return call.result(codec_.serialize(value, format));
}

bool SimulatedPropertyLists::replaceText(Bytes& bytes, std::size_t index, std::string_view key,
                                         std::string_view text) {
    RecordedCall call(recorder_, kPropertyLists, "replaceText", index, key, text);
    Bytes changed = bytes;
    const bool replaced = call.result(codec_.replaceText(changed, index, key, text));
    if (replaced) bytes = std::move(changed);
    return replaced;
}

}  // namespace appsync
