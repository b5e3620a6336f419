#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

class Database;
class PropertyList;
struct BundleRow;
struct InstallContext;

/// What a placeholder is made from.
struct PlaceholderSource {
    std::string identifier;  // a legal one
    /// Device path of a directory with Info.plist and perhaps an icon: regular files.
    std::string bundle;
    std::uint64_t installType = 0;
    std::optional<Bytes> storeMetadata;
    std::optional<Bytes> sinf;
};

/// Puts a copy of the bundle on the device as the placeholder of its application, in place of one
/// that was there, and begins its progress, unless the application is demoted: no install is under
/// way for those. An application that the placeholder covers stays as it is. Any thread.
///
/// Everything is on disk afterwards, except where a new placeholder comes from a sync: that one may
/// be lost with the power of the machine, as the next sync makes it again.
Status installPlaceholder(const InstallContext& context, const PlaceholderSource& source);

/// A placeholder whose bundle is made here.
struct PlaceholderContents {
    std::string identifier;  // a legal one
    /// The info dictionary, whole.
    const PropertyList& info;
    /// Device path of an icon file; nothing when there is none. One that cannot be read is left
    /// out.
    std::optional<std::string> iconFile;
    std::uint64_t installType = 0;
    std::optional<Bytes> storeMetadata;
    std::optional<Bytes> sinf;
    bool isNew = false;  // the caller has looked: no placeholder of the application stands yet
};

/// The same for a placeholder that is made here. `alsoCommitted` goes into the transaction that
/// makes it stand; when that fails, nothing has changed. The failure is not kept.
Status installPlaceholderWith(const InstallContext& context, const PlaceholderContents& contents,
                              const std::function<Status(Database&)>& alsoCommitted);

/// Whether the install type is that of an application whose bundle was taken away.
[[nodiscard]] bool isDemotedType(std::uint64_t installType) noexcept;

/// Replaces an application by its own placeholder. The application's bundle goes, its data stays.
Status demoteApplication(const InstallContext& context, const std::string& identifier,
                         std::uint64_t installType);

}  // namespace appsync
