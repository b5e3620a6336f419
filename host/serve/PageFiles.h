#pragma once

#include <span>
#include <string_view>

namespace appsync {

/// A file of the page (host/serve/page). They are a part of the command: none is looked for on
/// disk.
struct PageFile {
    std::string_view name;
    std::string_view type;
    std::string_view text;
};

/// All of them. Defined in a source that CMake makes of the files.
[[nodiscard]] std::span<const PageFile> pageFiles();

}  // namespace appsync
