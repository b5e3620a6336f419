#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Notifications.h"
#include "simulation/recording/Recorder.h"

namespace appsync {

/// Named notifications in memory. Setting the state of a token that was never given out is a
/// SimulationFailure.
class SimulatedNamedNotifications : public NamedNotifications {
  public:
    explicit SimulatedNamedNotifications(Recorder& recorder) : recorder_(recorder) {}

    Registration registerForState(std::string_view name) override;
    void setState(int token, std::uint64_t state) override;
    void post(std::string_view name) override;

    // The test's side; not recorded.
    /// The status of every later registration; with another than 0 none is made.
    void setRegistrationStatus(std::uint32_t status) { status_ = status; }
    /// The state of a name; 0 at first.
    [[nodiscard]] std::uint64_t state(const std::string& name) const;
    /// "name=state" of each post, in order.
    [[nodiscard]] const std::vector<std::string>& posts() const { return posts_; }

  private:
    Recorder& recorder_;
    std::uint32_t status_ = 0;
    int lastToken_ = 0;
    std::map<int, std::string> tokens_;
    std::map<std::string, std::uint64_t, std::less<>> states_;
    std::vector<std::string> posts_;
};

/// The notification centre in memory. Observers are called by tasks named "notification".
class SimulatedNotificationCenter : public NotificationCenter {
  public:
    explicit SimulatedNotificationCenter(Recorder& recorder) : recorder_(recorder) {}

    void addObserver(std::weak_ptr<void> observer, std::string_view name, Callback callback,
                     SuspensionBehavior behavior) override;
    void removeObserver(const void* observer, std::string_view name) override;

    // The test's side; not recorded.
    /// Somebody posts: everyone who observes the name will be called.
    void post(std::string_view name) override;
    [[nodiscard]] std::size_t observers(std::string_view name) const;

  private:
    struct Observation {
        std::weak_ptr<void> observer;
        const void* address = nullptr;
        std::string name;
        Callback callback = nullptr;
        bool removed = false;
    };

    void deliver(const Observation& observation);

    Recorder& recorder_;
    std::vector<std::shared_ptr<Observation>> observations_;
};

}  // namespace appsync
