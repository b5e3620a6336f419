#include "client/Paths.h"

#include <cstddef>

namespace appsync {

std::string formatPath(std::string_view format, std::initializer_list<std::string_view> parts) {
    constexpr std::size_t placeHolderLength = 2;
    std::string path;
    const auto* part = parts.begin();
    for (std::size_t at = format.find('%'); at != format.npos; at = format.find('%')) {
        path += format.substr(0, at);
        if (part != parts.end()) path += *part++;
        format.remove_prefix(at + placeHolderLength);
    }
    return path += format;
}

std::string receivedFilePath(const std::string& path) {
    if (path.starts_with('/')) return path;
    return formatPath(kInDirectoryFormat, {kPublicStaging, path});
}

}  // namespace appsync
