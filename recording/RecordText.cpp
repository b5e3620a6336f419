#include "recording/RecordText.h"

#include <algorithm>
#include <array>
#include <bit>
#include <charconv>
#include <cmath>
#include <cstring>

#include "platform/AppRegistry.h"
#include "platform/Error.h"
#include "platform/FileSystem.h"
#include "platform/InstallCoordinator.h"
#include "platform/LogRendering.h"
#include "recording/Anonymizer.h"

namespace appsync {
namespace {

/// A longer property list is named by the size and the sum of its text.
constexpr std::size_t kLongestList = 2048;
/// What a message shows of a property list or an error.
constexpr std::size_t kLongestDescription = 200;

ByteView bytesOf(std::string_view text) {
    return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

std::string hexadecimal(std::uint64_t number) {
    constexpr int kBase = 16;
    std::array<char, kBase> digits{};
    const auto end = std::to_chars(digits.data(), digits.data() + digits.size(), number, kBase);
    return {digits.data(), end.ptr};
}

// A sum takes words in turn into lanes that do not wait for each other.
constexpr std::size_t kLanes = 8;
constexpr std::size_t kBlock = kLanes * sizeof(std::uint64_t);

/// The same on every machine.
std::uint64_t wordAt(const std::uint8_t* bytes) {
    std::uint64_t word = 0;
    if constexpr (std::endian::native == std::endian::little) {
        std::memcpy(&word, bytes, sizeof word);
    } else {
        constexpr unsigned kBits = 8;
        for (std::size_t i = sizeof word; i-- > 0;) word = word << kBits | bytes[i];
    }
    return word;
}

std::uint64_t mixed(std::uint64_t sum, std::uint64_t word) {
    constexpr std::uint64_t kFactor = 0x9E3779B97F4A7C15U;
    constexpr int kTurn = 29;
    return std::rotl((sum ^ word) * kFactor, kTurn);
}

/// Each lane is named, so that all of them stay in registers.
template <std::size_t... Lane>
ContentSum sumInLanes(ByteView contents, std::index_sequence<Lane...>) {
    std::uint64_t sum = contents.size();
    std::array<std::uint64_t, kLanes> lanes{(Lane + 1)...};
    const auto take = [&lanes](const std::uint8_t* block) {
        ((lanes[Lane] = mixed(lanes[Lane], wordAt(block + Lane * sizeof(std::uint64_t)))), ...);
    };
    for (; contents.size() >= kBlock; contents = contents.subspan(kBlock)) take(contents.data());
    std::array<std::uint8_t, kBlock> rest{};
    std::copy(contents.begin(), contents.end(), rest.begin());
    take(rest.data());
    ((sum = mixed(sum, lanes[Lane])), ...);
    return sum;
}

/// Whether JSON takes all of it as it stands; most texts are so. Eight characters at a time.
bool needsNoEscapes(std::string_view text) {
    const auto isPlain = [](char each) {
        const auto byte = static_cast<unsigned char>(each);
        return byte >= ' ' && byte < 0x7F && each != '"' && each != '\\';
    };
    constexpr std::size_t kStep = 8;
    for (; text.size() >= kStep; text.remove_prefix(kStep)) {
        bool arePlain = true;
        for (std::size_t i = 0; i < kStep; ++i) arePlain = arePlain & isPlain(text[i]);
        if (!arePlain) return false;
    }
    return std::all_of(text.begin(), text.end(), isPlain);
}

/// How many bytes the character that begins so has; 0 where none does.
std::size_t lengthOfCharacter(unsigned char first) {
    if (first < 0x80) return 1;
    if (first >= 0xC2 && first <= 0xDF) return 2;
    if (first >= 0xE0 && first <= 0xEF) return 3;
    return first >= 0xF0 && first <= 0xF4 ? 4 : 0;
}

bool isWhole(std::string_view character) {
    for (const char each : character.substr(1)) {
        if ((static_cast<unsigned char>(each) & 0xC0U) != 0x80U) return false;
    }
    if (character.size() < 3) return true;
    // Neither longer than need be, nor a surrogate, nor beyond the last character.
    const auto first = static_cast<unsigned char>(character[0]);
    const auto second = static_cast<unsigned char>(character[1]);
    return !(first == 0xE0 && second < 0xA0) && !(first == 0xED && second > 0x9F) &&
           !(first == 0xF0 && second < 0x90) && !(first == 0xF4 && second > 0x8F);
}

}  // namespace

ContentSum sumOf(ByteView contents) {
    return sumInLanes(contents, std::make_index_sequence<kLanes>());
}

bool isUtf8(std::string_view bytes) {
    while (!bytes.empty()) {
        const std::size_t length = lengthOfCharacter(static_cast<unsigned char>(bytes.front()));
        if (length == 0 || length > bytes.size() || !isWhole(bytes.substr(0, length))) return false;
        bytes.remove_prefix(length);
    }
    return true;
}

bool isNumberedFormat(std::string_view format) {
    constexpr std::size_t kLongest = 256;
    return format.size() <= kLongest && isUtf8(format);
}

std::string base64(std::string_view bytes) {
    static constexpr std::string_view kDigits =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    constexpr std::size_t kGroup = 3;
    constexpr unsigned kBits = 6;
    std::string text;
    text.reserve((bytes.size() + 2) / kGroup * 4);
    for (std::size_t i = 0; i < bytes.size(); i += kGroup) {
        const std::string_view group = bytes.substr(i, kGroup);
        std::uint32_t word = 0;
        for (std::size_t k = 0; k < kGroup; ++k) {
            word = word << 8U | (k < group.size() ? static_cast<unsigned char>(group[k]) : 0U);
        }
        for (std::size_t k = 0; k <= kGroup; ++k) {
            const unsigned shift = kBits * static_cast<unsigned>(kGroup - k);
            text += k <= group.size() ? kDigits[word >> shift & 63U] : '=';
        }
    }
    return text;
}

std::string quoted(std::string_view text) {
    constexpr char kFirstPrintable = ' ';
    std::string result;
    result.reserve(text.size() + 2);
    result += '"';
    for (const char each : text) {
        if (each == '"' || each == '\\') {
            result += '\\';
            result += each;
        } else if (each >= 0 && each < kFirstPrintable) {
            const std::string digits = hexadecimal(static_cast<unsigned char>(each));
            result += "\\u00" + std::string(2 - digits.size(), '0') + digits;
        } else {
            result += each;
        }
    }
    return result += '"';
}

void RecordText::member(std::string_view name) {
    addName(name);
    text_.put(':');
}

void RecordText::addLiteral(std::string_view text) {
    separate();
    text_.put(text);
}

void RecordText::addName(std::string_view name, std::string_view rest) {
    separate();
    text_.put('"');
    text_.put(name);
    text_.put(rest);
    text_.put('"');
}

void RecordText::addQuoted(std::string_view text) { addLiteral(quoted(text)); }

void RecordText::addPlain(std::string_view text) {
    if (needsNoEscapes(text)) {
        addName(text);
        return;
    }
    if (isUtf8(text)) {
        addQuoted(text);
        return;
    }
    begin('{');
    member("bytes");
    addQuoted(base64(text));
    end('}');
}

void RecordText::add(const RecordText& value) {
    addLiteral(value.text());
    contents_.insert(contents_.end(), value.contents_.begin(), value.contents_.end());
    longContents_.insert(longContents_.end(), value.longContents_.begin(),
                         value.longContents_.end());
}

void RecordText::addNull() { addLiteral("null"); }

void RecordText::addLeftOut() {
    begin('{');
    member("left-out");
    add(true);
    end('}');
}

void RecordText::add(std::string_view text) {
    if (anonymizer_ != nullptr) {
        addPlain(anonymizer_->madeUpFor(text));
    } else {
        addPlain(text);
    }
}

void RecordText::add(bool value) { addLiteral(value ? "true" : "false"); }

void RecordText::add(double value) {
    if (!std::isfinite(value)) {
        addQuoted(std::isnan(value) ? "nan" : value < 0 ? "-inf" : "inf");
        return;
    }
    constexpr std::size_t kLongest = 40;
    std::array<char, kLongest> digits{};
    const auto end = std::to_chars(digits.data(), digits.data() + digits.size(), value);
    addLiteral({digits.data(), end.ptr});
}

void RecordText::addPersonal(const std::string& decimal) {
    if (anonymizer_ != nullptr) {
        addQuoted(anonymizer_->madeUpFor(decimal));
    } else {
        addLiteral(decimal);
    }
}

void RecordText::add(ByteView contents) {
    begin('{');
    member("size");
    add(contents.size());
    if (anonymizer_ == nullptr) {
        ContentSum sum = sumOf(contents);
        if (aliases_ != nullptr) {
            const auto alias = aliases_->find(sum);
            if (alias != aliases_->end()) sum = alias->second;
        }
        addSum(sum);
        if (contents.size() <= limit_) {
            contents_.push_back({sum, contents});
        } else if (!isAnswer_) {
            longContents_.push_back(sum);
        }
    }
    end('}');
}

void RecordText::addSum(ContentSum sum) {
    constexpr int kHexadecimal = 16;
    member("sum");
    text_.put('"');
    text_.putNumber(sum, kHexadecimal);
    text_.put('"');
}

void RecordText::add(const PropertyList& list) {
    if (anonymizer_ != nullptr) return addLeftOut();
    RecordText tree(nullptr, limit_);
    tree.setAliases(aliases_);
    tree.isAnswer_ = isAnswer_;
    tree.addTree(list);
    if (tree.text().size() <= kLongestList || isAnswer_) return add(tree);
    begin('{');
    member("long");
    add(tree.text().size());
    addSum(sumOf(bytesOf(tree.text())));
    end('}');
}

void RecordText::addTree(const PropertyList& list) {
    const auto wrapped = [this](std::string_view name, const auto& value) {
        begin('{');
        member(name);
        add(value);
        end('}');
    };
    switch (list.kind()) {
        case PropertyList::Kind::Null:
            return addNull();
        case PropertyList::Kind::Boolean:
            return add(*list.asBoolean());
        case PropertyList::Kind::Integer:
            return add(*list.asInteger());
        case PropertyList::Kind::Unsigned:
            return add(*list.asUnsigned());
        case PropertyList::Kind::Real:
            return wrapped("real", *list.asReal());
        case PropertyList::Kind::Date:
            return wrapped("date", list.asDate()->secondsSince2001);
        case PropertyList::Kind::Data:
            return wrapped("data", *list.asData());
        case PropertyList::Kind::String:
            return add(*list.asString());
        case PropertyList::Kind::Array:
            begin('[');
            for (const PropertyList& each : list.elements()) addTree(each);
            return end(']');
        case PropertyList::Kind::Map:
            begin('{');
            member("map");
            begin('[');
            for (const PropertyList::Entry& each : list.entries()) {
                add(each.key);
                addTree(each.value);
            }
            end(']');
            return end('}');
    }
}

void RecordText::add(const std::optional<PropertyList>& list) {
    if (!list) return addNull();
    begin('[');
    add(*list);
    end(']');
}

void RecordText::add(const FileURL& url) {
    begin('[');
    add(url.path());
    add(url.isDirectory());
    end(']');
}

void RecordText::add(const ErrorRecord& error) {
    begin('[');
    add(error.domain);
    add(error.code);
    add(error.userInfo);
    end(']');
}

void RecordText::add(const AppProxy& proxy) {
    begin('[');
    add(proxy.applicationIdentifier);
    add(proxy.bundleVersion);
    add(proxy.displayName);
    add(proxy.bundlePath);
    add(proxy.bundleContainerPath);
    add(proxy.applicationType);
    add(proxy.installType);
    add(proxy.state.installed);
    add(proxy.state.placeholder);
    add(proxy.staticDiskUsage);
    end(']');
}

void RecordText::add(const FileAttributes& attributes) {
    begin('[');
    add(attributes.owner);
    add(attributes.group);
    end(']');
}

void RecordText::add(const ItemAttributes& attributes) {
    begin('[');
    add(attributes.size);
    add(attributes.isDirectory);
    end(']');
}

void RecordText::add(const InstallOptions& options) {
    begin('[');
    add(options.storeMetadata);
    add(options.installType);
    add(options.installTargetType);
    end(']');
}

void RecordText::add(const PlaceholderAttributes& attributes) {
    begin('[');
    add(attributes.info);
    add(attributes.launchProhibited);
    add(attributes.bundleVersion);
    end(']');
}

void RecordText::add(const StoreMetadata& metadata) { add(metadata.metadata); }

void RecordText::add(const LogArgument& argument) {
    const auto addOne = [this](const auto& value) {
        using Value = std::decay_t<decltype(value)>;
        if constexpr (std::is_same_v<Value, std::nullptr_t>) {
            addNull();
        } else if constexpr (std::is_pointer_v<Value>) {
            if (value == nullptr) return addNull();
            if (anonymizer_ != nullptr) return addLeftOut();
            addPlain(describe(*value, kLongestDescription));
        } else {
            add(value);
        }
    };
    std::visit(addOne, argument);
}

void RecordText::add(const MessageArguments& message) {
    begin('[');
    for (const LogArgument& each : message.arguments) {
        const auto* text = std::get_if<std::string_view>(&each);
        const bool isFirst = &each == message.arguments.data();
        if (text != nullptr && isFirst && *text == message.ownIdentifier) {
            add(0);
        } else {
            add(each);
        }
    }
    end(']');
}

void RecordText::add(const PersonIdentifier& person) {
    std::visit([this](auto number) { addPersonal(std::to_string(number)); }, person);
}

void RecordText::add(const SyncAccountInfo& account) {
    begin('[');
    add(account.accountID);
    add(account.personID);
    add(account.alternatePersonID);
    end(']');
}

void RecordText::add(const Status& status) { add(status ? nullptr : &status.error()); }

}  // namespace appsync
