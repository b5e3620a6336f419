#include "host/serve/ChangeEvents.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <utility>

#include <nlohmann/json.hpp>

#include "host/console/JsonWriting.h"
#include "host/serve/ChangeBell.h"
#include "host/serve/DeviceView.h"
#include "host/serve/ServedDevice.h"
#include "host/serve/ServedDevices.h"

namespace appsync {
namespace {

using EventClock = std::chrono::steady_clock;

constexpr std::chrono::seconds kHeartbeat{10};
constexpr std::chrono::milliseconds kFolderGlance{1000};
// Each makes a page ask for what is new.
constexpr std::chrono::milliseconds kBetweenEvents{250};

std::string eventText(const nlohmann::ordered_json& data) {
    return "event: device\ndata: " + dumped(data) + "\n\n";
}

// One device as a reader of events knows it.
class KnownDevice {
  public:
    explicit KnownDevice(std::shared_ptr<ServedDevice> device)
        : device_(std::move(device)), watching_(*device_) {
        device_->ask();
    }

    // What has changed since the last call; nothing where nothing has.
    std::string news() {
        const std::shared_ptr<const DeviceView> view = device_->lastView();
        if (!view || view->stamp == stamp_) return {};
        nlohmann::ordered_json changes = changesSince(*view, std::exchange(stamp_, view->stamp));
        if (changes.empty()) return {};
        return eventText(
            {{"name", device_->name()}, {"changed", std::move(changes)}, {"stamp", view->stamp}});
    }

  private:
    const std::shared_ptr<ServedDevice> device_;
    const ServedDevice::Watching watching_;
    std::uint64_t stamp_ = 0;
};

// Waits for news as the bell rings, and gives a sign of life where there are none.
class BellEvents : public EventStream {
  public:
    explicit BellEvents(const ChangeBell& bell, std::chrono::milliseconds longestWait)
        : bell_(bell), longestWait_(longestWait) {}

    [[nodiscard]] std::optional<std::string> next() final {
        bell_.waitForSilence(std::chrono::ceil<std::chrono::milliseconds>(
            lastNews_ + kBetweenEvents - EventClock::now()));
        const EventClock::time_point heartbeat = EventClock::now() + kHeartbeat;
        while (!bell_.isSilenced()) {
            const std::uint64_t rings = bell_.rings();
            std::string text = news();
            if (!text.empty()) {
                lastNews_ = EventClock::now();
                return text;
            }
            const auto left =
                std::chrono::ceil<std::chrono::milliseconds>(heartbeat - EventClock::now());
            if (left.count() <= 0) return ": nothing new\n\n";
            bell_.waitBeyond(rings, std::min(left, longestWait_));
        }
        return std::nullopt;
    }

  protected:
    [[nodiscard]] virtual std::string news() = 0;

  private:
    const ChangeBell& bell_;
    const std::chrono::milliseconds longestWait_;
    EventClock::time_point lastNews_;
};

class DeviceEvents final : public BellEvents {
  public:
    DeviceEvents(std::shared_ptr<ServedDevice> device, const ChangeBell& bell)
        : BellEvents(bell, kHeartbeat), device_(std::move(device)) {}

  private:
    std::string news() override { return device_.news(); }

    KnownDevice device_;
};

class FolderEvents final : public BellEvents {
  public:
    FolderEvents(ServedDevices& devices, const ChangeBell& bell)
        : BellEvents(bell, kFolderGlance), devices_(devices) {}

  private:
    std::string news() override {
        std::string text = newcomers();
        for (auto& [name, device] : known_) text += device.news();
        return text;
    }

    std::string newcomers() {
        bool hasNew = false;
        for (const std::shared_ptr<ServedDevice>& each : devices_.all()) {
            hasNew = known_.try_emplace(each->name(), each).second || hasNew;
        }
        const std::size_t leftOut = devices_.leftOut();
        hasNew = std::exchange(leftOut_, leftOut) != leftOut || hasNew;
        if (!hasNew) return {};
        return eventText({{"name", nullptr}, {"changed", {"devices"}}, {"stamp", nullptr}});
    }

    ServedDevices& devices_;
    std::map<std::string, KnownDevice> known_;
    std::size_t leftOut_ = 0;
};

}  // namespace

std::shared_ptr<EventStream> eventsOf(std::shared_ptr<ServedDevice> device,
                                      const ChangeBell& bell) {
    return std::make_shared<DeviceEvents>(std::move(device), bell);
}

std::shared_ptr<EventStream> eventsOf(ServedDevices& devices, const ChangeBell& bell) {
    return std::make_shared<FolderEvents>(devices, bell);
}

}  // namespace appsync
