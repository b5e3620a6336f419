#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/Bytes.h"
#include "platform/InstallPromises.h"
#include "platform/PropertyList.h"
#include "platform/Result.h"

namespace appsync {

/// What the store says of an application: the store metadata, a map as it was read. An empty map
/// is a record that says nothing.
struct StoreMetadata {
    PropertyList metadata = PropertyList::map();

    friend bool operator==(const StoreMetadata&, const StoreMetadata&) = default;
};

/// What a placeholder tells of the application that is to come.
struct PlaceholderAttributes {
    /// The application's info dictionary; an empty map when there is none.
    PropertyList info = PropertyList::map();
    bool launchProhibited = false;
    std::optional<std::string> bundleVersion;

    friend bool operator==(const PlaceholderAttributes&, const PlaceholderAttributes&) = default;
};

/// What stands on the home screen for an application that is to come. Made by the service, filled
/// by its client, handed to a coordinator as the placeholder promise. Its configuration is complete
/// when `setConfigurationComplete` has succeeded; once the coordinator has such a placeholder, the
/// service puts it on the home screen. One whose configuration never completes is kept and not
/// shown.
///
/// Used by one thread at a time. A second set of the same piece replaces the first, until the
/// configuration is complete; from then on every set is refused.
class InstallPlaceholder {
  public:
    virtual ~InstallPlaceholder() = default;

    /// How it appears in messages.
    [[nodiscard]] virtual std::string description() const = 0;

    /// The icon. Its file is the service's as with every promise that is kept with a file: it is
    /// read when the placeholder is put on the home screen.
    virtual Status setIconPromise(const std::shared_ptr<PathTransferPromise>& promise) = 0;
    virtual Status setAttributes(const PlaceholderAttributes& attributes) = 0;
    /// Nothing is allowed, and says that there is no store metadata.
    virtual Status setMetadata(const std::optional<StoreMetadata>& metadata) = 0;
    /// The application's SINF data, kept as it is.
    virtual Status setSinf(const Bytes& sinf) = 0;
    virtual Status setConfigurationComplete() = 0;

    /// Gives it up: it never comes to stand on the home screen.
    virtual void cancelForReason(const ErrorRecord& reason, CoordinationClient client) = 0;
};

}  // namespace appsync
