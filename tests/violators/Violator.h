#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <tuple>
#include <type_traits>
#include <utility>
#include <vector>

#include "contract/ContractKit.h"
#include "contract/DeviceUnderTest.h"
#include "contract/SystemUnderTest.h"
#include "platform/Platform.h"
#include "tests/contract/OurPorts.h"

// Violators: a good implementation behind a wrapper that breaks one sentence of one contract. The
// kit is worth what it catches of them.

namespace appsync {

struct Violator {
    std::string name;
    /// The header whose sentence it breaks, and the sentence.
    std::string header;
    std::string sentence;
    /// The suites that look at the service, as GoogleTest's filter.
    std::string suites;
    ContractPort port;
};

std::vector<Violator> fileSystemViolators();
std::vector<Violator> workQueueViolators();
std::vector<Violator> propertyListViolators();
std::vector<Violator> notificationViolators();
std::vector<Violator> registryViolators();
std::vector<Violator> registryObserverViolators();
std::vector<Violator> progressViolators();
std::vector<Violator> deviceServiceViolators();
std::vector<Violator> coordinationViolators();

/// A system whose calls go to another, which it owns.
class ForwardingSystem : public SystemUnderTest {
  public:
    explicit ForwardingSystem(std::unique_ptr<SystemUnderTest> system)
        : system_(std::move(system)) {}

    FileSystem& files() override { return system_->files(); }
    WorkQueues& queues() override { return system_->queues(); }
    PropertyListSerialization& propertyLists() override { return system_->propertyLists(); }
    NamedNotifications& notifications() override { return system_->notifications(); }
    NotificationCenter& notificationCenter() override { return system_->notificationCenter(); }
    void addLink(const std::string& path, const std::string& target) override {
        links_[path] = target;
        system_->addLink(path, target);
    }
    void addPipe(const std::string& path) override {
        pipes_[path] = true;
        system_->addPipe(path);
    }
    std::vector<std::string> accounts() override { return system_->accounts(); }
    bool belongsTo(const std::string& path, const FileAttributes& accounts) override {
        return system_->belongsTo(path, accounts);
    }
    std::vector<std::string> names(const std::string& directory) override {
        return system_->names(directory);
    }
    void post(std::string_view name) override { system_->post(name); }
    std::uint64_t notificationState(std::string_view name) override {
        return system_->notificationState(name);
    }
    std::chrono::nanoseconds now() override { return system_->now(); }

    /// What links were made with, by their paths.
    [[nodiscard]] const std::map<std::string, std::string>& links() const { return links_; }
    [[nodiscard]] bool isPipe(const std::string& path) const { return pipes_.contains(path); }

  private:
    const std::unique_ptr<SystemUnderTest> system_;
    std::map<std::string, std::string> links_;
    std::map<std::string, bool> pipes_;
};

/// A device whose calls go to another, which it owns.
class ForwardingDevice : public DeviceUnderTest {
  public:
    explicit ForwardingDevice(std::unique_ptr<DeviceUnderTest> device)
        : device_(std::move(device)) {}

    Platform services() override { return device_->services(); }
    std::string addPackage(const BundleInfo& info) override { return device_->addPackage(info); }
    bool reopen() override { return device_->reopen(); }
    Bytes iconState(const std::vector<std::string>& identifiers) override {
        return device_->iconState(identifiers);
    }
    bool run(const std::string& identifier) override { return device_->run(identifier); }
    void quit(const std::string& identifier) override { device_->quit(identifier); }
    void uninstallAsPerson(const std::string& identifier) override {
        device_->uninstallAsPerson(identifier);
    }
    bool cancelAsPerson(const std::string& identifier) override {
        return device_->cancelAsPerson(identifier);
    }
    void setPolicy(PolicyFeature feature, PolicyAnswer answer) override {
        device_->setPolicy(feature, answer);
    }
    void addRestoreData(const std::string& identifier) override {
        device_->addRestoreData(identifier);
    }
    void turnCoordinationOn() override { device_->turnCoordinationOn(); }
    std::vector<std::string> scenarios() override { return device_->scenarios(); }

  private:
    const std::unique_ptr<DeviceUnderTest> device_;
};

/// The platform with one service in another's place.
template <typename Service>
Platform substituted(const Platform& good, Service& service) {
    std::tuple services{&good.host,          &good.log,           &good.registry,
                        &good.installer,     &good.coordination,  &good.policy,
                        &good.backup,        &good.homeScreen,    &good.icons,
                        &good.transactions,  &good.queues,        &good.files,
                        &good.propertyLists, &good.notifications, &good.notificationCenter};
    std::get<Service*>(services) = &service;
    return std::apply([](auto*... each) { return Platform{*each...}; }, services);
}

/// A good device with `Wrapper` around one of its services. A wrapper that is made with the
/// platform too gets it.
template <typename Wrapper>
class DeviceWith : public ForwardingDevice {
  public:
    using Service = typename Wrapper::Service;
    using ForwardingDevice::ForwardingDevice;

    Platform services() override {
        const Platform good = ForwardingDevice::services();
        if (wrapper_ == nullptr) wrapper_ = wrap(good);
        return substituted<Service>(good, *wrapper_);
    }
    bool reopen() override {
        wrapper_.reset();
        return ForwardingDevice::reopen();
    }

  private:
    static std::unique_ptr<Wrapper> wrap(const Platform& good) {
        Service& target = serviceOf(good);
        if constexpr (std::is_constructible_v<Wrapper, Service&, const Platform&>) {
            return std::make_unique<Wrapper>(target, good);
        } else {
            return std::make_unique<Wrapper>(target);
        }
    }
    static Service& serviceOf(const Platform& good) {
        return *std::get<Service*>(std::tuple{&good.registry, &good.installer, &good.coordination,
                                              &good.policy, &good.backup, &good.homeScreen,
                                              &good.icons, &good.transactions});
    }

    std::unique_ptr<Wrapper> wrapper_;
};

/// A good system with `Wrapper` around one of its services. A wrapper that is made with the system
/// too gets it.
template <typename Wrapper>
class SystemWith : public ForwardingSystem {
  public:
    using Service = typename Wrapper::Service;
    using ForwardingSystem::ForwardingSystem;

    FileSystem& files() override { return wrapped(ForwardingSystem::files()); }
    WorkQueues& queues() override { return wrapped(ForwardingSystem::queues()); }
    PropertyListSerialization& propertyLists() override {
        return wrapped(ForwardingSystem::propertyLists());
    }
    NamedNotifications& notifications() override {
        return wrapped(ForwardingSystem::notifications());
    }
    NotificationCenter& notificationCenter() override {
        return wrapped(ForwardingSystem::notificationCenter());
    }

  private:
    template <typename Other>
    Other& wrapped(Other& service) {
        if constexpr (std::is_same_v<Other, Service>) {
            if (wrapper_ == nullptr) wrapper_ = wrap(service);
            return *wrapper_;
        } else {
            return service;
        }
    }
    std::unique_ptr<Wrapper> wrap(Service& target) {
        if constexpr (std::is_constructible_v<Wrapper, Service&, ForwardingSystem&>) {
            return std::make_unique<Wrapper>(target, *this);
        } else {
            return std::make_unique<Wrapper>(target);
        }
    }

    std::unique_ptr<Wrapper> wrapper_;
};

/// What a violator is a wrapper of.
enum class Around { Simulation, OurDevice };

template <typename Wrapper>
ContractPort deviceWith(const std::string& name, Around base = Around::Simulation) {
    return {name,
            nullptr,
            [base]() -> std::unique_ptr<DeviceUnderTest> {
                return std::make_unique<DeviceWith<Wrapper>>(
                    base == Around::Simulation ? makeSimulatedDevice(Scheduling::seeded(1))
                                               : referencePort().makeDevice());
            },
            {}};
}

template <typename Wrapper>
ContractPort systemWith(const std::string& name) {
    return {name,
            [] {
                return std::make_unique<SystemWith<Wrapper>>(
                    makeSimulatedSystem(Scheduling::seeded(1)));
            },
            nullptr,
            {}};
}

/// The violators of one header.
class Violators {
  public:
    Violators(std::string header, std::string suites)
        : header_(std::move(header)), suites_(std::move(suites)) {}

    template <typename Wrapper>
    void device(const std::string& name, const std::string& sentence,
                Around base = Around::Simulation) {
        add(deviceWith<Wrapper>(name, base), sentence);
    }
    template <typename Wrapper>
    void system(const std::string& name, const std::string& sentence) {
        add(systemWith<Wrapper>(name), sentence);
    }
    void add(ContractPort port, const std::string& sentence) {
        violators_.push_back({port.name, header_, sentence, suites_, std::move(port)});
    }

    [[nodiscard]] std::vector<Violator> take() { return std::move(violators_); }

  private:
    const std::string header_;
    const std::string suites_;
    std::vector<Violator> violators_;
};

}  // namespace appsync
