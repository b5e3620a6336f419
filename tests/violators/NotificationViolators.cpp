#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "contract/forwarding/ForwardingSystemServices.h"
#include "tests/violators/Violator.h"

namespace appsync {
namespace {

struct EveryRegistrationFails : ForwardingNamedNotifications {
    using ForwardingNamedNotifications::ForwardingNamedNotifications;
    Registration registerForState(std::string_view) override { return {1, 0}; }
};
struct StatesAreNotKept : ForwardingNamedNotifications {
    using ForwardingNamedNotifications::ForwardingNamedNotifications;
    void setState(int, std::uint64_t) override {}
};
struct OneTokenForAllNames : ForwardingNamedNotifications {
    using ForwardingNamedNotifications::ForwardingNamedNotifications;
    Registration registerForState(std::string_view name) override {
        if (!first) first = target().registerForState(name);
        return *first;
    }
    std::optional<Registration> first;
};
/// Only the first registration of a name sets its state.
struct LaterRegistrationsSetNothing : ForwardingNamedNotifications {
    using ForwardingNamedNotifications::ForwardingNamedNotifications;
    Registration registerForState(std::string_view name) override {
        const Registration registration = target().registerForState(name);
        names.emplace(std::string(name), registration.token);
        ofToken[registration.token] = name;
        return registration;
    }
    void setState(int token, std::uint64_t state) override {
        if (names.at(ofToken.at(token)) == token) target().setState(token, state);
    }
    std::map<std::string, int> names;
    std::map<int, std::string> ofToken;
};
struct StatesOfThirtyTwoBits : ForwardingNamedNotifications {
    using ForwardingNamedNotifications::ForwardingNamedNotifications;
    void setState(int token, std::uint64_t state) override {
        target().setState(token, static_cast<std::uint32_t>(state));
    }
};

struct EveryNameIsOne : ForwardingNotificationCenter {
    using ForwardingNotificationCenter::ForwardingNotificationCenter;
    void addObserver(std::weak_ptr<void> observer, std::string_view name, Callback callback,
                     SuspensionBehavior behavior) override {
        target().addObserver(observer, name, callback, behavior);
        target().addObserver(std::move(observer), "com.example.other", callback, behavior);
    }
};
struct OnlyTheFirstObserverHears : ForwardingNotificationCenter {
    using ForwardingNotificationCenter::ForwardingNotificationCenter;
    void addObserver(std::weak_ptr<void> observer, std::string_view name, Callback callback,
                     SuspensionBehavior behavior) override {
        if (count++ == 0) target().addObserver(std::move(observer), name, callback, behavior);
    }
    int count = 0;
};
struct ObserversHearTwice : ForwardingNotificationCenter {
    using ForwardingNotificationCenter::ForwardingNotificationCenter;
    void addObserver(std::weak_ptr<void> observer, std::string_view name, Callback callback,
                     SuspensionBehavior behavior) override {
        target().addObserver(observer, name, callback, behavior);
        target().addObserver(std::move(observer), name, callback, behavior);
    }
};
struct RemovedObserversHear : ForwardingNotificationCenter {
    using ForwardingNotificationCenter::ForwardingNotificationCenter;
    void removeObserver(const void*, std::string_view) override {}
};
struct ObserversAreKeptAlive : ForwardingNotificationCenter {
    using ForwardingNotificationCenter::ForwardingNotificationCenter;
    void addObserver(std::weak_ptr<void> observer, std::string_view name, Callback callback,
                     SuspensionBehavior behavior) override {
        kept.push_back(observer.lock());
        target().addObserver(std::move(observer), name, callback, behavior);
    }
    std::vector<std::shared_ptr<void>> kept;
};
struct ObserversThatHaveGoneAreForgotten : ForwardingNotificationCenter {
    using ForwardingNotificationCenter::ForwardingNotificationCenter;
    struct Subscription {
        std::weak_ptr<void> observer;
        Callback callback;
    };
    static void call(void* subscription) {
        if (subscription == nullptr) return;
        const auto* to = static_cast<const Subscription*>(subscription);
        if (const auto observer = to->observer.lock()) to->callback(observer.get());
    }
    void addObserver(std::weak_ptr<void> observer, std::string_view name, Callback callback,
                     SuspensionBehavior behavior) override {
        const void* address = observer.lock().get();
        auto subscription = std::make_shared<Subscription>(Subscription{observer, callback});
        target().addObserver(subscription, name, call, behavior);
        subscriptions[address] = std::move(subscription);
    }
    void removeObserver(const void* observer, std::string_view name) override {
        target().removeObserver(subscriptions[observer].get(), name);
    }
    std::map<const void*, std::shared_ptr<Subscription>> subscriptions;
};
struct EveryObserverIsNull : ForwardingNotificationCenter {
    using ForwardingNotificationCenter::ForwardingNotificationCenter;
    void addObserver(std::weak_ptr<void>, std::string_view name, Callback callback,
                     SuspensionBehavior behavior) override {
        target().addObserver({}, name, callback, behavior);
    }
};
struct RemovingEndsEveryName : ForwardingNotificationCenter {
    using ForwardingNotificationCenter::ForwardingNotificationCenter;
    void addObserver(std::weak_ptr<void> observer, std::string_view name, Callback callback,
                     SuspensionBehavior behavior) override {
        names.emplace_back(name);
        target().addObserver(std::move(observer), name, callback, behavior);
    }
    void removeObserver(const void* observer, std::string_view) override {
        for (const std::string& name : names) target().removeObserver(observer, name);
    }
    std::vector<std::string> names;
};
struct PostingReachesNobody : ForwardingNotificationCenter {
    using ForwardingNotificationCenter::ForwardingNotificationCenter;
    void post(std::string_view) override {}
};

}  // namespace

std::vector<Violator> notificationViolators() {
    Violators v("platform/Notifications.h", "*Notification*");
    v.system<EveryRegistrationFails>("EveryRegistrationFails",
                                     "0 when the registration succeeded.");
    const std::string state = "System-wide named notifications that carry a 64-bit state.";
    v.system<StatesAreNotKept>("StatesAreNotKept", "Every process sees it from now on.");
    v.system<StatesOfThirtyTwoBits>("StatesOfThirtyTwoBits", state);
    v.system<OneTokenForAllNames>("OneTokenForAllNames",
                                  "Registers for a state token of the name.");
    v.system<LaterRegistrationsSetNothing>("LaterRegistrationsSetNothing",
                                           "All tokens of a name stand for one state.");
    const std::string now =
        "From now on `callback` is called when a notification of the name is posted by anyone.";
    v.system<EveryNameIsOne>("EveryNameIsOne", now);
    v.system<OnlyTheFirstObserverHears>("OnlyTheFirstObserverHears", now);
    v.system<ObserversHearTwice>("ObserversHearTwice", now);
    v.system<RemovedObserversHear>("RemovedObserversHear", "Ends that.");
    v.system<RemovingEndsEveryName>("RemovingEndsEveryName", "Ends that.");
    const std::string alive =
        "Called, on any thread, with the observer, which is kept alive meanwhile; with null when "
        "the observer has gone.";
    v.system<ObserversAreKeptAlive>("ObserversAreKeptAlive", alive);
    v.system<ObserversThatHaveGoneAreForgotten>("ObserversThatHaveGoneAreForgotten", alive);
    v.system<EveryObserverIsNull>("EveryObserverIsNull", alive);
    v.system<PostingReachesNobody>("PostingReachesNobody", "Calls every observer of the name.");
    return v.take();
}

}  // namespace appsync
