#include "simulation/services/SimulatedNotifications.h"

#include <algorithm>
#include <utility>

#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {
constexpr std::string_view kNamed = "NamedNotifications";
constexpr std::string_view kCenter = "NotificationCenter";
}  // namespace

NamedNotifications::Registration SimulatedNamedNotifications::registerForState(
    std::string_view name) {
    RecordedCall call(recorder_, kNamed, "registerForState", name);
    if (status_ != 0) return call.result(Registration{status_, 0}, "status " + callText(status_));
    const int token = ++lastToken_;
    tokens_[token] = name;
    return call.result(Registration{0, token}, "token " + callText(token));
}

void SimulatedNamedNotifications::setState(int token, std::uint64_t state) {
    const RecordedCall call(recorder_, kNamed, "setState", token, state);
    const auto found = tokens_.find(token);
    if (found == tokens_.end()) throw SimulationFailure("no token " + callText(token));
    states_[found->second] = state;
}

void SimulatedNamedNotifications::post(std::string_view name) {
    const RecordedCall call(recorder_, kNamed, "post", name);
    posts_.push_back(std::string(name) + "=" + callText(state(std::string(name))));
}

std::uint64_t SimulatedNamedNotifications::state(const std::string& name) const {
    const auto found = states_.find(name);
    return found == states_.end() ? 0 : found->second;
}

void SimulatedNotificationCenter::addObserver(std::weak_ptr<void> observer, std::string_view name,
                                              Callback callback, SuspensionBehavior behavior) {
    (void)behavior;  // there is only one
    const RecordedCall call(recorder_, kCenter, "addObserver", name, "Drop");
    auto observation = std::make_shared<Observation>();
    observation->address = observer.lock().get();
    observation->observer = std::move(observer);
    observation->name = name;
    observation->callback = callback;
    if (observation->address == nullptr || callback == nullptr) {
        throw SimulationFailure("an observer of notifications and its callback must exist");
    }
    observations_.push_back(std::move(observation));
}

void SimulatedNotificationCenter::removeObserver(const void* observer, std::string_view name) {
    const RecordedCall call(recorder_, kCenter, "removeObserver", name);
    const auto found = std::find_if(
        observations_.begin(), observations_.end(),
        [&](const auto& each) { return each->address == observer && each->name == name; });
    if (found == observations_.end()) {
        throw SimulationFailure("nobody observes " + std::string(name) + " with that observer");
    }
    (*found)->removed = true;
    observations_.erase(found);
}

void SimulatedNotificationCenter::post(std::string_view name) {
    for (const std::shared_ptr<Observation>& observation : observations_) {
        if (observation->name != name) continue;
        recorder_.scheduler().spawn("notification", [this, observation] { deliver(*observation); });
    }
}

void SimulatedNotificationCenter::deliver(const Observation& observation) {
    const RecordedCall call(recorder_, "NotificationCenterObserver", "callback", observation.name);
    const std::shared_ptr<void> observer = observation.observer.lock();
    if (observation.removed) return;
    observation.callback(observer.get());
}

std::size_t SimulatedNotificationCenter::observers(std::string_view name) const {
    return static_cast<std::size_t>(
        std::count_if(observations_.begin(), observations_.end(),
                      [name](const auto& each) { return each->name == name; }));
}

}  // namespace appsync
