#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/Bytes.h"
#include "platform/InstallCoordinator.h"
#include "platform/InstallCoordinatorService.h"
#include "platform/InstallPlaceholder.h"
#include "platform/InstallPromises.h"

// The records of the simulated install-coordination service, as a test may look at them.

namespace appsync {

struct SimulatedCoordinatorState;

/// Who gave something up, and why.
struct SimulatedCancel {
    ErrorRecord reason;
    CoordinationClient client = 0;

    friend bool operator==(const SimulatedCancel&, const SimulatedCancel&) = default;
};

/// A promise of either sort.
struct SimulatedPromiseState {
    std::string name;
    CoordinationClient client = 0;
    std::optional<FileURL> path;
    std::uint64_t diskSpaceNeeded = 0;
    double percent = 0;
    bool complete = false;
    std::optional<SimulatedCancel> cancelled;
    /// Its coordinator has ended: nothing changes it any more.
    bool over = false;
    /// Of which coordinator it is a piece.
    std::weak_ptr<SimulatedCoordinatorState> coordinator;

    /// Whether the service still waits for it.
    [[nodiscard]] bool isAwaited() const { return !complete && !cancelled; }
};

struct SimulatedPlaceholderState {
    std::string name;
    std::string identifier;
    std::uint64_t installType = 0;
    CoordinationClient client = 0;
    std::shared_ptr<SimulatedPromiseState> icon;
    /// The service's copy of the icon file; nothing when it could not be read.
    std::optional<Bytes> iconBytes;
    std::optional<PlaceholderAttributes> attributes;
    /// Whether the metadata was set, and to what.
    bool metadataSet = false;
    std::optional<StoreMetadata> metadata;
    std::optional<Bytes> sinf;
    bool configurationComplete = false;
    std::optional<SimulatedCancel> cancelled;
    std::weak_ptr<SimulatedCoordinatorState> coordinator;
};

struct SimulatedCoordinatorState {
    CoordinatorKind kind = CoordinatorKind::Initiating;
    /// Nothing only of those that a test reports without one.
    std::optional<std::string> identifier;
    CoordinationClient creator = 0;
    std::optional<ErrorRecord> error;
    std::weak_ptr<InstallCoordinatorObserver> observer;

    std::optional<InstallOptions> installOptions;
    std::optional<std::vector<std::shared_ptr<SimulatedPromiseState>>> initialODRAssets;
    std::shared_ptr<SimulatedPromiseState> appAsset;
    std::optional<CoordinationClient> responsibleClient;
    std::shared_ptr<SimulatedPromiseState> userData;
    std::shared_ptr<SimulatedPlaceholderState> placeholder;

    /// The placeholder stands on the home screen.
    bool placeholderShown = false;
    std::optional<SimulatedCancel> cancelled;
    /// Done or cancelled.
    bool ended = false;
    /// A thread of the service's is at work on it, or will be.
    bool scheduled = false;
    /// As it was before its placeholder was handed in, while that is on its way to the home screen:
    /// both are written down at once.
    std::shared_ptr<const SimulatedCoordinatorState> before;
};

}  // namespace appsync
