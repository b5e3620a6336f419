#include "host/console/LiveLine.h"

#include <ostream>
#include <system_error>

#include "host/console/Console.h"
#include "host/console/Text.h"

namespace appsync {
namespace {

constexpr std::chrono::milliseconds kBetweenTexts{50};
constexpr std::chrono::milliseconds kBetweenTimes{250};

}  // namespace

std::string workWithin(const std::string& text, std::size_t width) {
    const std::size_t comma = text.find(", ");
    if (comma == std::string::npos || displayWidth(text) <= width) return text;
    std::string count = text.substr(comma + 2);
    std::string shorter = text.substr(0, text.find_first_of(" ,")) + " " + count;
    return displayWidth(shorter) <= width ? shorter : count;
}

LiveLine::LiveLine(const Console& console) : console_(console), isOver_(!console.isTerminal) {}

void LiveLine::say(std::string_view what) {
    const std::lock_guard guard(mutex_);
    if (isOver_) return;
    what_ = what;
    if (Clock::now() - drawn_ >= kBetweenTexts) draw();
    if (thread_.joinable()) return;
    try {
        thread_ = std::thread([this] { drawOn(); });
    } catch (const std::system_error&) {
        // It is drawn where there is something new only.
    }
}

void LiveLine::say(std::string_view what, std::size_t done, std::size_t count) {
    say(std::string(what) + ", " + std::to_string(done) + " of " + std::to_string(count));
}

void LiveLine::clear() {
    {
        const std::lock_guard guard(mutex_);
        if (!isOver_ && isDrawn_) console_.out << "\r\x1b[K" << std::flush;
        isOver_ = true;
    }
    over_.notify_all();
    if (thread_.joinable()) thread_.join();
}

void LiveLine::drawOn() {
    std::unique_lock lock(mutex_);
    while (!over_.wait_for(lock, kBetweenTimes, [this] { return isOver_; })) draw();
}

void LiveLine::draw() {
    if (!console_.takesMore()) return;
    drawn_ = Clock::now();
    isDrawn_ = true;
    const auto time = std::chrono::duration_cast<std::chrono::seconds>(drawn_ - begin_);
    // Some terminals go on to the next line once the last column is filled.
    const std::size_t width = console_.currentWidth();
    const std::size_t room = width > 0 ? width - 1 : 0;
    const std::string what = printable(what_);
    const std::string text = what + "  " + formatDuration(time);
    console_.out << '\r'
                 << fitted(displayWidth(text) > room ? workWithin(what, room) : text, room,
                           console_.cutMark)
                 << std::flush;
}

}  // namespace appsync
