#pragma once

#include "platform/SyncAsset.h"

namespace appsync {

class RestoreState;
struct Platform;
struct TransferItem;

/// The asset by which the host is asked for an application: its icon is made, and the parts to ask
/// for depend on what an interrupted session has left.
[[nodiscard]] SyncAssetPointer makeTransferAsset(const Platform& platform, const TransferItem& item,
                                                 const RestoreState& restoreState);

/// The `AssetParts` to ask for.
[[nodiscard]] unsigned assetPartsFor(const Platform& platform, const TransferItem& item,
                                     const RestoreState& restoreState);

}  // namespace appsync
