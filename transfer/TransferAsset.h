#pragma once

#include "platform/SyncAsset.h"

namespace appsync {

class AppsClient;
struct Platform;
struct TransferItem;

/// The asset by which the host is asked for an application: its icon is made, and the parts to ask
/// for depend on what an interrupted session has left.
[[nodiscard]] SyncAssetPointer makeTransferAsset(const AppsClient& client, const Platform& platform,
                                                 const TransferItem& item);

/// The `AssetParts` to ask for.
[[nodiscard]] unsigned assetPartsFor(const AppsClient& client, const Platform& platform,
                                     const TransferItem& item);

}  // namespace appsync
