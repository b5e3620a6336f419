#include "host/serve/ServedDevice.h"

#include <sys/stat.h>

#include <algorithm>
#include <utility>

#include "device/Device.h"
#include "host/serve/ChangeBell.h"
#include "system/ActingAccount.h"

namespace appsync {

namespace {

constexpr std::chrono::milliseconds kStampInterval{250};
// The log of a session grows all the time, and who is told of it asks for hundreds of lines.
constexpr std::chrono::milliseconds kLogIntervalOfSession{1000};
// Longer than any reading of a device that is not in somebody's way.
constexpr std::chrono::seconds kLongestAnswering{3};
constexpr int kShareOfTime = 60;
constexpr std::chrono::seconds kLongestPause{3};
constexpr std::chrono::seconds kLongestSeldom{15};
// A session that has just begun has said nothing yet, and an answer is of the one before it.
constexpr std::chrono::seconds kBeginOfSession{3};
// A session that is killed changes no file, and what stands in the way of a reading may go unseen.
constexpr std::chrono::seconds kLongestTrust{2};
constexpr std::size_t kMostIconBytes = std::size_t{64} << 20U;

// Devices of several owners may stand in one folder.
void actAsItsOwner(const std::string& device) {
    struct stat status = {};
    if (::stat(device.c_str(), &status) == 0) actOnThisThreadAs(status.st_uid, status.st_gid);
}

HttpAnswer pictureAnswer(const Bytes& png) {
    constexpr int kWeek = 7 * 24 * 3600;
    if (png.empty()) return {.status = 204, .type = "image/png"};
    return {.type = "image/png", .body = std::string(png.begin(), png.end()), .keptSeconds = kWeek};
}

}  // namespace

struct ServedDevice::Asked {
    Question question;
    std::optional<HttpAnswer> answer = {};  // protected by the device's mutex
    bool isAbandoned = false;               // likewise
};

ServedDevice::Watching::Watching(ServedDevice& device) : device_(device) {
    const std::lock_guard lock(device_.mutex_);
    device_.wake();
    ++device_.watchers_;
}

ServedDevice::Watching::~Watching() {
    const std::lock_guard lock(device_.mutex_);
    --device_.watchers_;
}

ServedDevice::ServedDevice(std::string path, std::string name, std::string key, ChangeBell& bell)
    : path_(std::move(path)), name_(std::move(name)), bell_(bell), viewer_(std::move(key)) {}

ServedDevice::~ServedDevice() {
    {
        const std::lock_guard lock(mutex_);
        isOver_ = true;
        changed_.notify_all();
    }
    if (thread_.joinable()) thread_.join();
}

// Under mutex_.
void ServedDevice::wake() {
    if (!thread_.joinable()) thread_ = std::thread([this] { run(); });
    changed_.notify_all();
}

std::uint64_t ServedDevice::ask() {
    const std::lock_guard lock(mutex_);
    wake();
    return ++tickets_;
}

std::shared_ptr<const DeviceView> ServedDevice::view(std::uint64_t ticket,
                                                     std::chrono::milliseconds longest) {
    std::unique_lock lock(mutex_);
    const bool isThere =
        changed_.wait_for(lock, longest, [&] { return isOver_ || served_ >= ticket; });
    if (isThere && view_) return view_;
    wasShownLocked_ = true;
    return lockedView(view_.get());
}

std::shared_ptr<const DeviceView> ServedDevice::lastView() const {
    const std::lock_guard lock(mutex_);
    return view_;
}

HttpAnswer ServedDevice::answer(Question question) {
    const auto asked = std::make_shared<Asked>(Asked{std::move(question)});
    std::unique_lock lock(mutex_);
    questions_.push_back(asked);
    wake();
    changed_.wait_for(lock, kLongestAnswering,
                      [&] { return isOver_ || asked->answer.has_value(); });
    if (asked->answer) return *std::move(asked->answer);
    asked->isAbandoned = true;
    return refusal(503, "the device cannot be read at the moment: try again");
}

HttpAnswer ServedDevice::answerSeldom(Question question) {
    if (std::optional<HttpAnswer> kept = seldomAnswer()) return *std::move(kept);
    return answer([this, question = std::move(question)](Device& device) {
        // Of those who ask at once the first has it made for all.
        if (std::optional<HttpAnswer> kept = seldomAnswer()) return *std::move(kept);
        const ReadingClock::time_point begin = ReadingClock::now();
        HttpAnswer made = question(device);
        keepSeldom(made, ReadingClock::now() - begin);
        return made;
    });
}

std::optional<HttpAnswer> ServedDevice::seldomAnswer() const {
    const std::lock_guard lock(mutex_);
    if (ReadingClock::now() < seldomUntil_) return seldomAnswer_;
    return std::nullopt;
}

void ServedDevice::keepSeldom(const HttpAnswer& answer, ReadingClock::duration cost) {
    const std::lock_guard lock(mutex_);
    seldomAnswer_ = answer;
    const ReadingClock::time_point now = ReadingClock::now();
    const bool goesOn = session_.isUnderWay && now - cost - underWaySince_ >= kBeginOfSession;
    const ReadingClock::duration share = goesOn ? cost * kShareOfTime : cost * 0;
    seldomUntil_ = now + std::min<ReadingClock::duration>(share, kLongestSeldom);
}

// What was made while the session went on is not what there is to show of it once it is seen to be
// over.
void ServedDevice::forgetSeldom() {
    const std::lock_guard lock(mutex_);
    seldomAnswer_.reset();
}

HttpAnswer ServedDevice::icon(const std::string& identifier) {
    std::shared_ptr<const DeviceView> shown = lastView();
    if (!shown) shown = view(ask(), kLongestAnswering);
    const auto found = shown->applications->icons.find(identifier);
    if (found == shown->applications->icons.end()) return pictureAnswer({});
    const ApplicationRecord record = found->second;
    {
        const std::lock_guard lock(mutex_);
        const auto kept = icons_.find(record.bundle);
        if (kept != icons_.end()) return pictureAnswer(kept->second);
    }
    return answer([this, record](Device& device) { return drawIcon(device, record); });
}

HttpAnswer ServedDevice::drawIcon(Device& device, const ApplicationRecord& record) {
    Bytes png = device.homeScreenIcon(record);
    HttpAnswer answer = pictureAnswer(png);
    const std::lock_guard lock(mutex_);
    if (iconBytes_ + png.size() > kMostIconBytes) {
        icons_.clear();
        iconBytes_ = 0;
    }
    iconBytes_ += png.size();
    icons_.insert_or_assign(record.bundle, std::move(png));
    return answer;
}

void ServedDevice::run() {
    std::unique_lock lock(mutex_);
    for (;;) {
        waitForWork(lock);
        if (isOver_) return;
        std::deque<std::shared_ptr<Asked>> questions = std::exchange(questions_, {});
        std::erase_if(questions, [](const auto& each) { return each->isAbandoned; });
        const std::uint64_t ticket = tickets_;
        lock.unlock();
        work(questions);
        lock.lock();
        served_ = ticket;
        nextLook_ = ReadingClock::now() + kStampInterval;
        changed_.notify_all();
    }
}

bool ServedDevice::hasToWork() const {
    return isOver_ || !questions_.empty() || tickets_ > served_;
}

void ServedDevice::waitForWork(std::unique_lock<std::mutex>& lock) {
    while (!hasToWork()) {
        if (watchers_ == 0) {
            changed_.wait(lock);
        } else if (changed_.wait_until(lock, nextLook_) == std::cv_status::timeout) {
            return;
        }
    }
}

void ServedDevice::work(const std::deque<std::shared_ptr<Asked>>& questions) {
    actAsItsOwner(path_);
    const DeviceStamp stamp = deviceStampOf(path_);
    const bool reads = hasToRead(stamp);
    if (reads || !questions.empty()) {
        const ReadingClock::time_point begin = ReadingClock::now();
        Result<std::unique_ptr<Device>> device = Device::open(path_);
        if (reads) read(device, stamp, begin);
        answerAll(questions, device);
    }
    if (!reads && tellsOfLog(stamp)) publish(viewer_.showLogChanged());
    takeBackLocked();
}

// Whether the log has grown, and it is time to say so.
bool ServedDevice::tellsOfLog(const DeviceStamp& stamp) {
    if (stamp.log == toldLog_) return false;
    const ReadingClock::duration interval =
        session_.isUnderWay ? kLogIntervalOfSession : kStampInterval;
    const ReadingClock::time_point now = ReadingClock::now();
    if (now - lastLogChange_ < interval) return false;
    toldLog_ = stamp.log;
    lastLogChange_ = now;
    return true;
}

bool ServedDevice::hasToRead(const DeviceStamp& stamp) const {
    if (!stamp_) return true;
    const ReadingClock::duration age = ReadingClock::now() - lastReading_;
    if (age < pause_) return false;
    if ((session_.isUnderWay || hasFailed_) && age >= kLongestTrust) return true;
    return !stamp.holdsSameAs(*stamp_);
}

void ServedDevice::read(Result<std::unique_ptr<Device>>& device, const DeviceStamp& stamp,
                        ReadingClock::time_point begin) {
    const Result<DeviceReading> reading =
        device ? readDevice(**device) : Result<DeviceReading>(device.error());
    if (!stamp_) toldLog_ = stamp.log;  // what has grown nobody has seen
    stamp_ = stamp;
    hasFailed_ = !reading;
    see(reading ? reading->moment.session : SessionRecord());
    std::shared_ptr<const DeviceView> view = viewer_.show(reading, stamp.log.size > 0);
    if (tellsOfLog(stamp)) view = viewer_.showLogChanged();
    publish(std::move(view));
    lastReading_ = ReadingClock::now();
    const ReadingClock::duration pause = (lastReading_ - begin) * kShareOfTime;
    pause_ = session_.isUnderWay ? std::min<ReadingClock::duration>(pause, kLongestPause)
                                 : ReadingClock::duration{};
}

// One that ends and another that begins may lie between two readings.
void ServedDevice::see(const SessionRecord& session) {
    const bool isTheSame = session.isUnderWay && session_.isUnderWay &&
                           session.process == session_.process && session.since == session_.since;
    session_ = session;
    if (isTheSame) return;
    underWaySince_ = ReadingClock::now();
    forgetSeldom();
}

void ServedDevice::publish(std::shared_ptr<const DeviceView> view) {
    {
        const std::lock_guard lock(mutex_);
        if (view == view_) return;
        view_ = std::move(view);
    }
    bell_.ring();
}

void ServedDevice::takeBackLocked() {
    {
        const std::lock_guard lock(mutex_);
        if (!std::exchange(wasShownLocked_, false)) return;
    }
    publish(viewer_.showStateAgain());
}

void ServedDevice::answerAll(const std::deque<std::shared_ptr<Asked>>& questions,
                             Result<std::unique_ptr<Device>>& device) {
    for (const std::shared_ptr<Asked>& each : questions) {
        HttpAnswer answer =
            device ? each->question(**device) : refusal(503, device.error().description());
        const std::lock_guard lock(mutex_);
        each->answer = std::move(answer);
        changed_.notify_all();
    }
}

}  // namespace appsync
