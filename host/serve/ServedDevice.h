#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>

#include "device/values/DeviceRecords.h"
#include "host/serve/DeviceStamp.h"
#include "host/serve/DeviceView.h"
#include "host/serve/http/HttpServer.h"
#include "platform/Bytes.h"

namespace appsync {

class ChangeBell;
class Device;

/// A device that is shown to as many as want to see it: one thread looks at it for all of them.
///
/// While somebody watches, it compares stamps four times a second, and reads the device only where
/// they tell of a change; while a session is under way, so seldom that the reading takes a sixtieth
/// of the time, and it tells once a second at most that the log has grown. It opens the device for
/// each reading and closes it again, so that a device may be locked, damaged, removed and replaced
/// as if nobody looked.
class ServedDevice {
  public:
    /// `key` stands for it in an address. The bell outlives it.
    ServedDevice(std::string path, std::string name, std::string key, ChangeBell& bell);
    ~ServedDevice();
    ServedDevice(const ServedDevice&) = delete;
    ServedDevice& operator=(const ServedDevice&) = delete;

    [[nodiscard]] const std::string& path() const noexcept { return path_; }
    [[nodiscard]] const std::string& name() const noexcept { return name_; }

    /// Asks for a view that is of now; the ticket is for `view`.
    std::uint64_t ask();
    /// Waits until that view is there; where it does not come in that time, the device is shown as
    /// locked.
    [[nodiscard]] std::shared_ptr<const DeviceView> view(std::uint64_t ticket,
                                                         std::chrono::milliseconds longest);
    /// The last one; nothing before the first.
    [[nodiscard]] std::shared_ptr<const DeviceView> lastView() const;

    /// What is to be asked of the device itself, and how the error of opening it is answered.
    using Question = std::function<HttpAnswer(Device& device)>;
    [[nodiscard]] HttpAnswer answer(Question question);
    /// The same of the one question that takes long and is asked again and again: while a session
    /// is under way the last answer stands until asking anew takes at most a sixtieth of the time,
    /// or for fifteen seconds; not in the first three of a session.
    [[nodiscard]] HttpAnswer answerSeldom(Question question);

    /// The icon as it is shown for an identifier; 204 where there is none.
    [[nodiscard]] HttpAnswer icon(const std::string& identifier);

    /// Changes are looked for while one of these lives, which the device outlives.
    class Watching {
      public:
        explicit Watching(ServedDevice& device);
        Watching(const Watching&) = delete;
        Watching& operator=(const Watching&) = delete;
        ~Watching();

      private:
        ServedDevice& device_;
    };

  private:
    using ReadingClock = std::chrono::steady_clock;
    struct Asked;

    void wake();
    void run();
    [[nodiscard]] bool hasToWork() const;
    void waitForWork(std::unique_lock<std::mutex>& lock);
    void work(const std::deque<std::shared_ptr<Asked>>& questions);
    [[nodiscard]] bool hasToRead(const DeviceStamp& stamp) const;
    [[nodiscard]] bool tellsOfLog(const DeviceStamp& stamp);
    void read(Result<std::unique_ptr<Device>>& device, const DeviceStamp& stamp,
              ReadingClock::time_point begin);
    void see(const SessionRecord& session);
    void publish(std::shared_ptr<const DeviceView> view);
    void takeBackLocked();
    void answerAll(const std::deque<std::shared_ptr<Asked>>& questions,
                   Result<std::unique_ptr<Device>>& device);
    [[nodiscard]] std::optional<HttpAnswer> seldomAnswer() const;
    void forgetSeldom();
    void keepSeldom(const HttpAnswer& answer, ReadingClock::duration cost);
    [[nodiscard]] HttpAnswer drawIcon(Device& device, const ApplicationRecord& record);

    const std::string path_;
    const std::string name_;
    ChangeBell& bell_;

    mutable std::mutex mutex_;
    mutable std::condition_variable changed_;
    // Protected by mutex_.
    std::shared_ptr<const DeviceView> view_;
    std::deque<std::shared_ptr<Asked>> questions_;
    std::uint64_t tickets_ = 0;
    std::uint64_t served_ = 0;     // the last ticket whose view is there
    bool wasShownLocked_ = false;  // because a view did not come in time
    int watchers_ = 0;
    bool isOver_ = false;
    ReadingClock::time_point nextLook_;
    std::map<std::string, Bytes> icons_;  // by bundle
    std::size_t iconBytes_ = 0;
    std::optional<HttpAnswer> seldomAnswer_;
    ReadingClock::time_point seldomUntil_;
    std::thread thread_;  // from the first time that somebody wants something

    // The thread's own.
    DeviceViewer viewer_;
    std::optional<DeviceStamp> stamp_;  // of the last reading
    SessionRecord session_;             // as it was read last
    ReadingClock::time_point underWaySince_;
    bool hasFailed_ = false;
    ReadingClock::time_point lastReading_;
    ServedFileStamp toldLog_;                 // of which was told
    ReadingClock::time_point lastLogChange_;  // that was told
    ReadingClock::duration pause_{};          // until the next one
};

}  // namespace appsync
