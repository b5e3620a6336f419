#include "simulation/services/SimulatedHomeScreen.h"

#include "platform/PropertyListSerialization.h"
#include "simulation/recording/RecordedCall.h"
#include "simulation/services/SimulatedAppRegistry.h"

namespace appsync {
namespace {
constexpr std::string_view kHomeScreenService = "HomeScreenService";
constexpr std::string_view kConnectionService = "HomeScreenConnection";
}  // namespace

class SimulatedHomeScreen::Connection : public HomeScreenConnection {
  public:
    explicit Connection(SimulatedHomeScreen& home) : home_(home) {}

    bool setIconState(ByteView state) override {
        RecordedCall call(home_.recorder_, kConnectionService, "setIconState", state);
        const bool taken = home_.takeLayout(state);
        if (taken) home_.recorder_.recordsChanged("the icon layout", Persistence::Committed);
        return call.result(taken);
    }

    [[nodiscard]] std::optional<Bytes> flattenedIconState(std::uint64_t variant) override {
        RecordedCall call(home_.recorder_, kConnectionService, "flattenedIconState", variant);
        if (variant != 1) throw SimulationFailure("the variant of an icon state is always 1");
        return call.result(home_.flattened());
    }

  private:
    SimulatedHomeScreen& home_;
};

class SimulatedHomeScreen::Assertion : public TerminationAssertion {
  public:
    Assertion(Recorder& recorder, std::shared_ptr<Held> held, const std::string& identifier)
        : recorder_(recorder), held_(std::move(held)), position_(held_->insert(identifier)) {}

    Assertion(const Assertion&) = delete;
    Assertion& operator=(const Assertion&) = delete;

    // What is thrown is a mistake of the simulation itself, which ends the test.
    // NOLINTNEXTLINE(bugprone-exception-escape)
    ~Assertion() override {
        const RecordedCall call(recorder_, "TerminationAssertion", "release", *position_);
        held_->erase(position_);
    }

  private:
    Recorder& recorder_;
    const std::shared_ptr<Held> held_;
    const Held::iterator position_;
};

std::shared_ptr<HomeScreenConnection> SimulatedHomeScreen::blockableConnection() {
    RecordedCall call(recorder_, kHomeScreenService, "blockableConnection");
    std::shared_ptr<Connection> connection;
    if (reachable_) connection = std::make_shared<Connection>(*this);
    return call.result(std::move(connection), reachable_ ? "a connection" : "(null)");
}

TerminationAssertionResult SimulatedHomeScreen::takeTerminationAssertion(
    const std::string& identifier, std::uint64_t reason) {
    RecordedCall call(recorder_, kHomeScreenService, "takeTerminationAssertion", identifier,
                      reason);
    if (reason != 0) throw SimulationFailure("the reason of a termination assertion is always 0");
    TerminationAssertionResult result;
    result.outcome = outcomeFor(identifier);
    if (result.outcome != TerminationAssertionResult::kNoSuchApplication) {
        result.assertion = std::make_unique<Assertion>(recorder_, held_, identifier);
    }
    const std::string text = std::to_string(result.outcome);
    return call.result(std::move(result), text);
}

int SimulatedHomeScreen::outcomeFor(const std::string& identifier) {
    std::deque<int>& scripted = scripted_[identifier];
    if (!scripted.empty()) {
        const int outcome = scripted.front();
        scripted.pop_front();
        return outcome;
    }
    if (running_.count(identifier) != 0) return TerminationAssertionResult::kDenied;
    return registry_.installed(identifier) ? TerminationAssertionResult::kGranted
                                           : TerminationAssertionResult::kNoSuchApplication;
}

bool SimulatedHomeScreen::takeLayout(ByteView state) {
    lastIconState_ = Bytes(state.begin(), state.end());
    const Result<PropertyList> layout = codec_.parse(state);
    if (!layout || !layout->isArray()) return false;
    std::vector<std::string> identifiers;
    for (const PropertyList& element : layout->elements()) {
        if (!element.isString()) return false;
        identifiers.push_back(*element.asString());
    }
    layout_ = std::move(identifiers);
    return true;
}

std::optional<Bytes> SimulatedHomeScreen::flattened() {
    if (scriptedState_) return *scriptedState_;
    Result<Bytes> bytes =
        codec_.serialize(PropertyList::strings(layout_), PropertyListFormat::Binary);
    if (!bytes)
        throw SimulationFailure("the layout cannot be written: " + bytes.error().description());
    return *std::move(bytes);
}

bool SimulatedHomeScreen::setRunning(const std::string& identifier, bool running) {
    if (running && held_->contains(identifier)) return false;
    if (running) {
        running_.insert(identifier);
    } else {
        running_.erase(identifier);
    }
    return true;
}

void SimulatedHomeScreen::scriptTermination(const std::string& identifier,
                                            std::vector<int> outcomes) {
    scripted_[identifier].assign(outcomes.begin(), outcomes.end());
}

}  // namespace appsync
