#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace appsync {

/// A file URL: an absolute device path, and whether it names a directory.
class FileURL {
  public:
    /// From a path in POSIX style. Nothing when the path is empty or holds a NUL.
    [[nodiscard]] static std::optional<FileURL> fromPath(std::string_view path, bool isDirectory);

    [[nodiscard]] const std::string& path() const noexcept { return path_; }
    [[nodiscard]] bool isDirectory() const noexcept { return isDirectory_; }

    /// The URL's text: "file://" and the path, percent-encoded; a directory ends with a slash.
    [[nodiscard]] std::string text() const;

    friend bool operator==(const FileURL&, const FileURL&) = default;

  private:
    FileURL(std::string path, bool isDirectory);

    std::string path_;
    bool isDirectory_ = false;
};

}  // namespace appsync
