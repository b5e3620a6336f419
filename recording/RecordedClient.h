#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/SyncClient.h"
#include "recording/RecordText.h"

namespace appsync {

class Recording;

/// The numbers of assets, in the order in which they cross between host and plug-in: known by their
/// address, and kept, so that no other comes to stand there. One thread at a time.
class AssetNumbers {
  public:
    /// Writes the asset down: whole when it is new, else its number and what a transfer changes.
    void add(RecordText& text, const SyncAssetPointer& asset);
    /// Takes note of an asset whose number is the next.
    void learn(const SyncAssetPointer& asset);
    /// Null when there is none of the number.
    [[nodiscard]] SyncAssetPointer find(std::uint64_t number) const;

  private:
    std::vector<SyncAssetPointer> assets_;
    std::map<const SyncAsset*, std::uint64_t> numbers_;
};

/// Any client, whose calls by the host are written to a recording. Both must outlive it. One thread
/// at a time, as the client.
class RecordedClient : public SyncClient {
  public:
    RecordedClient(SyncClient& inner, Recording& recording)
        : inner_(inner), recording_(recording) {}

    std::vector<std::string> supportedDataclasses() override;
    std::string currentSyncAnchor() override;
    bool prepareForSyncWithHostAnchor(const std::string& hostAnchor,
                                      const SyncProgressCallback& progressCallback,
                                      ErrorOut error) override;
    std::optional<std::set<std::string>> disabledAssetTypes() override;
    bool reconcileSync(const PropertyList& request, const std::string& newAnchor,
                       const SyncProgressCallback& progressCallback, ErrorOut error) override;
    bool reconcileRestoreOfType(std::int64_t type, ErrorOut error) override;
    void syncEndedWithSuccess(bool success) override;
    PropertyList installedAssets() override;
    void clearSyncData() override;
    PropertyList installedAssetMetrics() override;
    std::set<std::string> korvuIDsForAssets() override;
    std::set<SyncAccountInfo> accountsForAssets() override;
    void prepareForBackup() override;
    std::vector<SyncAssetPointer> outstandingAssetTransfers() override;
    void assetTransferUpdatedProgress(const SyncAssetPointer& asset, double progress) override;
    void assetTransferSucceeded(const SyncAssetPointer& asset, bool succeeded,
                                const ErrorRecord* error) override;
    void assetTransferEndedWithSuccess(bool success) override;
    /// Not the host's to call.
    void assetInstallSucceeded(const SyncAssetPointer& asset) override;
    void assetInstallFailed(const SyncAssetPointer& asset, const ErrorRecord& error) override;

  private:
    [[nodiscard]] RecordText textOf(const SyncAssetPointer& asset);
    [[nodiscard]] SyncProgressCallback recorded(const SyncProgressCallback& callback);

    SyncClient& inner_;
    Recording& recording_;
    AssetNumbers assets_;
};

}  // namespace appsync
