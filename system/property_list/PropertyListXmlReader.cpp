#include "system/property_list/PropertyListXmlReader.h"

#include <algorithm>
#include <cstring>
#include <memory>
#include <new>
#include <optional>
#include <pugixml.hpp>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "system/property_list/PropertyListErrors.h"
#include "system/property_list/PropertyListText.h"
#include "system/property_list/PropertyListXmlValues.h"

namespace appsync {

namespace {

std::string_view textOf(ByteView bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

bool isWhite(std::string_view text) {
    return text.find_first_not_of(" \t\r\n") == std::string_view::npos;
}

bool equalIgnoringCase(std::string_view text, std::string_view upper) {
    if (text.size() != upper.size()) return false;
    for (std::size_t i = 0; i < text.size(); ++i) {
        const char c = text[i] >= 'a' && text[i] <= 'z' ? static_cast<char>(text[i] - 32) : text[i];
        if (c != upper[i]) return false;
    }
    return true;
}

/// What pugixml expected where it gave up.
std::string_view expectation(pugi::xml_parse_status status) {
    switch (status) {
        case pugi::status_bad_pi:
            return "expected a processing instruction that ends with '?>'";
        case pugi::status_bad_comment:
            return "expected a comment that ends with '-->'";
        case pugi::status_bad_cdata:
            return "expected a CDATA section that ends with ']]>'";
        case pugi::status_bad_doctype:
            return "expected a document type declaration that ends with '>', before the first tag";
        case pugi::status_bad_start_element:
            return "expected a start tag that ends with '>'";
        case pugi::status_bad_attribute:
            return "expected an attribute with a quoted value";
        case pugi::status_bad_end_element:
            return "expected an end tag that ends with '>'";
        case pugi::status_end_element_mismatch:
            return "expected the end tag of the element that is still open";
        default:
            return "expected a tag";
    }
}

constexpr std::string_view kDateForm = "a date (YYYY-MM-DDTHH:MM:SSZ)";
constexpr std::string_view kInteger = "an integer of at most 64 bits";

/// Only elements have names.
bool isElement(pugi::xml_node node) { return *node.name() != '\0'; }

class XmlReader {
  public:
    explicit XmlReader(ByteView document) : document_(document), text_(textOf(document)) {}

    Result<PropertyList> read() {
        PropertyList value;
        if (checkCharacters() && parse() && readDocument(value)) return value;
        return xmlReadError(document_, problemAt_, problem_);
    }

  private:
    bool refuse(std::size_t at, std::string problem) {
        problemAt_ = at;
        problem_ = std::move(problem);
        return false;
    }

    /// Refuses at a place inside the buffer, where the parser left its texts.
    bool refuseAt(const char* place, std::string problem) {
        return refuse(static_cast<std::size_t>(place - buffer_.get()), std::move(problem));
    }

    bool refuseTag(pugi::xml_node node, std::string problem) {
        return refuseAt(node.name() - 1, std::move(problem));
    }

    bool checkCharacters() {
        if (text_.empty()) return refuse(0, "expected a property list, found no bytes at all");
        const auto bad = findNonXml(text_);
        if (!bad) return true;
        if (text_.starts_with("\xFE\xFF") || text_.starts_with("\xFF\xFE") || *bad < 4) {
            return refuse(*bad, "expected an XML document in UTF-8 or a binary property list");
        }
        const Utf8Character character = firstCharacter(text_.substr(*bad));
        if (character.size == 0) return refuse(*bad, "expected UTF-8, found a byte that is not");
        return refuse(*bad, "expected a character that XML can carry, found " +
                                characterName(character.code));
    }

    /// Whether something may stand between texts that the parser would drop white space before.
    bool hasMarkupInside() const {
        const std::size_t start = std::min(text_.find("<plist"), text_.size());
        for (const char mark : {'!', '?'}) {
            std::size_t at = text_.find(mark, start);
            for (; at != std::string_view::npos; at = text_.find(mark, at + 1)) {
                if (at > 0 && text_[at - 1] == '<') return true;
            }
        }
        return false;
    }

    bool parse() {
        // The parser overwrites the last character, and would not miss it after the last tag.
        const std::size_t size = text_.size() + 1;
        buffer_ = std::make_unique_for_overwrite<char[]>(size);
        std::memcpy(buffer_.get(), text_.data(), text_.size());
        buffer_[text_.size()] = '\n';

        const unsigned white =
            hasMarkupInside() ? pugi::parse_ws_pcdata : pugi::parse_ws_pcdata_single;
        const unsigned options = pugi::parse_cdata | pugi::parse_fragment |
                                 pugi::parse_declaration | pugi::parse_embed_pcdata | white;
        const auto result =
            tree_.load_buffer_inplace(buffer_.get(), size, options, pugi::encoding_utf8);
        if (result.status == pugi::status_out_of_memory) throw std::bad_alloc();
        if (result) return true;
        const auto at = std::min(static_cast<std::size_t>(result.offset), text_.size());
        return refuse(at, std::string(expectation(result.status)));
    }

    bool readDocument(PropertyList& value) {
        bool found = false;
        for (const pugi::xml_node node : tree_) {
            if (node.type() == pugi::node_declaration) {
                if (!checkEncoding(node)) return false;
            } else if (node.type() != pugi::node_element) {
                if (!checkWhite(node.value(), "<plist>")) return false;
            } else if (found || std::string_view(node.name()) != "plist") {
                return refuseTag(node, found ? "expected the end of the document after </plist>"
                                             : "expected <plist>");
            } else {
                if (!readRoot(node, value)) return false;
                found = true;
            }
        }
        return found || refuse(text_.size(), "expected <plist>, found the end of the document");
    }

    bool checkEncoding(pugi::xml_node declaration) {
        const pugi::xml_attribute encoding = declaration.attribute("encoding");
        const std::string_view name = encoding.value();
        if (!encoding || equalIgnoringCase(name, "UTF-8") || equalIgnoringCase(name, "US-ASCII")) {
            return true;
        }
        return refuseAt(name.data(),
                        "expected the encoding UTF-8, found '" + std::string(name) + "'");
    }

    /// Between tags only white space may stand.
    bool checkWhite(const char* text, std::string_view expected) {
        const std::string_view all = text;
        const std::size_t bad = all.find_first_not_of(" \t\r\n");
        if (bad == std::string_view::npos) return true;
        return refuseAt(text + bad, "expected " + std::string(expected) + ", found text");
    }

    bool readRoot(pugi::xml_node plist, PropertyList& value) {
        if (!checkWhite(plist.value(), "a value")) return false;
        bool found = false;
        for (const pugi::xml_node node : plist) {
            if (!isElement(node)) {
                if (!checkWhite(node.value(), "a value")) return false;
            } else if (found) {
                return refuseTag(node, "expected </plist> after the one value");
            } else {
                if (!readValue(node, 1, value)) return false;
                found = true;
            }
        }
        return found || refuseTag(plist, "expected one value inside <plist>");
    }

    /// `depth` is that of the value if it is a container.
    bool readValue(pugi::xml_node node, std::size_t depth, PropertyList& value) {
        const std::string_view name = node.name();
        if (name == "string") return readString(node, value);
        if (name == "dict") return readMap(node, depth, value);
        if (name == "array") return readArray(node, depth, value);
        if (name == "integer") return readSpelled(node, integerFromXml, kInteger, value);
        if (name == "true" || name == "false") return readBoolean(node, name == "true", value);
        if (name == "real") return readSpelled(node, realFromXml, "a number", value);
        if (name == "date") return readSpelled(node, dateFromXml, kDateForm, value);
        if (name == "data") return readSpelled(node, dataFromXml, "base64", value);
        return refuseTag(node,
                         "expected a value (string, dict, array, integer, real, true, false, "
                         "date or data), found <" +
                             std::string(name) + ">");
    }

    bool checkDepth(pugi::xml_node node, std::size_t depth) {
        return depth <= PropertyList::kMaximumDepth ||
               refuseTag(node, "expected at most 128 containers in one another");
    }

    bool readBoolean(pugi::xml_node node, bool content, PropertyList& value) {
        std::string joined;
        const auto text = contentOf(node, joined);
        if (!text) return false;
        if (!isWhite(*text)) return refuseTag(node, "expected no text inside a boolean");
        value = content;
        return true;
    }

    bool readString(pugi::xml_node node, PropertyList& value) {
        std::string joined;
        const auto text = contentOf(node, joined);
        if (!text) return false;
        value = joined.empty() ? PropertyList(*text) : PropertyList(std::move(joined));
        return true;
    }

    template <typename FromXml>
    bool readSpelled(pugi::xml_node node, FromXml fromXml, std::string_view what,
                     PropertyList& value) {
        std::string joined;
        const auto text = contentOf(node, joined);
        if (!text) return false;
        auto result = fromXml(*text);
        if (result.value) {
            value = std::move(*result.value);
            return true;
        }
        const std::string problem = "expected " + std::string(what);
        if (!joined.empty() || text->empty()) return refuseTag(node, problem);
        return refuseAt(text->data() + result.badAt, problem);
    }

    bool readArray(pugi::xml_node node, std::size_t depth, PropertyList& value) {
        if (!checkDepth(node, depth)) return false;
        if (!checkWhite(node.value(), "a value or </array>")) return false;
        std::vector<PropertyList> elements;
        for (pugi::xml_node child = node.first_child(); child; child = child.next_sibling()) {
            if (!isElement(child)) {
                if (!checkWhite(child.value(), "a value or </array>")) return false;
            } else if (!readValue(child, depth + 1, elements.emplace_back())) {
                return false;
            }
        }
        return value.becomeArray(elements);
    }

    bool readMap(pugi::xml_node node, std::size_t depth, PropertyList& value) {
        if (!checkDepth(node, depth)) return false;
        if (!checkWhite(node.value(), "<key> or </dict>")) return false;
        std::vector<PropertyList::Entry> entries;
        pugi::xml_node key;  // the one whose value comes next
        for (pugi::xml_node child = node.first_child(); child; child = child.next_sibling()) {
            if (!isElement(child)) {
                if (!checkWhite(child.value(), key ? "a value" : "<key> or </dict>")) return false;
            } else if (key) {
                if (!readValue(child, depth + 1, entries.back().value)) return false;
                key = {};
            } else {
                if (!readKey(child, entries.emplace_back().key)) return false;
                key = child;
            }
        }
        if (key) return refuseTag(key, "expected a value after this key, found </dict>");
        return value.becomeMap(entries) || refuseRepeatedKey(node, entries);
    }

    bool readKey(pugi::xml_node node, std::string& key) {
        if (std::string_view(node.name()) != "key") {
            return refuseTag(node,
                             "expected <key> or </dict>, found <" + std::string(node.name()) + ">");
        }
        std::string joined;
        const auto text = contentOf(node, joined);
        if (text) key = *text;
        return text.has_value();
    }

    bool refuseRepeatedKey(pugi::xml_node map, std::span<const PropertyList::Entry> entries) {
        std::size_t left = PropertyList::findRepeatedKey(entries).value_or(0);
        pugi::xml_node key = map.child("key");
        for (; left != 0; --left) key = key.next_sibling("key");
        return refuseTag(key, "expected a key that the map does not have yet");
    }

    /// The text inside an element, references expanded: in the parser's buffer when it stands there
    /// in one piece, else in `joined`.
    std::optional<std::string_view> contentOf(pugi::xml_node node, std::string& joined) {
        const std::string_view text = node.value();
        if (isXmlTextLiteral(text) && !node.first_child()) return text;
        if (!appendText(text, true, joined)) return std::nullopt;
        for (const pugi::xml_node child : node) {
            if (isElement(child)) {
                refuseTag(child, "expected text, found <" + std::string(child.name()) + ">");
                return std::nullopt;
            }
            const bool references = child.type() != pugi::node_cdata;
            if (!appendText(child.value(), references, joined)) return std::nullopt;
        }
        return joined;
    }

    bool appendText(std::string_view text, bool references, std::string& joined) {
        const auto bad = appendXmlText(text, references, joined);
        return !bad || refuseAt(text.data() + *bad,
                                "expected &lt; &gt; &amp; &quot; &apos; or a reference to a "
                                "character that XML can carry");
    }

    ByteView document_;
    std::string_view text_;
    std::unique_ptr<char[]> buffer_;
    pugi::xml_document tree_;
    std::size_t problemAt_ = 0;
    std::string problem_;
};

}  // namespace

Result<PropertyList> readXmlPropertyList(ByteView document) { return XmlReader(document).read(); }

}  // namespace appsync
