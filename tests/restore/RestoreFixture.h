#pragma once

#include <regex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "tests/client/AppsClientFixture.h"

namespace appsync {

/// A device that has been restored from a backup. The client is not inside the daemon: reports of
/// placeholders are counted.
class RestoreFixture : public AppsClientFixture {
  protected:
    explicit RestoreFixture(Scheduling scheduling = Scheduling::runToCompletion())
        : AppsClientFixture(scheduling) {
        platform_.files.addDirectory("/var/mobile/Library/Logs/MediaServices");
        client_.reset();
        platform_.host.setMainBundleIdentifier("com.example.other");
        makeClient();
    }

    static PropertyList storeMetadata() {
        return PropertyList::map({{"title", "Shown"}, {"bundleVersion", "1.0"}});
    }
    [[nodiscard]] Bytes bytesOf(const PropertyList& value) {
        return *codec_.serialize(value, PropertyListFormat::Binary);
    }
    /// An application's restore information, with everything that there can be.
    [[nodiscard]] PropertyList appInfo(const PropertyList& metadata = storeMetadata()) {
        return PropertyList::map({{"VessikMetadata", bytesOf(metadata)},
                                  {"ApplicationSINF", sinf_},
                                  {"PlaceholderIcon", icon_}});
    }
    /// Without SINF data and icon.
    [[nodiscard]] PropertyList bareAppInfo(const PropertyList& metadata = storeMetadata()) {
        return PropertyList::map({{"VessikMetadata", bytesOf(metadata)}});
    }

    void setRestoreInfo(const PropertyList& info) {
        platform_.addPropertyList(kInfoPath, info, PropertyListFormat::Binary);
    }
    void setDemotedApps(const PropertyList& list) {
        platform_.addPropertyList(std::string(kDemotedAppsPath), list);
    }
    /// From now on installs are coordinated.
    void coordinate() {
        platform_.coordination.setEnabled(true);
        makeClient();
    }

    /// A restore of the type.
    void restore(std::int64_t type = 2) {
        EXPECT_TRUE(client_->reconcileRestoreOfType(type, nullptr));
        platform_.runUntilIdle();
    }
    void expectInfoMovedOnce() const {
        EXPECT_FALSE(platform_.files.exists(kInfoPath));
        EXPECT_TRUE(platform_.files.exists(kMovedPath));
        EXPECT_THAT(platform_.callsTo({"FileSystem.moveItem"}), testing::SizeIs(1));
    }
    [[nodiscard]] std::vector<std::string> scenarios() const {
        return platform_.transactions.scenarios();
    }
    /// Calls and messages, one a line, with "A" and "B" for two applications, "APPS" for the
    /// directory of placeholder bundles, "INFO" for the restore information and "MOVED" for where
    /// it goes. Without results of calls, sizes, and the encoding of property lists.
    [[nodiscard]] std::string abbreviatedRecording() const {
        std::string text = "\n";
        for (RecordEntry entry : platform_.recording()) {
            if (entry.service == "PropertyListSerialization") continue;
            entry.result.clear();
            text += abbreviated(entry.line()) + "\n";
        }
        return text;
    }
    [[nodiscard]] std::string abbreviated(std::string line) const {
        const std::vector<std::pair<std::string, const char*>> names{
            {kInfoPath, "INFO"},
            {kMovedPath, "MOVED"},
            {"/tmp/com.korvu.trd.Apps", "APPS"},
            {"com.example.a", "A"},
            {"com.example.b", "B"}};
        for (const auto& [name, abbreviation] : names) {
            for (auto at = line.find(name); at != line.npos; at = line.find(name)) {
                line.replace(at, name.size(), abbreviation);
            }
        }
        return std::regex_replace(line, std::regex(R"(,? ?<\d+ bytes>)"), "");
    }

    const std::string kInfoPath{kRestoreInfoPath};
    const std::string kMovedPath{kProcessedRestoreInfoPath};
    const Bytes sinf_{9, 8, 7};
    const Bytes icon_{1, 2, 3, 4};
};

}  // namespace appsync
