#pragma once

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

#include "platform/Bytes.h"
#include "platform/FileURL.h"
#include "platform/LogFacility.h"
#include "platform/PropertyList.h"
#include "platform/Result.h"
#include "platform/SyncAccountInfo.h"
#include "recording/LineBuffer.h"

namespace appsync {

class Anonymizer;
struct AppProxy;
struct FileAttributes;
struct InstallOptions;
struct ItemAttributes;
struct PlaceholderAttributes;
struct StoreMetadata;

/// What contents are known by: equal ones have the same, and others hardly ever do.
using ContentSum = std::uint64_t;
[[nodiscard]] ContentSum sumOf(ByteView contents);

/// Contents that a record names by size and sum.
struct NamedContents {
    ContentSum sum = 0;
    ByteView bytes;
};

/// A text that nobody has chosen.
struct PlainText {
    std::string_view text;
};

/// What a message is made from. The plug-in has some dozens, each of which is written once.
struct MessageFormat {
    std::string_view format;
};

/// What a message is made with. The identifier with which the plug-in's messages begin is 0 there.
struct MessageArguments {
    std::span<const LogArgument> arguments;
    std::string_view ownIdentifier;
};

/// The JSON text of a record in the making: values are added one behind the other, commas come by
/// themselves. The form of each kind of value is in docs/recording-format.md.
///
/// With an anonymizer every text is replaced by what that makes up for it, and what holds contents
/// is left out.
class RecordText {
  public:
    /// Contents of up to `limit` bytes are collected beside the text. They are not copied: who has
    /// them keeps them until the record is written.
    RecordText(Anonymizer* anonymizer, std::size_t limit)
        : anonymizer_(anonymizer), limit_(limit) {}

    /// The sums that contents are named by in the place of their own.
    void setAliases(const std::map<ContentSum, ContentSum>* aliases) { aliases_ = aliases; }
    /// What follows is an answer, of which contents of up to so many bytes are collected, and lists
    /// are whole.
    void answers(std::size_t limit) {
        limit_ = limit;
        isAnswer_ = true;
    }

    /// A message's format is left out of it.
    [[nodiscard]] std::string_view text() const { return text_.text(); }
    /// Of a message, and where in the text it belongs.
    [[nodiscard]] const std::optional<MessageFormat>& format() const { return format_; }
    [[nodiscard]] std::size_t placeOfFormat() const { return placeOfFormat_; }
    [[nodiscard]] const std::vector<NamedContents>& contents() const { return contents_; }
    /// The sums of longer contents, those of answers left out.
    [[nodiscard]] const std::vector<ContentSum>& longContents() const { return longContents_; }

    /// `"name":`, a value follows. The name stays as it is.
    void member(std::string_view name);
    void begin(char bracket) {
        separate();
        text_.put(bracket);
    }
    void end(char bracket) { text_.put(bracket); }
    /// The name of a call, in one piece or two, which JSON needs no escapes for.
    void addName(std::string_view name, std::string_view rest = {});
    /// A text that nobody has chosen: it stays as it is.
    void addPlain(std::string_view text);
    void addNull();

    void add(std::string_view text);
    /// A value that was written down already.
    void add(const RecordText& value);
    void add(const std::string& text) { add(std::string_view(text)); }
    void add(const char* text) { add(std::string_view(text)); }
    void add(bool value);
    void add(double value);
    template <std::integral Number>
    requires(!std::same_as<Number, bool>) void add(Number value) {
        separate();
        text_.putNumber(value);
    }
    template <typename Enumeration>
    requires std::is_enum_v<Enumeration>
    void add(Enumeration value) { add(static_cast<std::int64_t>(value)); }
    /// A number that is somebody's.
    void addPersonal(const std::string& decimal);

    void add(ByteView contents);
    void add(const Bytes& contents) { add(ByteView(contents)); }
    void add(const PropertyList& list);
    void add(const FileURL& url);
    void add(const ErrorRecord& error);
    void add(const AppProxy& proxy);
    void add(const FileAttributes& attributes);
    void add(const ItemAttributes& attributes);
    void add(const InstallOptions& options);
    void add(const PlaceholderAttributes& attributes);
    void add(const StoreMetadata& metadata);
    void add(const LogArgument& argument);
    void add(const MessageArguments& message);
    void add(const PlainText& plain) { addPlain(plain.text); }
    /// Not the first of a list.
    void add(const MessageFormat& format) {
        separate();
        format_ = format;
        placeOfFormat_ = text_.text().size();
    }
    void add(const PersonIdentifier& person);
    void add(const SyncAccountInfo& account);
    void add(const Status& status);
    template <typename Value>
    void add(const Result<Value>& result) {
        begin('{');
        member(result ? "ok" : "error");
        if (result) {
            add(*result);
        } else {
            add(result.error());
        }
        end('}');
    }
    template <typename Value>
    void add(const Value* value) {
        if (value != nullptr) {
            add(*value);
        } else {
            addNull();
        }
    }
    template <typename Value>
    void add(const std::optional<Value>& value) {
        add(value ? &*value : nullptr);
    }
    /// In brackets: a property list may be null itself.
    void add(const std::optional<PropertyList>& list);
    template <typename Value>
    void add(const std::vector<Value>& values) {
        addEach(values);
    }
    template <typename Value>
    void add(const std::set<Value>& values) {
        addEach(values);
    }
    void add(std::span<const std::string> values) { addEach(values); }

  private:
    void separate() {
        if (text_.isEmpty()) return;
        const char last = text_.last();
        if (last != '[' && last != '{' && last != ':') text_.put(',');
    }
    void addLiteral(std::string_view text);
    void addQuoted(std::string_view text);
    void addTree(const PropertyList& list);
    void addLeftOut();
    void addSum(ContentSum sum);
    template <typename Values>
    void addEach(const Values& values) {
        begin('[');
        for (const auto& each : values) add(each);
        end(']');
    }

    Anonymizer* anonymizer_;
    std::size_t limit_;
    const std::map<ContentSum, ContentSum>* aliases_ = nullptr;
    LineBuffer text_;
    std::vector<NamedContents> contents_;
    std::vector<ContentSum> longContents_;
    bool isAnswer_ = false;
    std::optional<MessageFormat> format_;
    std::size_t placeOfFormat_ = 0;
};

/// Whether the bytes are text in UTF-8.
[[nodiscard]] bool isUtf8(std::string_view bytes);
/// Whether a format of messages is named by a number once it was written. So no line tells much
/// more than it holds.
[[nodiscard]] bool isNumberedFormat(std::string_view format);
/// The bytes in base 64.
[[nodiscard]] std::string base64(std::string_view bytes);
/// The text in the quotes of JSON. It is UTF-8.
[[nodiscard]] std::string quoted(std::string_view text);

}  // namespace appsync
