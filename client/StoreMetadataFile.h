#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "client/Log.h"
#include "platform/PropertyList.h"

namespace appsync {

struct AppProxy;
struct Platform;

/// Where an application's store metadata lies: in the root of its bundle container.
[[nodiscard]] std::string storeMetadataPath(const AppProxy& proxy);

/// An application's store metadata file, as far as it tells who bought it. A value of another type
/// than expected is logged and counts as absent. A number is an integer that 64 bits hold, signed.
class StoreMetadataFile {
  public:
    /// Reads the file; one that is missing or damaged holds nothing.
    StoreMetadataFile(const Platform& platform, const AppProxy& proxy);

    /// The account identifier at the top level. Each call looks, and logs, again.
    [[nodiscard]] const std::string* korvuID() const;

    /// What the download information says of the account.
    class AccountInfo {
      public:
        /// The account identifier.
        [[nodiscard]] const std::string* korvuID() const;
        [[nodiscard]] std::optional<std::int64_t> personID() const;
        [[nodiscard]] const std::string* alternatePersonID() const;

      private:
        friend class StoreMetadataFile;
        AccountInfo(const Log& log, const PropertyList* map) : log_(log), map_(map) {}

        Log log_;
        const PropertyList* map_;  // belongs to the file; null when there is none
    };
    /// Lives no longer than this object.
    [[nodiscard]] AccountInfo accountInfo() const;

  private:
    Log log_;
    PropertyList map_;
};

}  // namespace appsync
