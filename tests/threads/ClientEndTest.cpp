#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <thread>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/TodoList.h"
#include "contract/TemporaryMachineDirectory.h"
#include "device/Device.h"
#include "device/package/PackageWriter.h"
#include "platform/LogFacility.h"
#include "platform/Notifications.h"
#include "platform/SyncHost.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr const char* kStartup = "com.korvu.trd.TRStartupCompleteNotification";
constexpr const char* kFirst = "com.example.first";
constexpr const char* kSecond = "com.example.second";
constexpr const char* kRunning = "com.example.running";
constexpr const char* kUnwanted = "com.example.unwanted";
constexpr int kCallsToAPackage = 5;
constexpr int kMostCalls = 9;
constexpr std::chrono::seconds kPatience{20};
constexpr std::chrono::seconds kShortPatience{2};

class Daemon final : public SyncHost {
  public:
    [[nodiscard]] std::string mainBundleIdentifier() const override { return "com.korvu.trd"; }
    [[nodiscard]] std::string pluginBundleIdentifier() const override { return "plug-in"; }
    [[nodiscard]] bool isRecoverableError(const ErrorRecord&) const override { return false; }
};

/// Once it is closed, whoever logs on another thread than the one that made it waits until it is
/// opened: inside a call of the client.
class Gate final : public LogFacility {
  public:
    void write(const LogMessage& message) noexcept override {
        // The end of a removal is logged whether or not the client is still there.
        if (message.format.starts_with("%s|Uninstall of ")) return;
        if (std::this_thread::get_id() == host_) return;
        std::unique_lock lock(mutex_);
        if (!isClosed_) return;
        ++held_;
        changed_.notify_all();
        changed_.wait_for(lock, kPatience, [this] { return !isClosed_; });
    }
    [[nodiscard]] std::unique_ptr<LogHandle> makeHandle(std::string_view,
                                                        std::string_view) override {
        return std::make_unique<LogHandle>();
    }

    void close() {
        const std::lock_guard lock(mutex_);
        isClosed_ = true;
        held_ = 0;
    }
    void open() {
        const std::lock_guard lock(mutex_);
        isClosed_ = false;
        changed_.notify_all();
    }
    /// Waits until somebody waits.
    [[nodiscard]] bool holdsSomebody() {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, kShortPatience, [this] { return held_ != 0; });
    }

  private:
    const std::thread::id host_ = std::this_thread::get_id();
    std::mutex mutex_;
    // Protected by mutex_.
    std::condition_variable changed_;
    bool isClosed_ = false;
    int held_ = 0;
};

/// Sessions on a real device, with threads of its own.
class ClientEnd : public testing::TestWithParam<bool> {
  protected:
    ClientEnd() {
        EXPECT_TRUE(Device::create(device_, {GetParam()}).ok());
        addPackages("1.0");
        sync(PropertyList::array({entry(kFirst, "install"), entry(kSecond, "install"),
                                  entry(kRunning, "install"), entry(kUnwanted, "install")}));
        addPackages("2.0");
    }

    /// A session that the host leaves after so many of its calls, while people and other clients of
    /// the device are at work, and threads of the device have calls of the client under way. The
    /// client goes on whichever of them holds it last, the device right after it. Whether one of
    /// them was inside the client.
    bool leaveAfter(int calls) {
        stage(updates());
        const auto device = open();
        auto client = load(*device);
        const std::weak_ptr<AppsClient> watched = client;
        std::atomic<bool> isOver = false;
        std::thread others([&] { disturb(*device, isOver); });
        makeCalls(*client, calls);
        const bool isHeld = calls >= kCallsToAPackage && log_.holdsSomebody();
        client.reset();
        if (isHeld) {
            EXPECT_FALSE(watched.expired());
        }
        log_.open();
        isOver = true;
        others.join();
        last_ = watched;
        return isHeld;
    }

    /// A whole session, after what was left of others was cleared away.
    void sync(const PropertyList& list) {
        const auto device = open();
        for (const char* identifier : {kFirst, kSecond, kRunning, kUnwanted}) {
            device->cancelCoordinator(identifier, SyncClientID).ignore();
        }
        const auto client = load(*device);
        client->clearSyncData();
        stage(list);
        makeCalls(*client, kMostCalls + 2);
        log_.open();
        client->assetTransferEndedWithSuccess(true);
        client->syncEndedWithSuccess(true);
        EXPECT_TRUE(device->waitForCoordinatedInstalls(kPatience));
        device->closeCoordination();
    }

    static PropertyList entry(const char* identifier, std::string_view operation) {
        return PropertyList::map({{kTodoIdentifierKey, identifier},
                                  {kTodoOperationKey, operation},
                                  {kTodoNameKey, "Example"}});
    }
    static PropertyList updates() {
        return PropertyList::array({entry(kFirst, "install"), entry(kSecond, "install"),
                                    entry(kRunning, "install"), entry(kUnwanted, "remove")});
    }

    /// Whether the client of the last session has gone.
    [[nodiscard]] bool hasGone() const { return last_.expired(); }
    /// "identifier version" of each application.
    [[nodiscard]] std::vector<std::string> applications() const {
        std::vector<std::string> result;
        const auto records = open()->applications();
        EXPECT_TRUE(records);
        for (const ApplicationRecord& each : *records) {
            result.push_back(each.identifier + " " + each.version.value_or("?"));
        }
        return result;
    }

  private:
    [[nodiscard]] std::unique_ptr<Device> open() const {
        DeviceOpenOptions options;
        options.access = DeviceAccess::Session;
        auto device = Device::open(device_, options);
        EXPECT_TRUE(device) << device.error().description();
        EXPECT_TRUE((*device)->removeLeftoverSyncPlaceholders());
        return *std::move(device);
    }

    [[nodiscard]] std::shared_ptr<AppsClient> load(Device& device) {
        const Platform platform = device.platform(daemon_, log_);
        auto client = AppsClient::create(platform);
        platform.notificationCenter.post(kStartup);
        return client;
    }

    static void write(const fs::path& path, std::string_view contents) {
        fs::create_directories(path.parent_path());
        std::ofstream(path, std::ios::binary) << contents;
    }

    void addPackages(const std::string& version) {
        const fs::path folder = directory_.path() + "/folder";
        for (const std::string identifier : {kFirst, kSecond, kRunning, kUnwanted}) {
            write(folder / "Name.app" / "Info.plist",
                  "<plist version=\"1.0\"><dict><key>BundleIdentifier</key><string>" + identifier +
                      "</string><key>BundleVersion</key><string>" + version +
                      "</string></dict></plist>");
            const std::string package = directory_.path() + "/" + identifier + ".zip";
            EXPECT_TRUE(writePackage(folder, package, codec_));
        }
    }

    void stage(const PropertyList& list) {
        const Bytes bytes = *codec_.serialize(list, PropertyListFormat::Xml);
        write(root_ + std::string(kStagingArea) + "/ApplicationsSync.plist",
              {reinterpret_cast<const char*>(bytes.data()), bytes.size()});
    }

    void makeCalls(AppsClient& client, int calls) {
        if (calls-- > 0) client.reconcileSync({}, "anchor", {}, nullptr);
        if (calls-- > 0) static_cast<void>(client.installedAssets());
        std::vector<SyncAssetPointer> assets;
        if (calls-- > 0) assets = client.outstandingAssetTransfers();
        log_.close();  // no call waits for another thread any more
        for (const SyncAssetPointer& asset : assets) {
            if (calls-- > 0) client.assetTransferUpdatedProgress(asset, 0.5);
            if (calls-- > 0) receive(client, asset);
        }
    }

    void receive(AppsClient& client, const SyncAssetPointer& asset) {
        asset->path = asset->identifier + ".zip";
        const fs::path staging = root_ + std::string(kPublicStaging);
        fs::create_directories(staging);
        fs::copy_file(fs::path(directory_.path()) / *asset->path, staging / *asset->path,
                      fs::copy_options::overwrite_existing);
        client.assetTransferSucceeded(asset, true, nullptr);
    }

    /// A person has an application running and removes another one; the store cancels.
    static void disturb(Device& device, const std::atomic<bool>& isOver) {
        device.run(kRunning).ignore();
        while (!isOver) {
            device.cancelCoordinator(kFirst, AppStoreClientID).ignore();
            device.uninstall(kSecond).ignore();
            std::this_thread::sleep_for(std::chrono::milliseconds(2));
        }
        device.quit(kRunning).ignore();
    }

    const TemporaryMachineDirectory directory_;
    const std::string device_ = directory_.path() + "/device";
    const std::string root_ = device_ + "/root";
    SystemPropertyLists codec_;
    Daemon daemon_;
    Gate log_;
    std::weak_ptr<AppsClient> last_;
};

TEST_P(ClientEnd, OnAnyThreadLeavesADeviceThatCanBeSynced) {
    int held = 0;
    for (int calls = 0; calls <= kMostCalls; ++calls) {
        SCOPED_TRACE("after " + std::to_string(calls) + " calls");
        held += leaveAfter(calls) ? 1 : 0;
        EXPECT_TRUE(hasGone());
    }
    EXPECT_GT(held, 0);
    sync(updates());
    EXPECT_THAT(applications(),
                testing::ElementsAre(std::string(kFirst) + " 2.0", std::string(kRunning) + " 2.0",
                                     std::string(kSecond) + " 2.0"));
}

INSTANTIATE_TEST_SUITE_P(Of, ClientEnd, testing::Bool(), [](const auto& tested) {
    return tested.param ? "CoordinatedInstalls" : "DirectInstalls";
});

}  // namespace
}  // namespace appsync
