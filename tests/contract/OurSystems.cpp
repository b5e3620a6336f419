#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <stdexcept>

#include "contract/TemporaryMachineDirectory.h"
#include "simulation/SimulatedPlatform.h"
#include "system/SystemNotifications.h"
#include "system/file/RootedFileSystem.h"
#include "system/property_list/PropertyListCodec.h"
#include "system/threads/SystemWorkQueues.h"
#include "tests/contract/OurPorts.h"

namespace appsync {
namespace {

class SimulatedSystem : public SystemUnderTest {
  public:
    explicit SimulatedSystem(Scheduling scheduling) : platform_(codec_, scheduling) {}

    FileSystem& files() override { return platform_.files; }
    WorkQueues& queues() override { return platform_.queues; }
    PropertyListSerialization& propertyLists() override { return platform_.propertyLists; }
    NamedNotifications& notifications() override { return platform_.notifications; }
    NotificationCenter& notificationCenter() override { return platform_.notificationCenter; }

    void addLink(const std::string& path, const std::string& target) override {
        platform_.files.addLink(path, target);
    }
    void addPipe(const std::string& path) override { platform_.files.addPipe(path); }
    std::vector<std::string> accounts() override { return {"mobile", "root"}; }
    bool belongsTo(const std::string& path, const FileAttributes& accounts) override {
        const std::string ownership = platform_.files.ownership(path).value_or("nobody:nobody");
        const std::size_t colon = ownership.find(':');
        return accounts.owner.value_or(ownership.substr(0, colon)) == ownership.substr(0, colon) &&
               accounts.group.value_or(ownership.substr(colon + 1)) == ownership.substr(colon + 1);
    }
    std::vector<std::string> names(const std::string& directory) override {
        return platform_.files.names(directory);
    }
    void post(std::string_view name) override {
        platform_.notificationCenter.post(name);
        platform_.runUntilIdle();
    }
    std::uint64_t notificationState(std::string_view name) override {
        return platform_.notifications.state(std::string(name));
    }
    std::chrono::nanoseconds now() override { return platform_.now(); }

  private:
    SystemPropertyLists codec_;
    SimulatedPlatform platform_;
};

/// system/: threads, and files below a directory of this machine.
class PosixSystem : public SystemUnderTest {
  public:
    PosixSystem() {
        auto opened = RootedFileSystem::open(directory_.path(), {.accounts = accounts_});
        if (!opened) throw std::runtime_error(opened.error().description());
        files_ = *std::move(opened);
    }

    FileSystem& files() override { return *files_; }
    WorkQueues& queues() override { return queues_; }
    PropertyListSerialization& propertyLists() override { return propertyLists_; }
    NamedNotifications& notifications() override { return notifications_; }
    NotificationCenter& notificationCenter() override { return notificationCenter_; }

    void addLink(const std::string& path, const std::string& target) override {
        std::filesystem::create_symlink(target, directory_.path() + path);
    }
    void addPipe(const std::string& path) override {
        const std::string machinePath = directory_.path() + path;
        if (::mkfifo(machinePath.c_str(), S_IRUSR | S_IWUSR) != 0) {
            throw std::runtime_error("cannot make a pipe at " + machinePath);
        }
    }
    std::vector<std::string> accounts() override {
        std::vector<std::string> names;
        for (const auto& [name, account] : accounts_) names.push_back(name);
        return names;
    }
    bool belongsTo(const std::string& path, const FileAttributes& accounts) override {
        struct stat status {};
        if (::lstat((directory_.path() + path).c_str(), &status) != 0) return false;
        return (!accounts.owner || accounts_.at(*accounts.owner).user == status.st_uid) &&
               (!accounts.group || accounts_.at(*accounts.group).group == status.st_gid);
    }
    std::vector<std::string> names(const std::string& directory) override {
        std::vector<std::string> names;
        for (const auto& entry :
             std::filesystem::directory_iterator(directory_.path() + directory)) {
            names.push_back(entry.path().filename());
        }
        std::sort(names.begin(), names.end());
        return names;
    }
    void post(std::string_view name) override { notificationCenter_.post(name); }
    std::uint64_t notificationState(std::string_view name) override {
        return notifications_.stateOf(name);
    }
    std::chrono::nanoseconds now() override {
        return std::chrono::steady_clock::now().time_since_epoch();
    }

  private:
    /// The superuser gives items to anybody, nobody else does.
    static AccountMap machineAccounts() {
        AccountMap accounts{{"mobile", {::geteuid(), ::getegid()}}};
        if (::geteuid() == 0) accounts.emplace("somebody", MachineAccount{4711, 4712});
        return accounts;
    }

    const TemporaryMachineDirectory directory_;
    const AccountMap accounts_ = machineAccounts();
    std::unique_ptr<RootedFileSystem> files_;
    SystemPropertyLists propertyLists_;
    SystemNotifications notifications_;
    SystemNotificationCenter notificationCenter_;
    SystemWorkQueues queues_;
};

}  // namespace

std::unique_ptr<SystemUnderTest> makeSimulatedSystem(Scheduling scheduling) {
    return std::make_unique<SimulatedSystem>(scheduling);
}

ContractPort posixPort() {
    return {"Posix", [] { return std::make_unique<PosixSystem>(); }, nullptr, {}};
}

}  // namespace appsync
