#pragma once

#include <cstdint>
#include <random>
#include <string>
#include <string_view>
#include <vector>

#include "simulation/coordination/SimulatedCoordination.h"
#include "tests/reliability/World.h"

namespace appsync {

/// What may stand in a session's way, drawn from its seed: services that refuse pieces or hand out
/// nothing, coordinators of others that are there already, files that hold something else, and maps
/// that have grown large.
class Troubles {
  public:
    /// All are only borrowed.
    Troubles(World& world, std::mt19937_64& random, const std::vector<std::string>& identifiers)
        : world_(world), random_(random), identifiers_(identifiers) {}

    /// Before there is a client.
    void arrange();
    /// After the host has staged a list.
    void spoilStaging();
    /// How much of a transfer a host may say has come.
    [[nodiscard]] double anyFraction();

  private:
    [[nodiscard]] bool oneIn(std::uint64_t count) { return random_() % count == 0; }

    void refusePieces(const std::string& identifier);
    void withholdObjects(const std::string& identifier);
    void addCoordinatorOfAnother(const std::string& identifier);
    void hideBundle(const std::string& identifier);
    void coverWithSystemPlaceholder(const std::string& identifier);
    void fillRestoreState();
    void spoilFiles();
    /// One file that holds no property list, or one of another kind.
    void spoil(std::string_view path);

    World& world_;
    std::mt19937_64& random_;
    const std::vector<std::string>& identifiers_;
};

}  // namespace appsync
