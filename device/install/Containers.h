#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Result.h"
#include "system/file/UniqueFd.h"

namespace appsync {

class RootedFileSystem;

/// A fresh container that belongs to no record yet: it is removed again unless it is kept.
class NewContainer {
  public:
    NewContainer(RootedFileSystem& files, std::string name, UniqueFd directory);
    NewContainer(NewContainer&& other) noexcept;
    NewContainer(const NewContainer&) = delete;
    NewContainer& operator=(const NewContainer&) = delete;
    NewContainer& operator=(NewContainer&&) = delete;
    ~NewContainer();

    [[nodiscard]] const std::string& name() const noexcept { return name_; }
    [[nodiscard]] int descriptor() const noexcept { return directory_.get(); }

    /// A record refers to it now.
    void keep() noexcept { kept_ = true; }

  private:
    RootedFileSystem& files_;
    std::string name_;
    UniqueFd directory_;
    bool kept_ = false;
};

/// Whether a name is that of one thing in a directory, as those of containers and bundles are. Out
/// of a database that somebody has altered it could be the path of anything.
[[nodiscard]] bool isSingleName(std::string_view name) noexcept;

/// The containers of bundles on disk: directories with names that never come twice. Callable on any
/// thread.
class Containers {
  public:
    explicit Containers(RootedFileSystem& files) : files_(files) {}

    [[nodiscard]] Result<NewContainer> make();

    /// Removes a container and everything in it. What cannot be removed is left for the next
    /// session to clear; an empty name stands for none.
    void remove(const std::string& name);

    /// The names of all that is there, in no order.
    [[nodiscard]] Result<std::vector<std::string>> names() const;

  private:
    RootedFileSystem& files_;
};

}  // namespace appsync
