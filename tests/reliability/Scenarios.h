#pragma once

#include <functional>
#include <ostream>
#include <string>
#include <vector>

#include "platform/PropertyList.h"
#include "tests/reliability/Invariants.h"
#include "tests/reliability/World.h"

namespace appsync {

/// Something that the host does with the client, from its beginning to its end.
struct Scenario {
    std::string name;
    bool coordinated = false;
    /// What is on the device before the client is.
    std::function<void(World&)> arrange;
    /// Leaves nothing under way.
    std::function<void(World&, Invariants&)> run;
    /// How the device is when nothing has failed, a line for each thing that is not so.
    std::function<std::vector<std::string>(World&)> shortcomings;
    /// Whether the same again, on what a failed run has left, comes to that end.
    bool heals = true;
    /// What the host wants on the device: the list that `run` stages. Null: it stages none.
    PropertyList wanted{};
    /// What the host does after an interruption, where that is not the same again.
    std::function<void(World&, Invariants&)> resume{};
    bool isInDaemon = true;
    /// Another scenario with other waits: a few crashes at each instant are enough.
    bool isVariant = false;
    /// Whether a loss of power may take a package of which it is on record that it has come. Its
    /// install fails then, and the sync after that brings it.
    bool mayLosePackage = false;

    /// Says to a new world what it has to know of the scenario. What is on it comes after that.
    void setUp(World& world) const;
};

/// GoogleTest prints scenarios with it.
inline void PrintTo(const Scenario& scenario, std::ostream* out) { *out << scenario.name; }

/// A whole sync that brings the device in step with what is wanted. A host that plans stages what
/// is left to do of that, and starts the client.
void sync(World& world, Invariants& invariants, const PropertyList& wanted);

/// Every one of them.
[[nodiscard]] const std::vector<Scenario>& scenarios();

}  // namespace appsync
