#pragma once

#include <string>
#include <utility>

#include "checked/BreachBook.h"
#include "platform/FileSystem.h"
#include "platform/PropertyListSerialization.h"

namespace appsync {

/// Looks at the errors of a file system.
class CheckedFileSystem final : public FileSystem {
  public:
    CheckedFileSystem(FileSystem& files, BreachBook& book) : files_(files), book_(book) {}

    [[nodiscard]] bool itemExists(const std::string& path) override {
        return files_.itemExists(path);
    }
    Result<ItemAttributes> attributes(const std::string& path) override {
        return checked("attributes", files_.attributes(path));
    }
    Status createDirectory(const std::string& path, bool withIntermediates,
                           const FileAttributes* attributes) override {
        return checked("createDirectory",
                       files_.createDirectory(path, withIntermediates, attributes));
    }
    Status removeItem(const std::string& path) override {
        return checked("removeItem", files_.removeItem(path));
    }
    Status moveItem(const std::string& from, const std::string& to) override {
        return checked("moveItem", files_.moveItem(from, to));
    }
    Status copyItem(const std::string& from, const std::string& to) override {
        return checked("copyItem", files_.copyItem(from, to));
    }
    Result<Bytes> readFile(const std::string& path) override {
        return checked("readFile", files_.readFile(path));
    }
    Status writeFileAtomically(const std::string& path, ByteView contents) override {
        return checked("writeFileAtomically", files_.writeFileAtomically(path, contents));
    }
    Status createFile(const std::string& path, ByteView contents,
                      const FileAttributes& attributes) override {
        return checked("createFile", files_.createFile(path, contents, attributes));
    }
    Status setTimesToNow(const std::string& path) override {
        return checked("setTimesToNow", files_.setTimesToNow(path));
    }
    [[nodiscard]] std::string temporaryDirectory() override {
        std::string path = files_.temporaryDirectory();
        if (path.empty() || path.ends_with('/')) {
            book_.broken("platform/FileSystem.h",
                         "The process's directory for temporary files, without a slash at its end.",
                         "temporaryDirectory gave '" + path + "'");
        }
        return path;
    }

  private:
    template <typename Value>
    Result<Value> checked(std::string_view call, Result<Value> result) {
        if (!result) check(call, result.error());
        return result;
    }
    void check(std::string_view call, const ErrorRecord& error) {
        const bool hasSentence = error.userInfo.findString("description") != nullptr;
        if (error.domain == kPosixErrorDomain && error.code > 0 && hasSentence) return;
        book_.broken("platform/FileSystem.h",
                     "Failures are errors of `kPosixErrorDomain` with the errno value and a "
                     "sentence that names the operation and the path.",
                     std::string(call) + " gave the code " + std::to_string(error.code) + " of '" +
                         error.domain + "'" + (hasSentence ? "" : ", without a sentence"));
    }

    FileSystem& files_;
    BreachBook& book_;
};

/// Looks at the errors of what reads and writes property lists.
class CheckedPropertyLists final : public PropertyListSerialization {
  public:
    CheckedPropertyLists(PropertyListSerialization& codec, BreachBook& book)
        : codec_(codec), book_(book) {}

    Result<PropertyList> parse(ByteView bytes) override {
        Result<PropertyList> parsed = codec_.parse(bytes);
        if (!parsed && parsed.error().domain != kPropertyListErrorDomain) {
            book_.broken("platform/PropertyListSerialization.h",
                         "An error of `kPropertyListErrorDomain` says where (byte offset, or line "
                         "and column) and what was expected.",
                         "parse gave an error of '" + parsed.error().domain + "'");
        }
        return parsed;
    }
    Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) override {
        Result<Bytes> bytes = codec_.serialize(value, format);
        if (!bytes) book_.checkDomain(bytes.error(), "serialize");
        return bytes;
    }
    bool replaceText(Bytes& bytes, std::size_t index, std::string_view key,
                     std::string_view text) override {
        return codec_.replaceText(bytes, index, key, text);
    }

  private:
    PropertyListSerialization& codec_;
    BreachBook& book_;
};

}  // namespace appsync
