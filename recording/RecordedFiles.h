#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "platform/FileSystem.h"
#include "platform/PropertyListSerialization.h"

namespace appsync {

class Recording;

class RecordedFiles : public FileSystem {
  public:
    RecordedFiles(FileSystem& inner, Recording& recording) : inner_(inner), recording_(recording) {}

    bool itemExists(const std::string& path) override;
    Result<ItemAttributes> attributes(const std::string& path) override;
    Status createDirectory(const std::string& path, bool withIntermediates,
                           const FileAttributes* attributes) override;
    Status removeItem(const std::string& path) override;
    Status moveItem(const std::string& from, const std::string& to) override;
    Status copyItem(const std::string& from, const std::string& to) override;
    Result<Bytes> readFile(const std::string& path) override;
    Status writeFileAtomically(const std::string& path, ByteView contents) override;
    Status createFile(const std::string& path, ByteView contents,
                      const FileAttributes& attributes) override;
    Status setTimesToNow(const std::string& path) override;
    std::string temporaryDirectory() override;

  private:
    FileSystem& inner_;
    Recording& recording_;
};

/// What a list says is known from the bytes, so only sizes and refusals are written.
class RecordedPropertyLists : public PropertyListSerialization {
  public:
    RecordedPropertyLists(PropertyListSerialization& inner, Recording& recording)
        : inner_(inner), recording_(recording) {}

    Result<PropertyList> parse(ByteView bytes) override;
    Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) override;
    bool replaceText(Bytes& bytes, std::size_t index, std::string_view key,
                     std::string_view text) override;

  private:
    PropertyListSerialization& inner_;
    Recording& recording_;
};

}  // namespace appsync
