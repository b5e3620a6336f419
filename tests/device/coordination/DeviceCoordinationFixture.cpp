#include "tests/device/coordination/DeviceCoordinationFixture.h"

#include <chrono>
#include <filesystem>
#include <thread>

#include "device/values/DevicePaths.h"
#include "platform/FileURL.h"

namespace appsync {

namespace {

constexpr std::chrono::seconds kLongest{60};

std::string identifierOf(const InstallCoordinator& coordinator) {
    return coordinator.bundleIdentifier().value_or("?");
}

}  // namespace

void CoordinationListener::promiseDidBeginFulfillmentWithIdentifier(std::uint64_t /*promise*/) {}

void CoordinationListener::coordinatorDidInstallPlaceholder(
    const std::shared_ptr<InstallCoordinator>& coordinator) {
    hear((coordinator->error() ? "no placeholder " : "placeholder ") + identifierOf(*coordinator));
}

void CoordinationListener::coordinatorDidCompleteSuccessfully(
    const std::shared_ptr<InstallCoordinator>& coordinator) {
    hear((coordinator->error() ? "failed " : "complete ") + identifierOf(*coordinator));
}

void CoordinationListener::coordinatorCanceledWithReason(
    const std::shared_ptr<InstallCoordinator>& coordinator, const ErrorRecord& /*reason*/,
    CoordinationClient client) {
    hear("cancelled " + identifierOf(*coordinator) + ", client " + std::to_string(client));
}

void CoordinationListener::coordinatorShouldPrioritize(
    const std::shared_ptr<InstallCoordinator>& coordinator) {
    hear("hurry " + identifierOf(*coordinator));
}

std::vector<std::string> CoordinationListener::waitFor(std::size_t count) {
    std::unique_lock lock(mutex_);
    heardMore_.wait_for(lock, kLongest, [&] { return heard_.size() >= count; });
    return heard_;
}

std::vector<std::string> CoordinationListener::heard() {
    const std::lock_guard lock(mutex_);
    return heard_;
}

void CoordinationListener::setReaction(std::function<void(const std::string&)> reaction) {
    const std::lock_guard lock(mutex_);
    reaction_ = std::move(reaction);
}

void CoordinationListener::hear(std::string what) {
    std::function<void(const std::string&)> reaction;
    {
        const std::lock_guard lock(mutex_);
        reaction = reaction_;
    }
    if (reaction) reaction(what);
    const std::lock_guard lock(mutex_);
    heard_.push_back(std::move(what));
    heardMore_.notify_all();
}

DeviceCoordinationFixture::DeviceCoordinationFixture() {
    EXPECT_TRUE(succeeded(look()->change({.coordination = true})));
}

void DeviceCoordinationFixture::endAndForget() { endSession(); }

std::shared_ptr<InstallCoordinator> DeviceCoordinationFixture::coordinator(
    const std::string& identifier, CoordinatorKind kind) {
    const auto found = service().coordinator(
        kind, identifier, SyncClientID, InstallCoordinatorService::Creation::CreateIfNotExisting);
    if (found.error) ADD_FAILURE() << found.error->description();
    if (found.coordinator != nullptr) found.coordinator->setObserver(listener_);
    return found.coordinator;
}

std::shared_ptr<PathTransferPromise> DeviceCoordinationFixture::pathPromise(
    const std::string& name) {
    return service().makePathTransferPromise(name, SyncClientID, std::nullopt, 0);
}

std::string DeviceCoordinationFixture::stageIcon(const std::string& identifier) {
    static_cast<void>(device());  // an opening clears the temporary directory
    const std::string directory =
        std::string(kPlaceholderFilesDirectory) + "/" + identifier + ".app";
    std::filesystem::create_directories(rootPath(directory));
    write(directory + "/Icon.png", "icon of " + identifier);
    return directory + "/Icon.png";
}

std::shared_ptr<InstallPlaceholder> DeviceCoordinationFixture::placeholder(
    const std::string& identifier) {
    auto placeholder =
        service().makeAppPlaceholder("Atlas", identifier, kInstallTypeSync, SyncClientID);
    const auto icon = service().makePathTransferPromise(
        identifier + "-Icon", SyncClientID, FileURL::fromPath(stageIcon(identifier), false), 10);
    icon->setPercentComplete(1.0);
    icon->setComplete();
    EXPECT_TRUE(succeeded(placeholder->setIconPromise(icon)));
    PlaceholderAttributes attributes;
    attributes.bundleVersion = "2.0";
    EXPECT_TRUE(succeeded(placeholder->setAttributes(attributes)));
    StoreMetadata metadata;
    metadata.metadata.set("title", "Atlas of the World");
    EXPECT_TRUE(succeeded(placeholder->setMetadata(metadata)));
    return placeholder;
}

std::shared_ptr<InstallCoordinator> DeviceCoordinationFixture::prepare(
    const std::string& identifier, CoordinatorKind kind) {
    auto made = coordinator(identifier, kind);
    if (made == nullptr) return made;
    EXPECT_TRUE(succeeded(made->setInstallOptions({StoreMetadata{}, kInstallTypeSync, 1})));
    EXPECT_TRUE(succeeded(made->setInitialODRAssetPromises({})));
    EXPECT_TRUE(succeeded(made->setAppAssetPromise(pathPromise(identifier + "-Asset"))));
    const auto shown = placeholder(identifier);
    EXPECT_TRUE(succeeded(shown->setConfigurationComplete()));
    EXPECT_TRUE(succeeded(made->setPlaceholderPromise(shown)));
    return made;
}

void DeviceCoordinationFixture::deliver(InstallCoordinator& coordinator,
                                        const std::string& package) {
    const auto promise = coordinator.appAssetPromise();
    ASSERT_NE(promise, nullptr);
    promise->setTransferPath(FileURL::fromPath(package, false).value());
    promise->setPercentComplete(1.0);
    promise->setComplete();
}

void DeviceCoordinationFixture::installCoordinated(const std::string& identifier,
                                                   const std::string& version,
                                                   CoordinatorKind kind) {
    const auto made = prepare(identifier, kind);
    deliver(*made, stagePackage(identifier, version));
    EXPECT_TRUE(device().waitForCoordinatedInstalls(kLongest));
}

bool DeviceCoordinationFixture::hasPlaceholder(const std::string& identifier) {
    const std::optional<AppProxy> proxy = either(identifier);
    return proxy && proxy->state.placeholder;
}

std::optional<CoordinatorRecord> DeviceCoordinationFixture::recordOf(
    const std::string& identifier) {
    const Result<std::vector<CoordinatorRecord>> all = look()->coordinators();
    EXPECT_TRUE(all.ok());
    if (!all) return std::nullopt;
    for (const CoordinatorRecord& record : *all) {
        if (record.identifier == identifier) return record;
    }
    return std::nullopt;
}

bool DeviceCoordinationFixture::eventually(const std::function<bool()>& isSo) {
    const auto end = std::chrono::steady_clock::now() + kLongest;
    while (!isSo()) {
        if (std::chrono::steady_clock::now() > end) return false;
        std::this_thread::yield();
    }
    return true;
}

}  // namespace appsync
