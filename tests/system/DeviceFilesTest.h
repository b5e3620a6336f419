#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>

#include "platform/Bytes.h"
#include "system/file/RootedFileSystem.h"

namespace appsync::device_files {

/// A fresh directory of the machine, removed with everything in it at the end.
class ScratchDirectory {
  public:
    ScratchDirectory();
    ScratchDirectory(const ScratchDirectory&) = delete;
    ScratchDirectory& operator=(const ScratchDirectory&) = delete;
    ~ScratchDirectory();

    [[nodiscard]] const std::filesystem::path& path() const { return path_; }

  private:
    std::filesystem::path path_;
};

[[nodiscard]] Bytes bytes(std::string_view text);
[[nodiscard]] std::string text(const Bytes& contents);

/// A device's files over a scratch directory, with a file beside the root that nobody may reach.
class DeviceFilesTest : public ::testing::Test {
  protected:
    static constexpr std::string_view kSecret = "outside";

    DeviceFilesTest();

    /// The machine's path of a device path.
    [[nodiscard]] std::filesystem::path real(std::string_view devicePath) const;
    /// Puts a file there, parents included, behind the file system's back.
    void put(std::string_view devicePath, std::string_view contents) const;
    void link(std::string_view devicePath, const std::filesystem::path& target) const;
    void pipe(std::string_view devicePath) const;
    /// What a file holds; "(none)" when there is none.
    [[nodiscard]] std::string contents(std::string_view devicePath) const;
    /// The names in a directory, sorted.
    [[nodiscard]] std::vector<std::string> names(std::string_view devicePath) const;
    [[nodiscard]] std::filesystem::path outside() const { return scratch_.path() / "outside"; }
    [[nodiscard]] bool outsideIsUntouched() const;

    ScratchDirectory scratch_;
    std::unique_ptr<RootedFileSystem> files_;
};

}  // namespace appsync::device_files
