#include "fuzz/readers/PluginReaders.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <functional>
#include <initializer_list>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "platform/LegalIdentifier.h"
#include "simulation/SimulatedPlatform.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {

namespace {

constexpr const char* kPresent = "com.example.present";
constexpr const char* kOther = "com.example.other";
constexpr std::array<const char*, 3> kAsked = {"com.example.a", "com.example.b", "com.example.c"};
constexpr std::size_t kArriving = 3;  // the first so many packages arrive, the others do not

/// What is none of the plug-in's business.
constexpr std::array<const char*, 3> kStrangers = {
    "/etc/passwd", "/var/mobile/Library/Preferences/other.plist", "/var/mobile/Media/Photos/1.jpg"};

std::string metadataPath(const std::string& identifier) {
    return "/var/containers/Bundle/Application/" + identifier + "/VessikMetadata.plist";
}

PropertyList installEntry(const std::string& identifier) {
    return PropertyList::map(
        {{"identifier", identifier}, {"operation", "install"}, {"version", "1.0"}});
}

/// A device in memory on which foreign bytes lie, and the plug-in.
class ReaderDevice {
  public:
    explicit ReaderDevice(Installs installs) : platform_(codec_) {
        for (const char* stranger : kStrangers) platform_.files.addFile(stranger, stranger);
        platform_.files.addDirectory("/var/mobile/Library/Logs/MediaServices");
        platform_.registry.addApplication(kPresent);
        platform_.registry.addApplication(kOther);
        platform_.coordination.setEnabled(installs == Installs::Coordinated);
    }

    SimulatedPlatform& platform() { return platform_; }
    AppsClient& client() { return *client_; }

    void addInstalls() {
        PropertyList list = PropertyList::array();
        for (const char* identifier : kAsked) list.append(installEntry(identifier));
        platform_.addPropertyList(stagedPath("ApplicationsSync.plist"), list);
    }
    void addRestoreInfo() {
        const PropertyList metadata =
            PropertyList::map({{"title", "Shown"}, {"bundleVersion", "1.0"}});
        const Bytes bytes = *codec_.serialize(metadata, PropertyListFormat::Binary);
        PropertyList info = PropertyList::map();
        for (const char* identifier : kAsked) {
            info.set(identifier, PropertyList::map({{"VessikMetadata", bytes}}));
        }
        platform_.addPropertyList(std::string(kRestoreInfoPath), info);
    }
    static std::string stagedPath(std::string_view name) {
        return formatPath(kInDirectoryFormat, {kStagingArea, name});
    }

    /// Runs what the host does with a new plug-in, and looks whether the general promises hold.
    void run(const std::function<void()>& host) {
        try {
            client_ = AppsClient::create(platform_.services());
            host();
            platform_.runUntilIdle();
        } catch (const SimulationFailure& failure) {
            broken_ = failure.what();
        }
        if (broken_.empty() && platform_.now() > std::chrono::hours(1)) broken_ = "it took hours";
        for (const char* stranger : kStrangers) {
            if (broken_.empty() && platform_.files.text(stranger) != stranger) {
                broken_ = std::string(stranger) + " was touched";
            }
        }
    }

    /// A whole sync. Some packages arrive, the others do not.
    void sync() {
        client_->prepareForSyncWithHostAnchor("0", nullptr, nullptr);
        client_->reconcileSync(PropertyList::map(), "1", nullptr, nullptr);
        static_cast<void>(client_->installedAssets());
        const std::vector<SyncAssetPointer> assets = client_->outstandingAssetTransfers();
        std::size_t count = 0;
        for (const SyncAssetPointer& asset : assets) {
            asked_.insert(asset->identifier);
            send(asset, ++count <= kArriving);
        }
        client_->assetTransferEndedWithSuccess(true);
        platform_.runUntilIdle();
        client_->syncEndedWithSuccess(true);
    }
    [[nodiscard]] bool hasAskedForAll() const {
        return std::ranges::all_of(kAsked, [&](const char* each) { return asked_.contains(each); });
    }

    /// The reading: refused when the log has one of these words, or begins so.
    Reading reading(std::initializer_list<std::string_view> refusals) {
        Reading result = Reading::read();
        for (const std::string& message : platform_.messages()) {
            for (const std::string_view refusal : refusals) {
                if (result.wasRead && message.starts_with(refusal)) {
                    result = Reading::refused(message);
                }
            }
        }
        return std::move(result).unless(broken_.empty(), broken_);
    }

  private:
    void send(const SyncAssetPointer& asset, bool arrives) {
        const ErrorRecord lost = ErrorRecord::make(kPosixErrorDomain, 5, "the cable was pulled");
        client_->assetTransferUpdatedProgress(asset, 0.5);
        if (arrives && isLegalIdentifier(asset->identifier)) {
            asset->path = formatPath("%s/%@.zip", {kPublicStaging, asset->identifier});
            platform_.files.addFile(*asset->path, "package");
            client_->assetTransferSucceeded(asset, true, nullptr);
        } else {
            client_->assetTransferSucceeded(asset, false, &lost);
        }
    }

    SystemPropertyLists codec_;
    SimulatedPlatform platform_;
    std::shared_ptr<AppsClient> client_;
    std::set<std::string> asked_;
    std::string broken_;
};

std::string_view textOf(ByteView bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

/// The number of entries of a list; nothing for anything else.
std::optional<std::size_t> sizeOfList(const std::optional<PropertyList>& list) {
    return list && list->isArray() ? std::optional(list->size()) : std::nullopt;
}

}  // namespace

Reading readTodoList(ByteView bytes, Installs installs) {
    ReaderDevice device(installs);
    device.platform().files.addFile(ReaderDevice::stagedPath("ApplicationsSync.plist"), bytes);
    const auto before = sizeOfList(
        device.platform().propertyListAt(ReaderDevice::stagedPath("ApplicationsSync.plist")));
    device.run([&] { device.sync(); });
    const auto after = sizeOfList(device.platform().propertyListAt(std::string(kTodoListPath)));
    Reading reading = device.reading({"couldn't parse todo list", "todo list is not an array"});
    const bool wasRead = reading.wasRead && !bytes.empty();
    return std::move(reading)
        .unless(before == after, "the list lost entries")
        .unless(before.has_value() == wasRead, "the log does not say what became of it");
}

Reading readIconOrder(ByteView bytes, Installs installs) {
    ReaderDevice device(installs);
    device.addInstalls();
    device.platform().files.addFile(ReaderDevice::stagedPath("DeskoraIconState.plist"), bytes);
    device.platform().homeScreen.setFlattenedIconState(Bytes(bytes.begin(), bytes.end()));
    device.run([&] { device.sync(); });
    Reading reading = device.reading({});
    if (device.platform().homeScreen.layout().empty()) {
        reading = Reading::refused("the home screen took no layout")
                      .unless(reading.broken.empty(), reading.broken);
    }
    return std::move(reading).unless(device.hasAskedForAll(), "an application was not asked for");
}

Reading readRestoreInfo(ByteView bytes, Installs installs) {
    ReaderDevice device(installs);
    device.platform().files.addFile(std::string(kRestoreInfoPath), bytes);
    device.run([&] { device.client().reconcileRestoreOfType(2, nullptr); });
    const auto moved = device.platform().files.text(std::string(kProcessedRestoreInfoPath));
    return device.reading({"failed to parse vessik app restore info"})
        .unless(moved == textOf(bytes), "it was not put away");
}

Reading readDemotedApps(ByteView bytes, Installs installs) {
    ReaderDevice device(installs);
    device.addRestoreInfo();
    device.platform().files.addFile(std::string(kDemotedAppsPath), bytes);
    device.run([&] { device.client().reconcileRestoreOfType(2, nullptr); });
    const std::vector<std::string> placeholders =
        device.platform().registry.placeholderIdentifiers();
    return device.reading({"couldn't parse demoted apps list", "demoted apps list is not"})
        .unless(placeholders.size() == kAsked.size(), "an application did not come back");
}

Reading readRestoreState(ByteView bytes, Installs installs) {
    ReaderDevice device(installs);
    device.addInstalls();
    const std::string path(kRestoreStatePath);
    device.platform().files.addFile(path, bytes);
    device.run([&] {
        device.sync();
        device.client().cleanRestoreStateForIdentifier(kAsked[0]);
    });
    const auto left = device.platform().propertyListAt(path);
    const bool isSound = !device.platform().files.exists(path) || (left && left->isMap());
    const Result<PropertyList> parsed = SystemPropertyLists().parse(bytes);
    Reading reading = device.reading({});
    if (!parsed) {
        reading = Reading::refused(parsed.error().description())
                      .unless(reading.broken.empty(), reading.broken);
    }
    return std::move(reading)
        .unless(isSound, "what is left of it cannot be read")
        .unless(device.hasAskedForAll(), "an application was not asked for");
}

Reading readStoreMetadata(ByteView bytes, Installs installs) {
    ReaderDevice device(installs);
    device.platform().files.addFile(metadataPath(kPresent), bytes);
    device.platform().addPropertyList(metadataPath(kOther),
                                      PropertyList::map({{"korvuId", "other"}}));
    std::set<std::string> ids;
    device.run([&] {
        device.client().prepareForBackup();
        ids = device.client().korvuIDsForAssets();
        static_cast<void>(device.client().accountsForAssets());
        static_cast<void>(device.client().installedAssetMetrics());
    });
    return device.reading({"unknown KorvuID for com.example.present"})
        .unless(ids.contains("other"), "the other application's account is missing");
}

}  // namespace appsync
