#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <fstream>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "contract/TemporaryMachineDirectory.h"
#include "device/Device.h"
#include "platform/LogFacility.h"
#include "platform/LogRendering.h"
#include "platform/SyncHost.h"
#include "platform/WorkQueues.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;
using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;

constexpr const char* kKept = "com.example.kept";
constexpr const char* kOffloaded = "com.example.offloaded";
constexpr const char* kUnused = "com.example.unused";
constexpr std::size_t kApplications = 3;
/// Only a test that fails waits for so long.
constexpr std::chrono::seconds kLongestWait{20};

class Process final : public SyncHost {
  public:
    explicit Process(std::string identifier) : identifier_(std::move(identifier)) {}
    [[nodiscard]] std::string mainBundleIdentifier() const override { return identifier_; }
    [[nodiscard]] std::string pluginBundleIdentifier() const override { return "plug-in"; }
    [[nodiscard]] bool isRecoverableError(const ErrorRecord&) const override { return false; }

  private:
    const std::string identifier_;
};

/// Keeps the messages. A report of a placeholder, which is logged before it counts, is held up
/// until reports are let through.
class Reports final : public LogFacility {
  public:
    void write(const LogMessage& message) noexcept override {
        std::unique_lock lock(mutex_);
        messages_.push_back(renderLogMessage(message));
        if (!message.format.starts_with("%s|coordinatorDidInstallPlaceholder")) return;
        ++begun_;
        changed_.notify_all();
        changed_.wait_for(lock, kLongestWait, [this] { return areLetThrough_; });
    }
    [[nodiscard]] std::unique_ptr<LogHandle> makeHandle(std::string_view,
                                                        std::string_view) override {
        return std::make_unique<LogHandle>();
    }

    void letThrough() {
        const std::lock_guard lock(mutex_);
        areLetThrough_ = true;
        changed_.notify_all();
    }
    /// Whether that many have begun, at last.
    [[nodiscard]] bool haveBegun(std::size_t count) {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, kLongestWait, [this, count] { return begun_ >= count; });
    }
    [[nodiscard]] std::vector<std::string> messages() {
        const std::lock_guard lock(mutex_);
        return messages_;
    }

  private:
    std::mutex mutex_;
    // Protected by mutex_.
    std::condition_variable changed_;
    std::vector<std::string> messages_;
    std::size_t begun_ = 0;
    bool areLetThrough_ = false;
};

/// How a wait with an end goes: the group, and for how long it was to be waited at most.
using Wait = std::function<bool(WaitGroup& group, std::chrono::nanoseconds longest)>;

class GroupWithScriptedWait final : public WaitGroup {
  public:
    GroupWithScriptedWait(std::unique_ptr<WaitGroup> group, const Wait& wait)
        : group_(std::move(group)), wait_(wait) {}
    void enter() override { group_->enter(); }
    void leave() override { group_->leave(); }
    void wait() override { group_->wait(); }
    [[nodiscard]] bool waitFor(std::chrono::nanoseconds timeout) override {
        return wait_(*group_, timeout);
    }

  private:
    const std::unique_ptr<WaitGroup> group_;
    const Wait& wait_;
};

/// The device's own queues and groups; but it is for the test to say when a time is over.
class QueuesWithScriptedWait final : public WorkQueues {
  public:
    QueuesWithScriptedWait(WorkQueues& queues, Wait wait)
        : queues_(queues), wait_(std::move(wait)) {}

    [[nodiscard]] std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override {
        return queues_.makeSerialQueue(label);
    }
    [[nodiscard]] std::unique_ptr<OperationQueue> makeOperationQueue() override {
        return queues_.makeOperationQueue();
    }
    [[nodiscard]] std::unique_ptr<WaitGroup> makeWaitGroup() override {
        return std::make_unique<GroupWithScriptedWait>(queues_.makeWaitGroup(), wait_);
    }
    [[nodiscard]] std::unique_ptr<Semaphore> makeSemaphore(std::int64_t value) override {
        return queues_.makeSemaphore(value);
    }
    [[nodiscard]] std::unique_ptr<Lock> makeLock() override { return queues_.makeLock(); }
    void runAfter(std::chrono::nanoseconds delay, Task task) override {
        queues_.runAfter(delay, std::move(task));
    }

  private:
    WorkQueues& queues_;
    const Wait wait_;
};

/// A restore of three applications on a real device, whose service shows their placeholders and
/// tells of them on threads of its own. No time passes for its wait.
class RestoreWait : public testing::Test {
  protected:
    RestoreWait() {
        EXPECT_TRUE(Device::create(device_, {.coordination = true}).ok());
        write(kDemotedAppsPath,
              PropertyList::map({{"AutomaticDowngrades", PropertyList::array({kUnused})},
                                 {"IntentionalDowngrades", PropertyList::array({kOffloaded})}}));
        PropertyList info = PropertyList::map();
        for (const char* identifier : {kKept, kOffloaded, kUnused}) {
            info.set(identifier, PropertyList::map({{"VessikMetadata", metadata()}}));
        }
        write(kRestoreInfoPath, info);
        fs::create_directories(root_ + "/var/mobile/Library/Logs/MediaServices");
    }

    /// `process` holds the client. What has not been let through is after the restore.
    void restoreIn(const char* process, const Wait& wait) {
        Process host(process);
        auto device = Device::open(device_, {.access = DeviceAccess::Session});
        ASSERT_TRUE(device) << device.error().description();
        const Platform own = (*device)->platform(host, reports_);
        QueuesWithScriptedWait queues(own.queues, [&](auto& group, auto longest) {
            asked_.push_back(longest);
            return answered_ = wait(group, longest);
        });
        auto client = AppsClient::create(
            {own.host, own.log, own.registry, own.installer, own.coordination, own.policy,
             own.backup, own.homeScreen, own.icons, own.transactions, queues, own.files,
             own.propertyLists, own.notifications, own.notificationCenter});
        EXPECT_TRUE(client->reconcileRestoreOfType(2, nullptr));
        reports_.letThrough();
        EXPECT_TRUE(reports_.haveBegun(kApplications));
        (*device)->closeCoordination();
        const std::weak_ptr<AppsClient> gone = client;
        client.reset();
        EXPECT_TRUE(gone.expired());
    }

    /// "identifier, install type" of each placeholder; no application is there.
    [[nodiscard]] std::vector<std::string> placeholders() const {
        std::vector<std::string> result;
        const auto device = Device::open(device_, {});
        if (!device) return {device.error().description()};
        const auto records = (*device)->applications();
        if (!records) return {records.error().description()};
        for (const ApplicationRecord& each : *records) {
            if (!each.isPlaceholder) result.push_back(each.identifier + " is installed");
            result.push_back(each.identifier + ", " + std::to_string(each.installType));
        }
        return result;
    }
    void expectRestored() const {
        EXPECT_THAT(placeholders(), ElementsAre("com.example.kept, 2", "com.example.offloaded, 8",
                                                "com.example.unused, 7"));
        EXPECT_FALSE(fs::exists(root_ + std::string(kRestoreInfoPath)));
        EXPECT_TRUE(fs::exists(root_ + std::string(kProcessedRestoreInfoPath)));
    }

    const TemporaryMachineDirectory directory_;
    const std::string device_ = directory_.path() + "/device";
    const std::string root_ = device_ + "/root";
    Reports reports_;
    std::vector<std::chrono::nanoseconds> asked_;
    bool answered_ = false;

  private:
    [[nodiscard]] Bytes metadata() {
        return *codec_.serialize(PropertyList::map({{"title", "Shown"}, {"bundleVersion", "1.0"}}),
                                 PropertyListFormat::Binary);
    }
    void write(std::string_view path, const PropertyList& list) {
        const fs::path file = root_ + std::string(path);
        fs::create_directories(file.parent_path());
        const Bytes bytes = *codec_.serialize(list, PropertyListFormat::Binary);
        std::ofstream(file, std::ios::binary)
            .write(reinterpret_cast<const char*>(bytes.data()),
                   static_cast<std::streamsize>(bytes.size()));
    }

    SystemPropertyLists codec_;
};

TEST_F(RestoreWait, LastsItsWholeTimeInsideTheDaemonAlthoughEveryPlaceholderStands) {
    restoreIn("com.korvu.trd", [this](WaitGroup& group, auto) {
        reports_.letThrough();
        EXPECT_TRUE(reports_.haveBegun(kApplications));
        return group.waitFor(0s);
    });
    EXPECT_THAT(asked_, ElementsAre(15s));
    EXPECT_FALSE(answered_) << "inside the daemon reports do not count";
    // They stay in the book.
    EXPECT_THAT(
        reports_.messages(),
        testing::Contains(AllOf(HasSubstr("pending placeholder install complete"), HasSubstr(kKept),
                                HasSubstr(kOffloaded), HasSubstr(kUnused))));
    expectRestored();
}

TEST_F(RestoreWait, EndsWithTheLastReportElsewhere) {
    restoreIn("com.example.other", [this](WaitGroup& group, auto) {
        reports_.letThrough();
        return group.waitFor(kLongestWait);
    });
    EXPECT_THAT(asked_, ElementsAre(15s));
    EXPECT_TRUE(answered_);
    EXPECT_THAT(reports_.messages(),
                testing::Not(testing::Contains(HasSubstr("getting dealloc'd"))));
    expectRestored();
}

TEST_F(RestoreWait, IsOverForReportsThatComeLater) {
    restoreIn("com.example.other", [this](WaitGroup& group, auto) {
        EXPECT_TRUE(reports_.haveBegun(1));
        return group.waitFor(0s);
    });
    EXPECT_THAT(asked_, ElementsAre(15s));
    EXPECT_FALSE(answered_);
    EXPECT_THAT(reports_.messages(),
                testing::Not(testing::Contains(HasSubstr("TS finished installing placeholder"))));
    expectRestored();
}

}  // namespace
}  // namespace appsync
