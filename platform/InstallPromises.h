#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "platform/FileURL.h"

namespace appsync {

struct ErrorRecord;

/// Who may create coordinators, promises and placeholders, and cancel them: a number for each
/// client of the install-coordination service.
using CoordinationClient = std::uint64_t;

/// The app store client.
inline constexpr CoordinationClient AppStoreClientID = 1;
/// The sync daemon's plug-in.
inline constexpr CoordinationClient SyncClientID = 3;

/// A piece of an install that a client has promised to the install-coordination service.
///
/// An object is a handle on the service's record: two handles on one promise show the same. Before
/// the promise is attached to a coordinator or a placeholder the record is the handle's alone.
/// Callable on any thread. Nothing throws; a change of a promise that the service no longer has
/// (its coordinator is done or cancelled) does nothing.
class Promise {
  public:
    virtual ~Promise() = default;

    [[nodiscard]] virtual std::string name() const = 0;
    /// Who has to keep it.
    [[nodiscard]] virtual CoordinationClient clientIdentifier() const = 0;

    /// From 0.0 to 1.0.
    [[nodiscard]] virtual double percentComplete() const = 0;
    virtual void setPercentComplete(double percent) = 0;
    /// Whether it has been kept.
    [[nodiscard]] virtual bool isComplete() const = 0;
    /// Keeps it. What waited for this promise goes on, on threads of the service's own.
    virtual void setComplete() = 0;

    /// Gives it up: the service no longer waits for it, and does not hold it against its keeper.
    virtual void cancelForReason(const ErrorRecord& reason, CoordinationClient client) = 0;
};

/// A promise that is kept with a file.
class PathTransferPromise : public Promise {
  public:
    [[nodiscard]] virtual std::optional<FileURL> transferPath() const = 0;
    /// Where the file lies, an absolute device path. Once the promise is complete and a coordinator
    /// or its placeholder has it, the file is the service's own, an icon's too: it reads it when it
    /// needs it and removes it afterwards (an icon may be left standing).
    virtual void setTransferPath(const FileURL& path) = 0;
};

/// A promise that is kept elsewhere: the service only hears that it is.
class OutOfBandPromise : public Promise {};

}  // namespace appsync
