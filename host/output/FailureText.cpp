#include "host/output/FailureText.h"

#include <cstddef>
#include <string_view>

#include "device/values/PackageIdentifier.h"
#include "platform/Error.h"

namespace appsync {
namespace {

constexpr std::string_view kBoundaries = " '\":;,()";

bool isBoundary(const std::string& text, std::size_t position) {
    return position >= text.size() || kBoundaries.find(text[position]) != std::string_view::npos;
}

}  // namespace

std::string failureText(const std::string& identifier, const ErrorRecord& error) {
    constexpr std::string_view kItsPackage = "its package";
    constexpr std::string_view kAnnounced = "package ";
    const std::string name = "/" + archiveNameOf(identifier);
    std::string text = error.description();
    std::size_t found = text.find(name);
    for (; found != std::string::npos; found = text.find(name, found + 1)) {
        std::size_t end = found + name.size();
        if (!isBoundary(text, end)) continue;
        std::size_t begin = text.find_last_of(kBoundaries, found) + 1;
        if (text[begin] != '/') continue;
        const bool isQuoted = begin > 0 && text[begin - 1] == '\'' && text[end] == '\'';
        if (isQuoted) {
            --begin;
            ++end;
        }
        if (std::string_view(text).substr(0, begin).ends_with(kAnnounced))
            begin -= kAnnounced.size();
        text.replace(begin, end - begin, kItsPackage);
        found = begin;
    }
    return text;
}

}  // namespace appsync
