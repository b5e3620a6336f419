#include "host/plan/Library.h"

#include <algorithm>
#include <tuple>
#include <utility>

#include "host/plan/Versions.h"

namespace appsync {
namespace {

// By identifier; among equal ones the package to keep comes first.
bool comesBefore(const LibraryPackage& left, const LibraryPackage& right) {
    if (left.identifier != right.identifier) return left.identifier < right.identifier;
    const std::weak_ordering order = compareVersions(left.version, right.version);
    if (order != 0) return order > 0;
    return left.file < right.file;
}

std::string hiddenNote(const LibraryPackage& hidden, const LibraryPackage& kept) {
    return hidden.file + " is left out: it holds " + hidden.identifier + " " + hidden.version +
           ", and " + kept.file + " " + kept.version;
}

}  // namespace

const LibraryPackage* Library::find(const std::string& identifier) const {
    const auto found = std::lower_bound(packages.begin(), packages.end(), identifier,
                                        [](const LibraryPackage& package, const std::string& key) {
                                            return package.identifier < key;
                                        });
    return found != packages.end() && found->identifier == identifier ? &*found : nullptr;
}

std::vector<LibraryPackage> keepHighestVersions(std::vector<LibraryPackage> packages,
                                                std::vector<std::string>& notes) {
    std::sort(packages.begin(), packages.end(), comesBefore);
    std::vector<LibraryPackage> kept;
    kept.reserve(packages.size());
    for (LibraryPackage& package : packages) {
        if (!kept.empty() && kept.back().identifier == package.identifier) {
            notes.push_back(hiddenNote(package, kept.back()));
        } else {
            kept.push_back(std::move(package));
        }
    }
    return kept;
}

}  // namespace appsync
