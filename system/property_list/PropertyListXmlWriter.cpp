#include "system/property_list/PropertyListXmlWriter.h"

#include <cmath>
#include <string>
#include <string_view>

#include "system/property_list/PropertyListErrors.h"
#include "system/property_list/PropertyListText.h"
#include "system/property_list/PropertyListXmlValues.h"

namespace appsync {

namespace {

constexpr std::string_view kHeader =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
    "<plist version=\"1.0\">\n";
constexpr std::string_view kFooter = "</plist>\n";

class XmlWriter {
  public:
    Result<Bytes> write(const PropertyList& root) {
        text_ += kHeader;
        if (!writeValue(root, 0)) return writeError(root, culprit_, problem_);
        text_ += kFooter;
        return Bytes(text_.begin(), text_.end());
    }

  private:
    bool refuse(const void* part, std::string problem) {
        culprit_ = part;
        problem_ = std::move(problem);
        return false;
    }

    void indent(std::size_t depth) { text_.append(depth, '\t'); }

    void element(std::string_view name, std::string_view content, std::size_t depth) {
        indent(depth);
        text_.append("<").append(name).append(">").append(content);
        text_.append("</").append(name).append(">\n");
    }

    bool writeValue(const PropertyList& value, std::size_t depth) {
        using Kind = PropertyList::Kind;
        switch (value.kind()) {
            case Kind::Null:
                return refuse(&value, "the null marker cannot be written; remove it");
            case Kind::Boolean:
                indent(depth);
                text_ += *value.asBoolean() ? "<true/>\n" : "<false/>\n";
                return true;
            case Kind::Integer:
                return element("integer", std::to_string(*value.asInteger()), depth), true;
            case Kind::Unsigned:
                return element("integer", std::to_string(*value.asUnsigned()), depth), true;
            case Kind::Real:
                return element("real", realToXml(*value.asReal()), depth), true;
            case Kind::Date:
                return writeDate(value, depth);
            case Kind::Data:
                return writeData(*value.asData(), depth), true;
            case Kind::String:
                return writeText("string", *value.asString(), &value, depth);
            case Kind::Array:
                return writeArray(value, depth);
            case Kind::Map:
                return writeMap(value, depth);
        }
        return false;
    }

    bool writeDate(const PropertyList& value, std::size_t depth) {
        const auto spelled = dateToXml(*value.asDate());
        if (!std::isfinite(value.asDate()->secondsSince2001)) {
            return refuse(&value, std::string(kNoTime));
        }
        if (!spelled) {
            return refuse(
                &value, "XML cannot carry this date (years 0001 to 9999 only); write it as binary");
        }
        return element("date", *spelled, depth), true;
    }

    void writeData(const Bytes& data, std::size_t depth) {
        indent(depth);
        text_ += "<data>\n";
        appendDataAsXml(data, std::string(depth, '\t'), text_);
        indent(depth);
        text_ += "</data>\n";
    }

    bool writeText(std::string_view name, std::string_view text, const void* part,
                   std::size_t depth) {
        if (const auto bad = findNonXml(text)) return refuse(part, textProblem(text, *bad));
        indent(depth);
        text_.append("<").append(name).append(">");
        appendEscaped(text);
        text_.append("</").append(name).append(">\n");
        return true;
    }

    static std::string textProblem(std::string_view text, std::size_t bad) {
        const Utf8Character character = firstCharacter(text.substr(bad));
        const std::string at = " at byte " + std::to_string(bad) + " of the text";
        if (character.size == 0) return "the text is not UTF-8," + at;
        return "XML cannot carry the character " + characterName(character.code) + at +
               "; write it as binary";
    }

    void appendEscaped(std::string_view text) {
        for (;;) {
            const std::size_t special = text.find_first_of("<>&\r");
            text_ += text.substr(0, special);
            if (special == std::string_view::npos) return;
            text_ += escape(text[special]);
            text.remove_prefix(special + 1);
        }
    }

    static std::string_view escape(char c) {
        switch (c) {
            case '<':
                return "&lt;";
            case '>':
                return "&gt;";
            case '&':
                return "&amp;";
            default:
                return "&#13;";
        }
    }

    bool writeArray(const PropertyList& value, std::size_t depth) {
        if (value.empty()) return indent(depth), text_ += "<array/>\n", true;
        indent(depth);
        text_ += "<array>\n";
        for (const PropertyList& element : value.elements()) {
            if (!writeValue(element, depth + 1)) return false;
        }
        indent(depth);
        text_ += "</array>\n";
        return true;
    }

    bool writeMap(const PropertyList& value, std::size_t depth) {
        if (value.empty()) return indent(depth), text_ += "<dict/>\n", true;
        indent(depth);
        text_ += "<dict>\n";
        for (const auto& [key, inner] : value.entries()) {
            if (!writeText("key", key, &key, depth + 1)) return false;
            if (!writeValue(inner, depth + 1)) return false;
        }
        indent(depth);
        text_ += "</dict>\n";
        return true;
    }

    std::string text_;
    const void* culprit_ = nullptr;
    std::string problem_;
};

}  // namespace

Result<Bytes> writeXmlPropertyList(const PropertyList& value) { return XmlWriter().write(value); }

}  // namespace appsync
