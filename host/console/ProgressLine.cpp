#include "host/console/ProgressLine.h"

#include <ostream>
#include <utility>

#include "host/console/Console.h"
#include "host/console/Text.h"

namespace appsync {
namespace {

constexpr std::chrono::milliseconds kBeforeTheLine{250};
constexpr std::chrono::milliseconds kBetweenLines{100};

}  // namespace

ProgressLine::ProgressLine(const Console& console, std::function<Clock::time_point()> now)
    : console_(console), now_(std::move(now)), due_(now_() + kBeforeTheLine) {}

void ProgressLine::show(const std::function<std::string()>& text) {
    if (!console_.isTerminal) return;
    const Clock::time_point time = now_();
    if (time < due_) return;
    due_ = time + kBetweenLines;
    // Some terminals go on to the next line once the last column is filled.
    const std::size_t width = console_.width > 0 ? console_.width - 1 : 0;
    console_.out << '\r' << fitted(printable(text()), width, console_.cutMark) << std::flush;
    isDrawn_ = true;
}

void ProgressLine::clear() {
    if (!isDrawn_) return;
    console_.out << "\r\x1b[K" << std::flush;
    isDrawn_ = false;
}

}  // namespace appsync
