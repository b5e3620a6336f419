#include "recording/Anonymizer.h"

#include <algorithm>
#include <array>
#include <cctype>

namespace appsync {
namespace {

/// What the system itself is made of.
constexpr std::array<std::string_view, 54> kSystemWords = {"var",
                                                           "mobile",
                                                           "Media",
                                                           "PublicStaging",
                                                           "ApplicationSync",
                                                           "Library",
                                                           "Logs",
                                                           "MediaServices",
                                                           "Containers",
                                                           "containers",
                                                           "Bundle",
                                                           "Application",
                                                           "Data",
                                                           "tmp",
                                                           "private",
                                                           "zip",
                                                           "app",
                                                           "plist",
                                                           "png",
                                                           "User",
                                                           "System",
                                                           "com",
                                                           "korvu",
                                                           "trd",
                                                           "bakvia",
                                                           "appsync",
                                                           "Customer",
                                                           "Placeholder",
                                                           "POSIX",
                                                           "TRError",
                                                           "RegistaError",
                                                           "PropertyList",
                                                           "Info",
                                                           "InstallerService",
                                                           "VessikMetadata",
                                                           "VessikRestore",
                                                           "VessikArtwork",
                                                           "ApplicationsSync",
                                                           "DeskoraIconState",
                                                           "RestoreState",
                                                           "Preferences",
                                                           "Staging",
                                                           "public",
                                                           "TRStartupCompleteNotification",
                                                           "root",
                                                           "wheel",
                                                           "Applications",
                                                           "bundle",
                                                           "data",
                                                           "null",
                                                           "metadata",
                                                           "icon",
                                                           "sync",
                                                           "anchor"};

bool isSystemWord(std::string_view word) {
    return std::find(kSystemWords.begin(), kSystemWords.end(), word) != kSystemWords.end();
}

bool isOfWord(char character) {
    const auto byte = static_cast<unsigned char>(character);
    return byte >= 0x80 || std::isalnum(byte) != 0;
}

/// 'A', 'a' or '0'. What is no letter of ASCII counts as a small one.
char formOf(char character) {
    const auto byte = static_cast<unsigned char>(character);
    if (byte >= 0x80) return 'a';
    if (std::isdigit(byte) != 0) return '0';
    return std::isupper(byte) != 0 ? 'A' : 'a';
}

}  // namespace

std::string Anonymizer::madeUpFor(std::string_view text) {
    const std::lock_guard guard(mutex_);
    std::string made;
    made.reserve(text.size());
    while (!text.empty()) {
        const auto* const end = std::find_if_not(text.begin(), text.end(), isOfWord);
        const auto length = static_cast<std::size_t>(end - text.begin());
        if (length == 0) {
            made += text.front();
            text.remove_prefix(1);
            continue;
        }
        const std::string_view word = text.substr(0, length);
        made += isSystemWord(word) ? std::string(word) : wordFor(std::string(word));
        text.remove_prefix(length);
    }
    return made;
}

const std::string& Anonymizer::wordFor(const std::string& word) {
    std::string& made = words_[word];
    if (!made.empty()) return made;
    do {
        made = nextWordLike(word);
    } while (made == word || isSystemWord(made) || !taken_.insert(made).second);
    return made;
}

/// The next number of words of this form, spelled in its letters and digits. Where the form is too
/// short for all of its words, the number makes the word longer.
std::string Anonymizer::nextWordLike(std::string_view word) {
    std::string form;
    form.reserve(word.size());
    for (const char each : word) form += formOf(each);
    std::uint64_t number = counters_[form]++;
    std::string made = form;
    for (auto place = made.rbegin(); place != made.rend(); ++place) {
        const std::uint64_t base = *place == '0' ? 10 : 26;
        *place = static_cast<char>(*place + static_cast<char>(number % base));
        number /= base;
    }
    for (; number > 0; number /= 26)
        made += static_cast<char>('a' + static_cast<char>(number % 26));
    return made;
}

}  // namespace appsync
