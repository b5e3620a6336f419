#include "recording/RecordedClient.h"

#include "recording/Recording.h"

namespace appsync {
namespace {

bool answerWithError(const RecordText& empty, SpanRecord& span, bool answer, ErrorOut error) {
    RecordText text = empty;
    text.begin('[');
    text.add(answer);
    text.add(error != nullptr ? *error : std::nullopt);
    text.end(']');
    span.end(&text);
    return answer;
}

}  // namespace

void AssetNumbers::learn(const SyncAssetPointer& asset) {
    assets_.push_back(asset);
    numbers_.emplace(asset.get(), assets_.size());
}

SyncAssetPointer AssetNumbers::find(std::uint64_t number) const {
    return number > 0 && number <= assets_.size() ? assets_[number - 1] : nullptr;
}

void AssetNumbers::add(RecordText& text, const SyncAssetPointer& asset) {
    const bool isNew = !numbers_.contains(asset.get());
    if (isNew) learn(asset);
    text.begin('[');
    text.add(numbers_.at(asset.get()));
    text.add(asset->path);
    text.add(asset->isDownload);
    text.add(asset->completedParts);
    text.add(asset->downloadProgress);
    text.add(asset->installProgress);
    if (isNew) {
        text.add(asset->identifier);
        text.add(asset->dataclass);
        text.add(asset->prettyName);
        text.add(asset->icon);
        text.add(asset->variantOptions);
        text.add(asset->storeMetadataPath);
        text.add(asset->infoPath);
        text.add(asset->isRestore);
        text.addPersonal(std::to_string(asset->storeProductID));
        if (asset->storePersonID) {
            text.addPersonal(std::to_string(*asset->storePersonID));
        } else {
            text.addNull();
        }
    }
    text.end(']');
}

RecordText RecordedClient::textOf(const SyncAssetPointer& asset) {
    RecordText text = recording_.newText();
    assets_.add(text, asset);
    return text;
}

SyncProgressCallback RecordedClient::recorded(const SyncProgressCallback& callback) {
    if (!callback) return {};
    return [this, callback](double progress) {
        CallRecord(recording_, "SyncProgressCallback", 0, progress).announce();
        callback(progress);
    };
}

std::vector<std::string> RecordedClient::supportedDataclasses() {
    return SpanRecord(recording_, "host", "supportedDataclasses", 0)
        .answer(inner_.supportedDataclasses());
}

std::string RecordedClient::currentSyncAnchor() {
    return SpanRecord(recording_, "host", "currentSyncAnchor", 0)
        .answer(inner_.currentSyncAnchor());
}

bool RecordedClient::prepareForSyncWithHostAnchor(const std::string& hostAnchor,
                                                  const SyncProgressCallback& progressCallback,
                                                  ErrorOut error) {
    SpanRecord span(recording_, "host", "prepareForSyncWithHostAnchor", 0, hostAnchor,
                    static_cast<bool>(progressCallback), error != nullptr);
    const bool answer =
        inner_.prepareForSyncWithHostAnchor(hostAnchor, recorded(progressCallback), error);
    return answerWithError(recording_.newText(), span, answer, error);
}

std::optional<std::set<std::string>> RecordedClient::disabledAssetTypes() {
    return SpanRecord(recording_, "host", "disabledAssetTypes", 0)
        .answer(inner_.disabledAssetTypes());
}

bool RecordedClient::reconcileSync(const PropertyList& request, const std::string& newAnchor,
                                   const SyncProgressCallback& progressCallback, ErrorOut error) {
    RecordText whole = recording_.newText();
    whole.answers(kAnsweredContentLimit);
    whole.add(request);
    SpanRecord span(recording_, "host", "reconcileSync", 0, whole, newAnchor,
                    static_cast<bool>(progressCallback), error != nullptr);
    const bool answer = inner_.reconcileSync(request, newAnchor, recorded(progressCallback), error);
    return answerWithError(recording_.newText(), span, answer, error);
}

bool RecordedClient::reconcileRestoreOfType(std::int64_t type, ErrorOut error) {
    SpanRecord span(recording_, "host", "reconcileRestoreOfType", 0, type, error != nullptr);
    const bool answer = inner_.reconcileRestoreOfType(type, error);
    return answerWithError(recording_.newText(), span, answer, error);
}

void RecordedClient::syncEndedWithSuccess(bool success) {
    const SpanRecord span(recording_, "host", "syncEndedWithSuccess", 0, success);
    inner_.syncEndedWithSuccess(success);
}

PropertyList RecordedClient::installedAssets() {
    return SpanRecord(recording_, "host", "installedAssets", 0).answer(inner_.installedAssets());
}

void RecordedClient::clearSyncData() {
    const SpanRecord span(recording_, "host", "clearSyncData", 0);
    inner_.clearSyncData();
}

PropertyList RecordedClient::installedAssetMetrics() {
    return SpanRecord(recording_, "host", "installedAssetMetrics", 0)
        .answer(inner_.installedAssetMetrics());
}

std::set<std::string> RecordedClient::korvuIDsForAssets() {
    return SpanRecord(recording_, "host", "korvuIDsForAssets", 0)
        .answer(inner_.korvuIDsForAssets());
}

std::set<SyncAccountInfo> RecordedClient::accountsForAssets() {
    return SpanRecord(recording_, "host", "accountsForAssets", 0)
        .answer(inner_.accountsForAssets());
}

void RecordedClient::prepareForBackup() {
    const SpanRecord span(recording_, "host", "prepareForBackup", 0);
    inner_.prepareForBackup();
}

std::vector<SyncAssetPointer> RecordedClient::outstandingAssetTransfers() {
    SpanRecord span(recording_, "host", "outstandingAssetTransfers", 0);
    std::vector<SyncAssetPointer> assets = inner_.outstandingAssetTransfers();
    RecordText text = recording_.newText();
    text.begin('[');
    for (const SyncAssetPointer& each : assets) assets_.add(text, each);
    text.end(']');
    span.end(&text);
    return assets;
}

void RecordedClient::assetTransferUpdatedProgress(const SyncAssetPointer& asset, double progress) {
    const SpanRecord span(recording_, "host", "assetTransferUpdatedProgress", 0, textOf(asset),
                          progress);
    inner_.assetTransferUpdatedProgress(asset, progress);
}

void RecordedClient::assetTransferSucceeded(const SyncAssetPointer& asset, bool succeeded,
                                            const ErrorRecord* error) {
    const SpanRecord span(recording_, "host", "assetTransferSucceeded", 0, textOf(asset), succeeded,
                          error);
    inner_.assetTransferSucceeded(asset, succeeded, error);
}

void RecordedClient::assetTransferEndedWithSuccess(bool success) {
    const SpanRecord span(recording_, "host", "assetTransferEndedWithSuccess", 0, success);
    inner_.assetTransferEndedWithSuccess(success);
}

void RecordedClient::assetInstallSucceeded(const SyncAssetPointer& asset) {
    inner_.assetInstallSucceeded(asset);
}

void RecordedClient::assetInstallFailed(const SyncAssetPointer& asset, const ErrorRecord& error) {
    inner_.assetInstallFailed(asset, error);
}

}  // namespace appsync
