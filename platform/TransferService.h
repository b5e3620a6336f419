#pragma once

#include <functional>

namespace appsync {

struct ErrorRecord;
struct SyncAsset;

/// What the SyncHost's device service can do about transfers under way. Either operation may be
/// missing on a device: ask first. Callable on any thread; nothing throws. The asset is a handle: a
/// download asset that carries the identifier and the dataclass; it is only borrowed.
class TransferService {
  public:
    /// Called once, on any thread, before the operation returns or after; `error` is null on
    /// success.
    using PrioritizeCompletion = std::function<void(const ErrorRecord* error)>;

    virtual ~TransferService() = default;

    [[nodiscard]] virtual bool canCancelTransfers() const = 0;
    /// Stops the transfer of an asset whose install has failed or was cancelled. Not an error when
    /// it is not under way.
    virtual void cancelTransferForFailedAsset(const SyncAsset& asset) = 0;

    [[nodiscard]] virtual bool canPrioritizeAssets() const = 0;
    /// Sends this asset before the others.
    virtual void prioritizeAsset(const SyncAsset& asset, PrioritizeCompletion completion) = 0;
};

}  // namespace appsync
