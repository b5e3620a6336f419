#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <random>
#include <string>
#include <string_view>
#include <vector>

#include "platform/PlugInTable.h"
#include "recording/RecordedClient.h"
#include "recording/Recording.h"
#include "recording/RecordingPlatform.h"
#include "tests/recordings/Troubles.h"
#include "tests/reliability/World.h"

namespace appsync {

/// A recording in memory.
class TextSink : public RecordingSink {
  public:
    void write(std::string_view line) noexcept override { text += line; }
    std::string text;
};

/// One session on a device in memory, recorded, which a seed decides: the path, what the lists and
/// the backup hold, what becomes of each transfer, who cancels what, which calls fail, and who has
/// a turn when.
class SeededRecording {
  public:
    /// What may be left out, for what is to be the same each time.
    struct Choices {
        bool isAnonymous = false;
        bool hasFaults = true;
        /// Nothing: the seed decides.
        std::optional<bool> isCoordinated = std::nullopt;
        std::size_t identifiers = 6;
        /// A device on which much has happened before, and hosts that ask and send what is rare.
        bool isEventful = false;
        /// Services that refuse, others who are in the way, and a host that loses its thread.
        bool isTroubled = false;
    };

    explicit SeededRecording(std::uint64_t seed, Choices choices);
    explicit SeededRecording(std::uint64_t seed) : SeededRecording(seed, Choices()) {}

    /// The recording of the whole session.
    std::string record();

  private:
    [[nodiscard]] bool oneIn(std::uint64_t count) { return random_() % count == 0; }
    [[nodiscard]] const std::string& anyIdentifier() {
        return identifiers_[random_() % identifiers_.size()];
    }

    void arrange();
    void arrangeEvents();
    void arrangeApplication(const std::string& identifier);
    void arrangeServices();
    void stageEventfulRestore();
    void askRareThings();
    void transferRestore();
    [[nodiscard]] PropertyList anyStoreMetadata();
    [[nodiscard]] std::vector<std::string> someIdentifiers();
    [[nodiscard]] PropertyList anyEntry(const std::string& identifier);
    void startClient();
    void endClient();
    void restore();
    void sync();
    void disturb();
    void transfer(const SyncAssetPointer& asset);
    void transferAll();
    void transferTroubled(const SyncAssetPointer& asset);
    [[nodiscard]] PropertyList anyTodoList();

    const Choices choices_;
    std::mt19937_64 random_;
    World world_;
    const std::vector<std::string> identifiers_;
    Troubles troubles_;
    TextSink sink_;
    std::shared_ptr<Recording> recording_;
    std::unique_ptr<RecordingPlatform> platform_;
    PlugInClient made_;
    std::unique_ptr<RecordedClient> client_;
};

}  // namespace appsync
