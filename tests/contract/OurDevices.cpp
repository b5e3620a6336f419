#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <stdexcept>

#include "contract/TemporaryMachineDirectory.h"
#include "device/Device.h"
#include "device/package/PackageWriter.h"
#include "platform/SyncHost.h"
#include "simulation/DeviceImage.h"
#include "simulation/SimulatedPlatform.h"
#include "system/JsonLogFacility.h"
#include "system/property_list/PropertyListCodec.h"
#include "tests/contract/OurPorts.h"

namespace appsync {
namespace {

constexpr const char* kStaging = "/var/mobile/Media/PublicStaging/";

PropertyList infoDictionary(const BundleInfo& info) {
    return PropertyList::map({{BundleIdentifierKey, info.identifier},
                              {BundleVersionKey, info.version},
                              {BundleDisplayNameKey, info.displayName}});
}

class SimulatedDevice : public DeviceUnderTest {
  public:
    explicit SimulatedDevice(Scheduling scheduling) : platform_(codec_, scheduling) {}

    Platform services() override { return platform_.services(); }

    std::string addPackage(const BundleInfo& info) override {
        const std::string path = kStaging + info.identifier + ".zip";
        platform_.addPropertyList(path, infoDictionary(info));
        return path;
    }
    bool run(const std::string& identifier) override {
        return platform_.homeScreen.setRunning(identifier, true);
    }
    void quit(const std::string& identifier) override {
        platform_.homeScreen.setRunning(identifier, false);
    }
    void uninstallAsPerson(const std::string& identifier) override {
        if (!platform_.registry.uninstallApplication(identifier, {})) {
            throw std::runtime_error("nothing to uninstall");
        }
        platform_.installer.addUninstalled(identifier);
    }
    bool cancelAsPerson(const std::string& identifier) override {
        platform_.registry.cancelInstalls({identifier});
        return true;
    }
    void setPolicy(PolicyFeature feature, PolicyAnswer answer) override {
        platform_.policy.set(feature, answer);
    }
    void addRestoreData(const std::string& identifier) override {
        platform_.backup.addRestoreData(identifier);
    }
    void turnCoordinationOn() override { platform_.coordination.setEnabled(true); }
    bool reopen() override {
        const CrashRecorder crashes(platform_);
        platform_.reopen(crashes.imageOf(1));
        return true;
    }
    std::vector<std::string> scenarios() override { return platform_.transactions.scenarios(); }

  private:
    SystemPropertyLists codec_;
    SimulatedPlatform platform_;
};

class FixedSyncHost : public SyncHost {
  public:
    [[nodiscard]] std::string mainBundleIdentifier() const override { return "com.korvu.trd"; }
    [[nodiscard]] std::string pluginBundleIdentifier() const override { return "com.example.sync"; }
    [[nodiscard]] bool isRecoverableError(const ErrorRecord&) const override { return false; }
};

/// device/: a device in a directory of this machine.
class ReferenceDevice : public DeviceUnderTest {
  public:
    ReferenceDevice() : log_(LogFile::open(directory_.path() + "/log").value()) {
        require(Device::create(devicePath()));
        open();
    }

    Platform services() override { return device_->platform(host_, log_); }

    std::string addPackage(const BundleInfo& info) override {
        const std::string folder = directory_.path() + "/package";
        std::filesystem::remove_all(folder);
        std::filesystem::create_directories(folder + "/Example.app");
        const auto bytes = codec_.serialize(infoDictionary(info), PropertyListFormat::Binary);
        if (!bytes) throw std::runtime_error(bytes.error().description());
        std::ofstream(folder + "/Example.app/Info.plist", std::ios::binary)
            .write(reinterpret_cast<const char*>(bytes->data()),
                   static_cast<std::streamsize>(bytes->size()));
        const std::string path = kStaging + info.identifier + ".zip";
        const auto written = writePackage(folder, devicePath() + "/root" + path, codec_);
        if (!written) throw std::runtime_error(written.error().description());
        return path;
    }
    bool run(const std::string& identifier) override { return device_->run(identifier).ok(); }
    void quit(const std::string& identifier) override { require(device_->quit(identifier)); }
    void uninstallAsPerson(const std::string& identifier) override {
        require(device_->uninstall(identifier));
    }
    void setPolicy(PolicyFeature feature, PolicyAnswer answer) override {
        DeviceSettingsChange change;
        const bool installation = feature == PolicyFeature::AppInstallationAllowed;
        (installation ? change.installation : change.removal) = answer;
        require(device_->change(change));
    }
    void addRestoreData(const std::string& identifier) override {
        require(device_->setRestoreDataExpected(identifier, true));
    }
    void turnCoordinationOn() override {
        DeviceSettingsChange change;
        change.coordination = true;
        require(device_->change(change));
    }
    bool reopen() override {
        device_.reset();
        open();
        return true;
    }
    std::vector<std::string> scenarios() override {
        const auto history = device_->history();
        if (!history) throw std::runtime_error(history.error().description());
        std::vector<std::string> texts;
        for (const HistoryRecord& record : *history) {
            if (record.kind != HistoryRecord::Kind::Scenario) continue;
            texts.push_back(record.scenario + "|" + record.identifier + "|" +
                            (record.success ? "yes" : "no") + "|" + record.description);
        }
        return texts;
    }

  private:
    void open() {
        auto opened = Device::open(devicePath(), {.access = DeviceAccess::Session});
        if (!opened) throw std::runtime_error(opened.error().description());
        device_ = *std::move(opened);
    }
    static void require(const Status& status) {
        if (!status) throw std::runtime_error(status.error().description());
    }
    [[nodiscard]] std::string devicePath() const { return directory_.path() + "/device"; }

    const TemporaryMachineDirectory directory_;
    SystemPropertyLists codec_;
    FixedSyncHost host_;
    JsonLogFacility log_;
    std::unique_ptr<Device> device_;
};

}  // namespace

std::unique_ptr<DeviceUnderTest> makeSimulatedDevice(Scheduling scheduling) {
    return std::make_unique<SimulatedDevice>(scheduling);
}

ContractPort simulatedPort(const std::string& name, Scheduling scheduling) {
    return {name,
            [scheduling] { return makeSimulatedSystem(scheduling); },
            [scheduling] { return makeSimulatedDevice(scheduling); },
            {}};
}

std::unique_ptr<DeviceUnderTest> makeReferenceDevice() {
    // Without a zone the C library frees and copies its default's name with each archive that is
    // opened, under a lock that ThreadSanitizer does not see.
    ::setenv("TZ", "UTC", 0);
    return std::make_unique<ReferenceDevice>();
}

ContractPort referencePort() {
    return {"Reference",
            nullptr,
            makeReferenceDevice,
            {OptionalService::Transfers, OptionalService::CancelByPerson}};
}

}  // namespace appsync
