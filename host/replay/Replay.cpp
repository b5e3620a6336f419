#include "host/replay/Replay.h"

#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string_view>
#include <utility>
#include <vector>

#include "host/console/Problem.h"
#include "host/replay/ReplayRun.h"
#include "host/replay/ReplayServices.h"
#include "platform/AppRegistry.h"
#include "platform/Error.h"
#include "platform/Platform.h"
#include "platform/SyncClient.h"
#include "recording/RecordedClient.h"
#include "recording/Recording.h"

#ifdef __has_feature
#if __has_feature(address_sanitizer)
#include <sanitizer/lsan_interface.h>
#define APPSYNC_LEAKS_ARE_LOOKED_FOR
#endif
#endif

namespace appsync {
namespace {

// Where a recording ends early, so do the flows that replay it, in the middle of what they do: what
// they hold is kept, but in frames that a sanitizer sets aside, where it does not look for it.
#ifdef APPSYNC_LEAKS_ARE_LOOKED_FOR
using WithoutLookingForLeaks = __lsan::ScopedDisabler;
#else
struct WithoutLookingForLeaks {};
#endif

using ParsedJson = nlohmann::json;

/// The host of a replay: makes the calls that the recording has of it.
class ReplayedHost {
  public:
    ReplayedHost(const RecordedSession& session, const PlugInTable& table, bool isStrict)
        : run_(session, isStrict), services_(run_), table_(table) {}

    ReplayOutcome run() {
        return run_.run([this](const RecordLine& line) { call(line); });
    }
    [[nodiscard]] bool isLeftOver() const { return run_.isLeftOver() || client_.client != nullptr; }

  private:
    using Call = void (ReplayedHost::*)(const RecordLine& line);

    static const std::map<std::string_view, Call>& calls() {
        using Host = ReplayedHost;
        static const std::map<std::string_view, Call> known{
            {"makeClient", &Host::makeClient},
            {"destroyClient", &Host::destroyClient},
            {"supportedDataclasses", &Host::ask<&SyncClient::supportedDataclasses>},
            {"currentSyncAnchor", &Host::ask<&SyncClient::currentSyncAnchor>},
            {"disabledAssetTypes", &Host::ask<&SyncClient::disabledAssetTypes>},
            {"installedAssets", &Host::ask<&SyncClient::installedAssets>},
            {"installedAssetMetrics", &Host::ask<&SyncClient::installedAssetMetrics>},
            {"korvuIDsForAssets", &Host::ask<&SyncClient::korvuIDsForAssets>},
            {"accountsForAssets", &Host::ask<&SyncClient::accountsForAssets>},
            {"clearSyncData", &Host::tell<&SyncClient::clearSyncData>},
            {"prepareForBackup", &Host::tell<&SyncClient::prepareForBackup>},
            {"syncEndedWithSuccess", &Host::tellSuccess<&SyncClient::syncEndedWithSuccess>},
            {"assetTransferEndedWithSuccess",
             &Host::tellSuccess<&SyncClient::assetTransferEndedWithSuccess>},
            {"prepareForSyncWithHostAnchor", &Host::prepareForSync},
            {"reconcileSync", &Host::reconcileSync},
            {"reconcileRestoreOfType", &Host::reconcileRestore},
            {"outstandingAssetTransfers", &Host::outstandingAssetTransfers},
            {"assetTransferUpdatedProgress", &Host::updatedProgress},
            {"assetTransferSucceeded", &Host::succeeded}};
        return known;
    }

    void call(const RecordLine& line) {
        const auto known = calls().find(line.name);
        if (known == calls().end()) run_.giveUp(line, "the host has no such call");
        if (client_.client == nullptr && line.name != "makeClient") {
            run_.giveUp(line, "there is no client to call");
        }
        (this->*known->second)(line);
    }

    void makeClient(const RecordLine& line) {
        if (client_.client != nullptr) run_.giveUp(line, "there is a client already");
        client_ = table_.makeClient(services_.platform());
        run_.endStretch(nullptr);
        if (client_.client == nullptr) run_.giveUp(line, "the plug-in makes no client");
    }

    void destroyClient(const RecordLine&) {
        services_.platform().registry.removeObserver(client_.observer);
        table_.destroyClient(client_);
        run_.endStretch(nullptr);
        client_ = {};
    }

    void end(const std::function<void(RecordText& text)>& answer) {
        RecordText text = run_.newText();
        answer(text);
        run_.endStretch(&text);
    }

    template <auto Method>
    void ask(const RecordLine&) {
        const auto value = (client_.client->*Method)();
        end([&value](RecordText& text) {
            text.answers(kPassedContentLimit);
            text.add(value);
        });
    }

    template <auto Method>
    void tell(const RecordLine&) {
        (client_.client->*Method)();
        run_.endStretch(nullptr);
    }

    template <auto Method>
    void tellSuccess(const RecordLine& line) {
        bool isSuccess = false;
        run_.readAll(line, line.arguments, isSuccess);
        (client_.client->*Method)(isSuccess);
        run_.endStretch(nullptr);
    }

    [[nodiscard]] SyncProgressCallback progress(bool isAsked) {
        if (!isAsked) return {};
        return [this](double fraction) { run_.call("SyncProgressCallback", 0, fraction); };
    }

    void endWithError(bool isDone, const std::optional<ErrorRecord>& error) {
        end([&](RecordText& text) {
            text.begin('[');
            text.add(isDone);
            text.add(error);
            text.end(']');
        });
    }

    void prepareForSync(const RecordLine& line) {
        std::string anchor;
        bool hasProgress = false;
        bool wantsError = false;
        run_.readAll(line, line.arguments, anchor, hasProgress, wantsError);
        std::optional<ErrorRecord> error;
        const bool isDone = client_.client->prepareForSyncWithHostAnchor(
            anchor, progress(hasProgress), wantsError ? &error : nullptr);
        endWithError(isDone, error);
    }

    void reconcileSync(const RecordLine& line) {
        PropertyList request;
        std::string anchor;
        bool hasProgress = false;
        bool wantsError = false;
        run_.readAll(line, line.arguments, request, anchor, hasProgress, wantsError);
        std::optional<ErrorRecord> error;
        const bool isDone = client_.client->reconcileSync(request, anchor, progress(hasProgress),
                                                          wantsError ? &error : nullptr);
        endWithError(isDone, error);
    }

    void reconcileRestore(const RecordLine& line) {
        std::int64_t type = 0;
        bool wantsError = false;
        run_.readAll(line, line.arguments, type, wantsError);
        std::optional<ErrorRecord> error;
        const bool isDone =
            client_.client->reconcileRestoreOfType(type, wantsError ? &error : nullptr);
        endWithError(isDone, error);
    }

    void outstandingAssetTransfers(const RecordLine&) {
        const std::vector<SyncAssetPointer> assets = client_.client->outstandingAssetTransfers();
        end([&](RecordText& text) {
            text.begin('[');
            for (const SyncAssetPointer& each : assets) assets_.add(text, each);
            text.end(']');
        });
    }

    void updatedProgress(const RecordLine& line) {
        const SyncAssetPointer asset = assetOf(line, 2);
        double progress = 0;
        if (!run_.values().read(line.arguments[1], progress))
            run_.giveUp(line, "it has no progress");
        client_.client->assetTransferUpdatedProgress(asset, progress);
        run_.endStretch(nullptr);
    }

    void succeeded(const RecordLine& line) {
        const SyncAssetPointer asset = assetOf(line, 3);
        bool isSuccess = false;
        std::optional<ErrorRecord> error;
        const bool isRead = run_.values().read(line.arguments[1], isSuccess) &&
                            run_.values().read(line.arguments[2], error);
        if (!isRead) run_.giveUp(line, "it does not say how the transfer ended");
        client_.client->assetTransferSucceeded(asset, isSuccess, error ? &*error : nullptr);
        run_.endStretch(nullptr);
    }

    /// The asset that is the first of so many arguments, as the transfer has left it.
    SyncAssetPointer assetOf(const RecordLine& line, std::size_t count) {
        if (line.arguments.size() != count || !line.arguments[0].is_array()) {
            run_.giveUp(line, "its arguments are others");
        }
        SyncAssetPointer asset = readAsset(line.arguments[0]);
        if (asset == nullptr) run_.giveUp(line, "its asset is none");
        return asset;
    }

    SyncAssetPointer readAsset(const ParsedJson& json) {
        constexpr std::size_t kChanging = 6;
        if (json.size() < kChanging || !json[0].is_number_unsigned()) return nullptr;
        SyncAssetPointer asset = assets_.find(json[0].get<std::uint64_t>());
        if (asset == nullptr) {
            asset = newAsset(json);
            if (asset == nullptr) return nullptr;
            assets_.learn(asset);
        }
        ReplayValues& values = run_.values();
        const bool isRead = values.read(json[1], asset->path) &&
                            values.read(json[2], asset->isDownload) &&
                            values.read(json[3], asset->completedParts) &&
                            values.read(json[4], asset->downloadProgress) &&
                            values.read(json[5], asset->installProgress);
        return isRead ? asset : nullptr;
    }

    /// An asset that the host has made.
    SyncAssetPointer newAsset(const ParsedJson& json) {
        auto asset = std::make_shared<SyncAsset>();
        std::uint64_t number = 0;
        const bool isRead = run_.values().readAll(
            json, number, asset->path, asset->isDownload, asset->completedParts,
            asset->downloadProgress, asset->installProgress, asset->identifier, asset->dataclass,
            asset->prettyName, asset->icon, asset->variantOptions, asset->storeMetadataPath,
            asset->infoPath, asset->isRestore, asset->storeProductID, asset->storePersonID);
        return isRead ? asset : nullptr;
    }

    ReplayRun run_;
    ReplayServices services_;
    const PlugInTable& table_;
    PlugInClient client_;
    AssetNumbers assets_;
};

ReplayOutcome runToItsEnd(ReplayedHost& host) {
    [[maybe_unused]] const WithoutLookingForLeaks here;
    return host.run();
}

}  // namespace

Result<ReplayOutcome> replay(const RecordedSession& session, const PlugInTable& table,
                             bool isStrict) {
    if (session.isAnonymous) {
        return unusable("the recording is anonymous, and lacks what the plug-in was answered with",
                        "record without --anonymous to replay it; appsync recording show shows it");
    }
    auto host = std::make_unique<ReplayedHost>(session, table, isStrict);
    const ReplayOutcome outcome = runToItsEnd(*host);
    // What the plug-in has left may call the platform when it goes.
    static auto& leftOver = *new std::vector<std::unique_ptr<ReplayedHost>>;
    if (host->isLeftOver()) leftOver.push_back(std::move(host));
    return outcome;
}

}  // namespace appsync
