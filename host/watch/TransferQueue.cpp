#include "host/watch/TransferQueue.h"

#include <algorithm>

#include "host/plan/TransferError.h"
#include "host/watch/SyncDaemon.h"
#include "platform/Error.h"

namespace appsync {
namespace {

auto named(const std::string& identifier) {
    return [&identifier](const SyncAssetPointer& each) { return each->identifier == identifier; };
}

}  // namespace

void TransferQueue::fill(const std::vector<SyncAssetPointer>& assets) {
    const std::lock_guard guard(mutex_);
    waiting_.assign(assets.begin(), assets.end());
    current_.clear();
}

SyncAssetPointer TransferQueue::next() {
    const std::lock_guard guard(mutex_);
    if (waiting_.empty()) return nullptr;
    SyncAssetPointer asset = std::move(waiting_.front());
    waiting_.pop_front();
    current_ = asset->identifier;
    return asset;
}

void TransferQueue::finish() {
    const std::lock_guard guard(mutex_);
    current_.clear();
}

bool TransferQueue::isCancelled() const {
    const std::lock_guard guard(mutex_);
    return cancelled_.contains(current_);
}

void TransferQueue::dismissCancel() {
    const std::lock_guard guard(mutex_);
    cancelled_.erase(current_);
}

void TransferQueue::cancelTransferForFailedAsset(const SyncAsset& asset) {
    const std::lock_guard guard(mutex_);
    cancelled_.insert(asset.identifier);
}

bool TransferQueue::moveToFront(const std::string& identifier) {
    const std::lock_guard guard(mutex_);
    if (current_ == identifier) return true;
    const auto found = std::find_if(waiting_.begin(), waiting_.end(), named(identifier));
    if (found == waiting_.end()) return false;
    std::rotate(waiting_.begin(), found, std::next(found));
    return true;
}

void TransferQueue::prioritizeAsset(const SyncAsset& asset, PrioritizeCompletion completion) {
    const bool isKnown = moveToFront(asset.identifier);
    if (!completion) return;
    if (isKnown) return completion(nullptr);
    const ErrorRecord error =
        ErrorRecord::make(kTransferErrorDomain, kTransferNotUnderWay,
                          "no transfer of " + asset.identifier + " is still to come");
    completion(&error);
}

}  // namespace appsync
