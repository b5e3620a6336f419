#include <string>
#include <vector>

#include "contract/forwarding/ForwardingSystemServices.h"
#include "tests/violators/Violator.h"

namespace appsync {
namespace {

ErrorRecord unreadable(std::string_view domain, std::string_view sentence) {
    return ErrorRecord::make(domain, 1, sentence);
}

/// The value with every null marker replaced by an empty text.
PropertyList withoutNulls(const PropertyList& value) {
    if (value.isNull()) return "";
    if (value.isArray()) {
        PropertyList array = PropertyList::array();
        for (const PropertyList& element : value.elements()) array.append(withoutNulls(element));
        return array;
    }
    if (value.isMap()) {
        PropertyList map = PropertyList::map();
        for (const auto& [key, element] : value.entries()) map.set(key, withoutNulls(element));
        return map;
    }
    return value;
}

struct OnlyXmlIsRead : ForwardingPropertyLists {
    using ForwardingPropertyLists::ForwardingPropertyLists;
    Result<PropertyList> parse(ByteView bytes) override {
        if (!bytes.empty() && bytes[0] == 'b') {
            return unreadable(kPropertyListErrorDomain, "line 1: no XML");
        }
        return target().parse(bytes);
    }
};
struct OnlyBinaryIsRead : ForwardingPropertyLists {
    using ForwardingPropertyLists::ForwardingPropertyLists;
    Result<PropertyList> parse(ByteView bytes) override {
        if (!bytes.empty() && bytes[0] == '<') {
            return unreadable(kPropertyListErrorDomain, "byte 0: not binary");
        }
        return target().parse(bytes);
    }
};
struct ParseErrorsOfAnotherDomain : ForwardingPropertyLists {
    using ForwardingPropertyLists::ForwardingPropertyLists;
    Result<PropertyList> parse(ByteView bytes) override {
        auto read = target().parse(bytes);
        if (read) return read;
        return unreadable(kPosixErrorDomain, read.error().description());
    }
};
struct ParseErrorsWithoutAPlace : ForwardingPropertyLists {
    using ForwardingPropertyLists::ForwardingPropertyLists;
    Result<PropertyList> parse(ByteView bytes) override {
        auto read = target().parse(bytes);
        if (read) return read;
        return unreadable(kPropertyListErrorDomain, "this is no property list");
    }
};
struct GarbageIsAnEmptyMap : ForwardingPropertyLists {
    using ForwardingPropertyLists::ForwardingPropertyLists;
    Result<PropertyList> parse(ByteView bytes) override {
        auto read = target().parse(bytes);
        return read ? read : Result<PropertyList>(PropertyList::map());
    }
};
struct EverythingIsWrittenAsXml : ForwardingPropertyLists {
    using ForwardingPropertyLists::ForwardingPropertyLists;
    Result<Bytes> serialize(const PropertyList& value, PropertyListFormat) override {
        return target().serialize(value, PropertyListFormat::Xml);
    }
};
struct NullsAreEmptyTexts : ForwardingPropertyLists {
    using ForwardingPropertyLists::ForwardingPropertyLists;
    Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) override {
        return target().serialize(withoutNulls(value), format);
    }
};
struct WriteErrorsWithoutADomain : ForwardingPropertyLists {
    using ForwardingPropertyLists::ForwardingPropertyLists;
    Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) override {
        auto written = target().serialize(value, format);
        return written ? written : unreadable("", written.error().description());
    }
};
struct LargeNumbersAreLost : ForwardingPropertyLists {
    using ForwardingPropertyLists::ForwardingPropertyLists;
    Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) override {
        PropertyList changed = value;
        if (changed.isMap() && changed.find("largest") != nullptr) {
            changed.set("largest", std::int64_t{-1});
        }
        return target().serialize(changed, format);
    }
};
/// What XML cannot carry is left out.
struct UnwritableTextsAreEmpty : ForwardingPropertyLists {
    using ForwardingPropertyLists::ForwardingPropertyLists;
    Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) override {
        auto written = target().serialize(value, format);
        if (written || value.asString() == nullptr) return written;
        return target().serialize("", format);
    }
};
struct ReplacingSaysSoAndDoesNothing : ForwardingPropertyLists {
    using ForwardingPropertyLists::ForwardingPropertyLists;
    bool replaceText(Bytes&, std::size_t, std::string_view, std::string_view) override {
        return true;
    }
};
struct AFailedReplaceChangesBytes : ForwardingPropertyLists {
    using ForwardingPropertyLists::ForwardingPropertyLists;
    bool replaceText(Bytes& bytes, std::size_t, std::string_view, std::string_view) override {
        bytes.push_back(0);
        return false;
    }
};

}  // namespace

std::vector<Violator> propertyListViolators() {
    Violators v("platform/PropertyListSerialization.h", "*PropertyList*");
    v.system<OnlyXmlIsRead>("OnlyXmlIsRead", "Reads either encoding, told apart by content.");
    v.system<OnlyBinaryIsRead>("OnlyBinaryIsRead", "Reads either encoding, told apart by content.");
    const std::string error =
        "An error of `kPropertyListErrorDomain` says where (byte offset, or line and column) and "
        "what was expected.";
    v.system<ParseErrorsOfAnotherDomain>("ParseErrorsOfAnotherDomain", error);
    v.system<ParseErrorsWithoutAPlace>("ParseErrorsWithoutAPlace", error);
    v.system<GarbageIsAnEmptyMap>("GarbageIsAnEmptyMap", error);
    v.system<EverythingIsWrittenAsXml>("EverythingIsWrittenAsXml",
                                       "Writes a value in one of the encodings (binary: version "
                                       "1.0).");
    v.system<LargeNumbersAreLost>("LargeNumbersAreLost",
                                  "Writes a value in one of the encodings (binary: version 1.0).");
    const std::string fails =
        "Fails when the value holds a null marker, or a text that the encoding cannot carry.";
    v.system<NullsAreEmptyTexts>("NullsAreEmptyTexts", fails);
    v.system<WriteErrorsWithoutADomain>("WriteErrorsWithoutADomain", fails);
    v.system<UnwritableTextsAreEmpty>("UnwritableTextsAreEmpty", fails);
    v.system<ReplacingSaysSoAndDoesNothing>(
        "ReplacingSaysSoAndDoesNothing",
        "Changes what `serialize` has written for an array of maps, so that it reads as the array "
        "in which the map at `index` has `text` under `key`, where it had something already: for "
        "who changes one text of a long list again and again.");
    v.system<AFailedReplaceChangesBytes>(
        "AFailedReplaceChangesBytes",
        "False, with the bytes as they were, when that cannot be had for less than writing all of "
        "it, which the caller does then; who implements this may leave it at that.");
    return v.take();
}

}  // namespace appsync
