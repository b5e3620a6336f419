#pragma once

#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Bytes.h"
#include "platform/PropertyList.h"
#include "platform/Result.h"

namespace appsync {

struct Platform;

/// The only property in use: where the package of an application being restored was received.
inline constexpr std::string_view kRestoreStatePathKey = "path";

/// RestoreState.plist, read once: application identifier, version and property name lead to a
/// value.
///
/// A file that is missing or cannot be read is empty; one that is there but is no property list, or
/// whose root is no map, is damaged: it holds nothing, and is not written over. A level that is no
/// map counts as missing.
class RestoreState {
  public:
    /// Reads the file, uncached.
    explicit RestoreState(const Platform& platform);
    /// What reading the file gave.
    RestoreState(const Platform& platform, const Result<Bytes>& file);

    /// Whether there was a file that could be read.
    [[nodiscard]] bool wasRead() const { return wasRead_; }
    [[nodiscard]] bool isDamaged() const { return !root_.has_value(); }
    /// Whether it holds no application. A damaged one holds none.
    [[nodiscard]] bool isEmpty() const { return !root_ || root_->empty(); }

    /// Null when it is not there. `version` may be null: then nothing is.
    [[nodiscard]] const PropertyList* property(std::string_view key, std::string_view identifier,
                                               const std::string* version) const;
    /// Makes the levels that are missing. Does nothing on a damaged one.
    void setProperty(const PropertyList& value, std::string_view key, std::string_view identifier,
                     std::string_view version);
    /// Forgets every version of the application.
    void erase(std::string_view identifier);

    /// Writes the file, atomically, as XML. Errors are ignored.
    void write(const Platform& platform) const;

  private:
    bool wasRead_ = false;
    std::optional<PropertyList> root_;
};

/// Reads RestoreState.plist for those who ask it again and again: each time the file, but it is
/// parsed again only when its bytes are others. Any thread. Nothing outside is called under the
/// mutex.
class RestoreStateReader {
  public:
    /// The state at this moment.
    [[nodiscard]] std::shared_ptr<const RestoreState> read(const Platform& platform);

  private:
    [[nodiscard]] std::shared_ptr<const RestoreState> parsedFrom(const Bytes& bytes) const;

    mutable std::mutex mutex_;
    // Protected by mutex_: what was parsed last, and from what.
    Bytes bytes_;
    std::shared_ptr<const RestoreState> state_;
};

}  // namespace appsync
