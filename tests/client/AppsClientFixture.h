#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/TodoList.h"
#include "simulation/SimulatedPlatform.h"
#include "system/property_list/PropertyListCodec.h"
#include "tests/client/AppsClientTestAccess.h"

namespace appsync {

inline constexpr const char* kA = "com.example.a";
inline constexpr const char* kB = "com.example.b";
inline constexpr const char* kC = "com.example.c";
/// The version that is asked for.
inline const std::string kOneZero = "1.0";
/// Where the client makes the placeholder of the first.
inline const std::string kBundle = "/tmp/com.korvu.trd.Apps/com.example.a.app";

inline PropertyList todoEntry(const PropertyList& identifier, std::string_view operation) {
    return PropertyList::map({{kTodoIdentifierKey, identifier},
                              {kTodoOperationKey, operation},
                              {kTodoVersionKey, "1.0"},
                              {kTodoNameKey, "Example"}});
}

/// A device in memory and a client on it. The recording begins when the client is made.
class AppsClientFixture : public testing::Test {
  protected:
    explicit AppsClientFixture(Scheduling scheduling = Scheduling::runToCompletion())
        : platform_(codec_, scheduling) {
        makeClient();
    }

    void makeClient() {
        client_ = AppsClient::create(platform_.services());
        platform_.runUntilIdle();
        platform_.clearRecording();
    }

    /// Makes a new client, on a device whose installs are coordinated.
    void makeCoordinatedClient() {
        platform_.coordination.setEnabled(true);
        makeClient();
    }

    /// What the host leaves for the next session.
    void stage(const PropertyList& todoList) {
        platform_.addPropertyList(std::string(kStagingArea) + "/ApplicationsSync.plist", todoList);
    }
    /// What a session has taken over.
    void setTodoList(const PropertyList& todoList) {
        platform_.addPropertyList(std::string(kTodoListPath), todoList);
    }
    [[nodiscard]] std::optional<std::string> operationOf(std::string_view identifier) {
        const auto todoList = platform_.propertyListAt(std::string(kTodoListPath));
        const auto index = todoList ? indexOfEntry(*todoList, identifier) : std::nullopt;
        const std::string* operation =
            index ? todoList->at(*index)->findString(kTodoOperationKey) : nullptr;
        return operation != nullptr ? std::optional(*operation) : std::nullopt;
    }

    /// An asset whose package has arrived.
    SyncAssetPointer receivedAsset(const std::string& identifier) {
        auto asset = std::make_shared<SyncAsset>();
        asset->identifier = identifier;
        asset->dataclass = "Application";
        asset->prettyName = "Example";
        asset->path = packagePath(identifier);
        asset->variantOptions =
            PropertyList::map({{"AssetParts", kAssetPartApplication}, {"Version", "1.0"}});
        platform_.files.addFile(*asset->path, "package");
        return asset;
    }
    static std::string packagePath(const std::string& identifier) {
        return std::string(kPublicStaging) + "/" + identifier + ".zip";
    }

    // What was logged in category 8, or 14.
    [[nodiscard]] bool logged(LogLevel level, std::string_view text) const {
        return platform_.hasMessage(level, LogCategory::Coordination, text);
    }
    [[nodiscard]] bool loggedInApplications(LogLevel level, std::string_view text) const {
        return platform_.hasMessage(level, LogCategory::Applications, text);
    }

    SystemPropertyLists codec_;
    SimulatedPlatform platform_;
    std::shared_ptr<AppsClient> client_;
};

}  // namespace appsync
