#pragma once

#include <deque>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/HomeScreenService.h"
#include "simulation/recording/Recorder.h"

namespace appsync {

class PropertyListSerialization;
class SimulatedAppRegistry;

/// The home screen in memory. A layout is taken when it is a property list whose root is an array
/// of strings. A termination assertion is denied while the application runs, otherwise granted for
/// whatever is installed (a placeholder is not), unless the test scripts it. Who asks gets an
/// assertion to release whatever the outcome, except for an application that there is not.
class SimulatedHomeScreen : public HomeScreenService {
  public:
    /// All are only borrowed.
    SimulatedHomeScreen(Recorder& recorder, const SimulatedAppRegistry& registry,
                        PropertyListSerialization& codec)
        : recorder_(recorder), registry_(registry), codec_(codec) {}

    [[nodiscard]] std::shared_ptr<HomeScreenConnection> blockableConnection() override;
    [[nodiscard]] TerminationAssertionResult takeTerminationAssertion(
        const std::string& identifier, std::uint64_t reason) override;

    // The test's side; not recorded.
    /// Whether there is a connection; at first there is.
    void setReachable(bool reachable) { reachable_ = reachable; }
    /// The identifiers in home-screen order; what a layout that is taken replaces.
    void setLayout(std::vector<std::string> identifiers) { layout_ = std::move(identifiers); }
    [[nodiscard]] const std::vector<std::string>& layout() const { return layout_; }
    /// The bytes that were last brought to `setIconState`, taken or not.
    [[nodiscard]] const std::optional<Bytes>& lastIconState() const { return lastIconState_; }
    /// Every flattened layout is these bytes, whatever the layout is; nothing: no answer.
    void setFlattenedIconState(std::optional<Bytes> bytes) {
        scriptedState_.emplace(std::move(bytes));
    }

    /// What an assertion holds does not begin to run: false then, and nothing has changed.
    bool setRunning(const std::string& identifier, bool running);
    /// The outcomes of the next requests for the identifier, one by one; afterwards as usual.
    void scriptTermination(const std::string& identifier, std::vector<int> outcomes);
    /// The identifiers whose assertions are held, one entry for each assertion.
    [[nodiscard]] const std::multiset<std::string>& heldAssertions() const { return *held_; }

  private:
    class Connection;
    class Assertion;
    using Held = std::multiset<std::string>;

    [[nodiscard]] int outcomeFor(const std::string& identifier);
    [[nodiscard]] bool takeLayout(ByteView state);
    [[nodiscard]] std::optional<Bytes> flattened();

    Recorder& recorder_;
    const SimulatedAppRegistry& registry_;
    PropertyListSerialization& codec_;
    bool reachable_ = true;
    std::vector<std::string> layout_;
    std::optional<Bytes> lastIconState_;
    std::optional<std::optional<Bytes>> scriptedState_;
    std::set<std::string> running_;
    std::map<std::string, std::deque<int>> scripted_;
    std::shared_ptr<Held> held_ = std::make_shared<Held>();
};

}  // namespace appsync
