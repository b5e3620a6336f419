#include "system/file/MachinePath.h"

#include <algorithm>
#include <string_view>

namespace appsync {

namespace {

constexpr std::string_view kBundleSuffix = ".app";
constexpr std::string_view kReplacedSuffix = "~app";

std::string machineName(std::string_view name) {
    const bool isLongBundle = name.size() > kLongestMachineName && name.ends_with(kBundleSuffix) &&
                              name.size() - kBundleSuffix.size() <= kLongestMachineName &&
                              name.find('~') == std::string_view::npos;
    if (!isLongBundle) return std::string(name);
    name.remove_suffix(kBundleSuffix.size());
    if (!name.ends_with(kBundleSuffix)) return std::string(name);
    name.remove_suffix(kBundleSuffix.size());
    return std::string(name).append(kReplacedSuffix);
}

}  // namespace

std::string machinePath(const std::string& path) {
    if (path.size() <= kLongestMachineName) return path;
    std::string result;
    for (std::size_t begin = 0; begin <= path.size();) {
        const std::size_t end = std::min(path.find('/', begin), path.size());
        if (begin > 0) result += '/';
        result += machineName(std::string_view(path).substr(begin, end - begin));
        begin = end + 1;
    }
    return result;
}

}  // namespace appsync
