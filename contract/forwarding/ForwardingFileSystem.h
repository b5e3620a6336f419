#pragma once

#include <string>

#include "platform/FileSystem.h"

namespace appsync {

/// Files that another file system keeps: each call goes there as it is. For wrappers that change
/// or watch some of the calls. The target is borrowed.
class ForwardingFileSystem : public FileSystem {
  public:
    using Service = FileSystem;

    explicit ForwardingFileSystem(FileSystem& target) : target_(target) {}

    [[nodiscard]] bool itemExists(const std::string& path) override {
        return target_.itemExists(path);
    }
    Result<ItemAttributes> attributes(const std::string& path) override {
        return target_.attributes(path);
    }
    Status createDirectory(const std::string& path, bool withIntermediates,
                           const FileAttributes* attributes) override {
        return target_.createDirectory(path, withIntermediates, attributes);
    }
    Status removeItem(const std::string& path) override { return target_.removeItem(path); }
    Status moveItem(const std::string& from, const std::string& to) override {
        return target_.moveItem(from, to);
    }
    Status copyItem(const std::string& from, const std::string& to) override {
        return target_.copyItem(from, to);
    }
    Result<Bytes> readFile(const std::string& path) override { return target_.readFile(path); }
    Status writeFileAtomically(const std::string& path, ByteView contents) override {
        return target_.writeFileAtomically(path, contents);
    }
    Status createFile(const std::string& path, ByteView contents,
                      const FileAttributes& attributes) override {
        return target_.createFile(path, contents, attributes);
    }
    Status setTimesToNow(const std::string& path) override { return target_.setTimesToNow(path); }
    [[nodiscard]] std::string temporaryDirectory() override { return target_.temporaryDirectory(); }

  protected:
    [[nodiscard]] FileSystem& target() { return target_; }

  private:
    FileSystem& target_;
};

}  // namespace appsync
