#include "system/property_list/PropertyListPlainXmlReader.h"

#include <algorithm>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "system/property_list/PropertyListText.h"
#include "system/property_list/PropertyListXmlValues.h"

namespace appsync {

namespace {

constexpr std::size_t kMostLikelyEntries = 16;

/// Every method that answers false has given up; the reader is of no use then.
class PlainXmlReader {
  public:
    explicit PlainXmlReader(std::string_view text) : rest_(text) {}

    bool readDocument(PropertyList& value) {
        take("<?xml version=\"1.0\" encoding=\"UTF-8\"?>");
        skipWhite();
        if (!skipDoctype()) return false;
        skipWhite();
        if (!take("<plist version=\"1.0\">") || !takeTag() || !readValue(1, value)) return false;
        skipWhite();
        if (!take("</plist>")) return false;
        skipWhite();
        return rest_.empty();
    }

  private:
    void skipWhite() {
        std::size_t i = 0;
        while (i < rest_.size() && isXmlSpace(rest_[i])) ++i;
        rest_.remove_prefix(i);
    }

    bool take(std::string_view literal) {
        if (!rest_.starts_with(literal)) return false;
        rest_.remove_prefix(literal.size());
        return true;
    }

    /// A declaration with rules of its own is not plain, nor is one whose end is hard to tell.
    bool skipDoctype() {
        if (!take("<!DOCTYPE")) return true;
        const std::size_t end = rest_.find_first_of("[<>");
        if (end == std::string_view::npos || rest_[end] != '>') return false;
        const std::string_view inside = rest_.substr(0, end);
        if (inside.find('\'') != std::string_view::npos) return false;
        if (std::count(inside.begin(), inside.end(), '"') % 2 != 0) return false;
        rest_.remove_prefix(end + 1);
        return true;
    }

    /// The '<' of the next tag.
    bool takeTag() {
        skipWhite();
        return take("<");
    }

    /// Reads a value whose '<' is taken; `depth` is its own, if it is a container.
    bool readValue(std::size_t depth, PropertyList& value) {
        switch (rest_.empty() ? '\0' : rest_.front()) {
            case 's':
                return readString(value);
            case 'd':
                if (take("dict>")) return readMap(depth, value);
                if (take("data>")) return readSpelled("/data>", dataFromXml, value);
                if (take("date>")) return readSpelled("/date>", dateFromXml, value);
                value = PropertyList::map();
                return take("dict/>");
            case 'a':
                if (take("array>")) return readArray(depth, value);
                value = PropertyList::array();
                return take("array/>");
            case 'i':
                return take("integer>") && readSpelled("/integer>", integerFromXml, value);
            case 'r':
                return take("real>") && readSpelled("/real>", realFromXml, value);
            default:
                return readBoolean(value);
        }
    }

    bool readBoolean(PropertyList& value) {
        if (take("true/>")) {
            value = true;
            return true;
        }
        value = false;
        return take("false/>");
    }

    /// Takes the text before the next tag, which has to be this one.
    bool takeText(std::string_view endTag, std::string_view& text) {
        const std::size_t size = rest_.find('<');
        if (size == std::string_view::npos) return false;
        text = rest_.substr(0, size);
        rest_.remove_prefix(size + 1);
        return take(endTag);
    }

    bool readString(PropertyList& value) {
        if (!take("string>")) {
            value = "";
            return take("string/>");
        }
        std::string_view text;
        if (!takeText("/string>", text)) return false;
        if (isXmlTextLiteral(text)) {
            value = text;
            return true;
        }
        std::string expanded;
        if (appendXmlText(text, true, expanded)) return false;
        value = std::move(expanded);
        return true;
    }

    template <typename FromXml>
    bool readSpelled(std::string_view endTag, FromXml fromXml, PropertyList& value) {
        std::string_view text;
        if (!takeText(endTag, text)) return false;
        auto result = fromXml(text);
        if (result.value) value = std::move(*result.value);
        return result.value.has_value();
    }

    bool readArray(std::size_t depth, PropertyList& value) {
        if (depth > PropertyList::kMaximumDepth) return false;
        std::vector<PropertyList> elements;
        while (takeTag()) {
            if (take("/array>")) return value.becomeArray(elements);
            if (!readValue(depth + 1, elements.emplace_back())) return false;
        }
        return false;
    }

    bool readMap(std::size_t depth, PropertyList& value) {
        if (depth > PropertyList::kMaximumDepth) return false;
        std::vector<PropertyList::Entry> entries;
        while (takeTag()) {
            if (take("/dict>")) {
                likelyEntries_ = std::min(entries.size(), kMostLikelyEntries);
                return value.becomeMap(entries);
            }
            // Maps of one list mostly look alike.
            if (entries.empty()) entries.reserve(likelyEntries_);
            auto& [key, inner] = entries.emplace_back();
            if (!readKey(key) || !takeTag() || !readValue(depth + 1, inner)) return false;
        }
        return false;
    }

    bool readKey(std::string& key) {
        std::string_view text;
        if (!take("key>") || !takeText("/key>", text)) return false;
        if (!isXmlTextLiteral(text)) return !appendXmlText(text, true, key);
        key = text;
        return true;
    }

    std::string_view rest_;
    std::size_t likelyEntries_ = 0;
};

}  // namespace

std::optional<PropertyList> readPlainXmlPropertyList(ByteView document) {
    const std::string_view text(reinterpret_cast<const char*>(document.data()), document.size());
    PropertyList value;
    if (findNonXml(text) || !PlainXmlReader(text).readDocument(value)) return std::nullopt;
    return value;
}

}  // namespace appsync
