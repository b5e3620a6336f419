#include "contract/DeviceContract.h"

#include <algorithm>

namespace appsync {

DeviceContract::DeviceContract()
    : device_(GetParam().makeDevice()),
      services_(device_->services()),
      registry_(services_.registry) {}

// What closing the device breaks is no sentence that the test has looked at.
DeviceContract::~DeviceContract() { checks({}, {}); }

void pause(WorkQueues& queues, std::chrono::nanoseconds time) {
    const std::shared_ptr<Semaphore> over = queues.makeSemaphore(0);
    queues.runAfter(time, [over] { over->signal(); });
    EXPECT_TRUE(over->wait());
}

PropertyList packageOptions(const std::string& identifier) {
    return PropertyList::map(
        {{PackageTypeKey, PackageTypeCustomer}, {BundleIdentifierKey, identifier}});
}

PropertyList placeholderOptions(const std::string& identifier, std::uint64_t installType) {
    return PropertyList::map({{PackageTypeKey, PackageTypePlaceholder},
                              {BundleIdentifierKey, identifier},
                              {InstallTypeKey, installType}});
}

Status DeviceContract::installPackage(const BundleInfo& info) {
    return installFrom(device_->addPackage(info), info.identifier);
}

Status DeviceContract::installFrom(const std::string& path, const std::string& identifier) {
    return registry_.installPackage(FileURL::fromPath(path, false).value(),
                                    packageOptions(identifier));
}

std::string DeviceContract::addPlaceholderBundle(const BundleInfo& info) {
    const std::string path = services_.files.temporaryDirectory() + "/" + info.identifier + ".app";
    EXPECT_TRUE(services_.files.createDirectory(path, true, nullptr));
    const PropertyList dictionary = PropertyList::map({{BundleIdentifierKey, info.identifier},
                                                       {BundleVersionKey, info.version},
                                                       {BundleDisplayNameKey, info.displayName},
                                                       {BundleExecutableKey, info.displayName}});
    const auto bytes = services_.propertyLists.serialize(dictionary, PropertyListFormat::Binary);
    EXPECT_TRUE(bytes);
    EXPECT_TRUE(services_.files.writeFileAtomically(path + "/Info.plist", *bytes));
    return path;
}

Status DeviceContract::installPlaceholder(const BundleInfo& info, std::uint64_t installType) {
    const std::string path = addPlaceholderBundle(info);
    Status status = registry_.installPlaceholderBundle(
        FileURL::fromPath(path, true).value(), placeholderOptions(info.identifier, installType));
    EXPECT_TRUE(services_.files.removeItem(path));
    return status;
}

std::optional<AppProxy> DeviceContract::application(const std::string& identifier) {
    return registry_.proxyForIdentifier(identifier, AppRegistry::Placeholders::Excluded);
}

std::optional<AppProxy> DeviceContract::preferred(const std::string& identifier) {
    return registry_.proxyForIdentifier(identifier, AppRegistry::Placeholders::Included);
}

std::shared_ptr<InstallProgressRecord> DeviceContract::progress(const std::string& identifier) {
    const std::optional<AppProxy> proxy = preferred(identifier);
    return proxy ? registry_.installProgress(*proxy, 0) : nullptr;
}

std::vector<std::string> DeviceContract::bundles(AppRegistry::BundleType type) {
    std::vector<std::string> texts;
    registry_.enumerateBundles(type, [&](const AppProxy& proxy, bool&) {
        texts.push_back(proxy.applicationIdentifier +
                        (proxy.state.placeholder ? " (placeholder)" : ""));
    });
    std::sort(texts.begin(), texts.end());
    return texts;
}

}  // namespace appsync
