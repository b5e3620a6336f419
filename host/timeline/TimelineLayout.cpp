#include "host/timeline/TimelineLayout.h"

#include <algorithm>
#include <array>
#include <utility>

#include "host/console/Text.h"
#include "host/timeline/TimelineGroups.h"
#include "host/timeline/TimelineScale.h"
#include "host/timeline/TimelineStacks.h"
#include "host/timeline/TimelineTitles.h"

namespace appsync {
namespace {

constexpr double kPictureWidth = 1200;
constexpr double kPictureMargin = 16;
constexpr double kPlotLeft = 240;
constexpr double kPlotWidth = 720;
constexpr double kOutcomeLeft = kPlotLeft + kPlotWidth + 20;
constexpr double kSingleHeight = 20;
constexpr double kDoneHeight = 26;  // of a group: what is done, above what waits
constexpr double kWaitingHeight = 14;
constexpr double kGroupHeight = kDoneHeight + kWaitingHeight + 8;
constexpr double kRowText = 11;
/// Few characters of the font are wider on average.
constexpr double kCharacterWidth = 0.6 * kRowText;
constexpr std::size_t kLabelCharacters = 33;
constexpr std::size_t kOutcomeCharacters = 31;
constexpr std::size_t kLineCharacters = 165;
constexpr std::size_t kHeadingCharacters = 100;
constexpr std::size_t kShownSums = 8;
constexpr std::size_t kShownLongest = 5;
constexpr double kThinnest = 1.5;
constexpr double kLetterRoom = 11;

constexpr const char* kCheckMark = "\xE2\x9C\x93";
constexpr const char* kCrossMark = "\xE2\x9C\x97";
constexpr const char* kOpenMark = "\xE2\x80\xA6";
constexpr const char* kDashMark = "\xE2\x80\x93";

/// What is done, and what waits, from below.
const std::vector<SpanKind> kDoing = {SpanKind::Install, SpanKind::Transfer, SpanKind::Placeholder,
                                      SpanKind::Removal};
const std::vector<SpanKind> kWaiting = {SpanKind::Termination, SpanKind::Store, SpanKind::Queue,
                                        SpanKind::Turn};

const char* markOf(const TimelineLane& lane) {
    if (needsAttention(lane)) return kCrossMark;
    if (isNotOver(lane)) return kOpenMark;
    return lane.outcome == LaneOutcome::Skipped ? kDashMark : kCheckMark;
}

Paint paintOf(const TimelineLane& lane) {
    if (needsAttention(lane)) return {Pen::Bad};
    const bool isDone = !isNotOver(lane) && lane.outcome != LaneOutcome::Skipped;
    return {isDone ? Pen::Good : Pen::Faint};
}

double roomOf(const std::string& text) {
    return static_cast<double>(displayWidth(text)) * kCharacterWidth;
}

std::string sentenceOfWait(const WaitSum& sum) {
    const std::string who = sum.who.empty() ? "the session" : shortened(sum.who, 60);
    std::string text = "for " + sum.what + ": ";
    if (sum.count == 1) return text + who + ", " + durationText(sum.longest);
    return text + counted(sum.count, "application") + ", " + durationText(sum.total) +
           " in all, longest " + durationText(sum.longest) + " (" + who + ")";
}

std::string sentenceOfFailure(const FailureSum& sum) {
    const std::string who = shortened(sum.lanes.front()->identifier, 60);
    const std::string whose = sum.lanes.size() == 1
                                  ? who
                                  : counted(sum.lanes.size(), "application") + " (" + who + " ...)";
    return shortened(whose + " " + sum.reason, kLineCharacters);
}

/// Puts one row below the other.
class PictureLayout {
  public:
    explicit PictureLayout(const Timeline& timeline)
        : timeline_(timeline), scale_{kPlotLeft, kPlotWidth, timeline.length} {
        drawing_.width = kPictureWidth;
    }

    TimelineDrawing draw() {
        addHead();
        if (!timeline_.lanes.empty()) addLegend();
        if (!timeline_.isEmpty()) addPlot();
        addFailures();
        if (!timeline_.waits.empty()) addWaits();
        if (!timeline_.lanes.empty()) addLongest();
        drawing_.height = y_ + kPictureMargin;
        // Below everything, of the size that is known last.
        BoxShape ground{0, 0, drawing_.width, drawing_.height, {Pen::Ground}, {}};
        drawing_.shapes.insert(drawing_.shapes.begin(), std::move(ground));
        return std::move(drawing_);
    }

  private:
    template <typename Shape>
    void add(Shape shape) {
        drawing_.shapes.emplace_back(std::move(shape));
    }
    /// A text on the row.
    void write(double x, const std::string& text, Paint paint = {Pen::Text}) {
        add(TextShape{x, y_, kRowText, text, paint, false, TextSide::Left, {}});
    }
    void writeHeading(const std::string& text) {
        y_ += 24;
        add(TextShape{kPictureMargin, y_, 13, text, {Pen::Text}, true, TextSide::Left, {}});
        y_ += 8;
    }
    void addSpanBox(BoxShape box);
    void addHead();
    void addLegend();
    void addPlot();
    void addTicks(double top, double bottom);
    void addPhases();
    void addCalls();
    void addSingle(const TimelineLane& lane, bool isStriped);
    void addSpans(const TimelineLane& lane, double top);
    void addGroup(const LaneGroup& group);
    void addStripe(double height, const std::string& title, Pen pen);
    void addFailures();
    void addWaits();
    void addLongest();

    const Timeline& timeline_;
    TimelineScale scale_;
    TimelineDrawing drawing_;
    double y_ = 0;
};

void PictureLayout::addSpanBox(BoxShape box) {
    box.width = std::max(box.width, kThinnest);
    const SpanLook& look = lookOf(box.paint.kind);
    TextShape letter{box.x + box.width / 2,
                     box.y + box.height / 2 + 4,
                     10,
                     std::string(1, look.letter),
                     {look.isDark ? Pen::OnDeep : Pen::OnPale},
                     true,
                     TextSide::Middle,
                     box.title};
    const bool hasLetter = box.width >= kLetterRoom;
    BoxShape backing{letter.x - 5, box.y, 10, box.height, box.paint, box.title};
    backing.paint.isPlain = true;
    add(std::move(box));
    if (!hasLetter) return;
    if (look.pattern != PicturePattern::Plain) add(std::move(backing));
    add(std::move(letter));
}

void PictureLayout::addHead() {
    y_ = 34;
    drawing_.title = shortened(headingOf(timeline_), kHeadingCharacters);
    drawing_.description = timeline_.isEmpty() ? "No session yet." : sumOfOutcomes(timeline_);
    add(TextShape{kPictureMargin, y_, 18, drawing_.title, {Pen::Text}, true, TextSide::Left, {}});
    y_ += 22;
    add(TextShape{
        kPictureMargin, y_, 13, drawing_.description, {Pen::Text}, false, TextSide::Left, {}});
    for (const std::string& note : timeline_.notes) {
        y_ += 18;
        const std::string text = shortened(note, kLineCharacters);
        add(TextShape{kPictureMargin, y_, 12, text, {Pen::Bad}, false, TextSide::Left, {}});
    }
    y_ += 14;
}

// What is not in the picture needs no explanation.
void PictureLayout::addLegend() {
    std::array<bool, kSpanKinds> isThere{};
    for (const TimelineLane& lane : timeline_.lanes) {
        for (const TimelineSpan& span : lane.spans) {
            isThere.at(static_cast<std::size_t>(span.kind)) = true;
        }
    }
    y_ += 14;
    double x = kPictureMargin;
    for (std::size_t i = 0; i < kSpanKinds; ++i) {
        if (!isThere.at(i)) continue;
        const auto kind = static_cast<SpanKind>(i);
        addSpanBox({x, y_ - 11, 18, 14, {Pen::Span, kind}, {}});
        write(x + 24, nameOfSpan(kind));
        x += 24 + roomOf(nameOfSpan(kind)) + 16;
    }
    add(LineShape{{x, y_ - 11}, {x, y_ + 3}, {Pen::Text}});
    write(x + 6, "asked for");
    x += 6 + roomOf("asked for") + 16;
    for (const auto& [mark, name] :
         {std::pair(kCheckMark, " done"), std::pair(kCrossMark, " failed"),
          std::pair(kOpenMark, " not over")}) {
        const std::string text = std::string(mark) + name;
        write(x, text);
        x += roomOf(text) + 16;
    }
    y_ += 8;
}

void PictureLayout::addPlot() {
    y_ += 22;
    const double top = y_;
    const std::size_t belowLanes = drawing_.shapes.size();
    addPhases();
    if (!timeline_.calls.empty()) addCalls();
    const GroupedLanes grouped = groupedLanes(timeline_);
    for (const LaneGroup& group : grouped.single) {
        if (!group.heading.empty()) writeHeading(group.heading);
        bool isStriped = true;
        for (const TimelineLane* lane : group.lanes) {
            addSingle(*lane, isStriped);
            isStriped = !isStriped;
        }
    }
    std::string heading;
    for (const LaneGroup& group : grouped.together) {
        if (group.heading != heading) writeHeading(group.heading + ", drawn together");
        heading = group.heading;
        addGroup(group);
    }
    // The grid comes below what is drawn on it.
    std::vector<PictureShape> above(
        drawing_.shapes.begin() + static_cast<std::ptrdiff_t>(belowLanes), drawing_.shapes.end());
    drawing_.shapes.resize(belowLanes);
    addTicks(top, y_ + 2);
    std::move(above.begin(), above.end(), std::back_inserter(drawing_.shapes));
}

void PictureLayout::addTicks(double top, double bottom) {
    for (const TimelineTick& tick : ticksOf(timeline_.length)) {
        const double x = scale_.at(tick.at);
        add(LineShape{{x, top - 4}, {x, bottom}, {Pen::Rule}});
        add(TextShape{x, top - 8, 10, tick.text, {Pen::Faint}, false, TextSide::Middle, {}});
    }
}

void PictureLayout::addPhases() {
    constexpr double kHeight = 18;
    for (const TimelinePhase& phase : timeline_.phases) {
        const double x = scale_.at(phase.begin);
        const double width = std::max(scale_.at(phase.end) - x - 1, kThinnest);
        const std::string title = titleOfPhase(phase);
        add(BoxShape{x, y_, width, kHeight, {Pen::Phase}, title});
        if (roomOf(phase.name) + 6 > width) continue;
        add(TextShape{
            x + 4, y_ + 13, kRowText, phase.name, {Pen::Text}, false, TextSide::Left, title});
    }
    y_ += 13;
    if (!timeline_.phases.empty()) write(kPictureMargin, "the session");
    y_ += 9;
}

// Calls that follow each other closely are one box: there may be thousands.
void PictureLayout::addCalls() {
    std::size_t first = 0;
    const std::vector<TimelinePhase>& calls = timeline_.calls;
    for (std::size_t i = 1; i <= calls.size(); ++i) {
        const bool goesOn =
            i < calls.size() && scale_.at(calls[i].begin) < scale_.at(calls[i - 1].end) + 2;
        if (goesOn) continue;
        const double x = scale_.at(calls[first].begin);
        const double width = std::max(scale_.at(calls[i - 1].end) - x, kThinnest);
        std::string title;
        for (std::size_t k = first; k < std::min(i, first + 12); ++k) {
            title += (title.empty() ? "" : "\n") + shortened(calls[k].name, 60) + ": " +
                     durationText(calls[k].end - calls[k].begin);
        }
        if (i - first > 12) title += "\n" + counted(i - first - 12, "call") + " more";
        add(BoxShape{x, y_, width, 9, {Pen::Call}, std::move(title)});
        first = i;
    }
    y_ += 9;
    write(kPictureMargin, "calls of the host");
    y_ += 9;
}

void PictureLayout::addStripe(double height, const std::string& title, Pen pen) {
    add(BoxShape{kPictureMargin / 2, y_, kPictureWidth - kPictureMargin, height, {pen}, title});
}

void PictureLayout::addSpans(const TimelineLane& lane, double top) {
    for (const TimelineSpan& span : lane.spans) {
        const double x = scale_.at(span.begin);
        addSpanBox({x,
                    top,
                    scale_.at(span.end) - x,
                    kSingleHeight - 6,
                    {Pen::Span, span.kind},
                    titleOfSpan(lane, span)});
    }
}

void PictureLayout::addSingle(const TimelineLane& lane, bool isStriped) {
    const std::string title = titleOfLane(lane);
    addStripe(kSingleHeight, title, isStriped ? Pen::Stripe : Pen::Ground);
    addSpans(lane, y_ + 3);
    const double asked = scale_.at(lane.asked);
    add(LineShape{{asked, y_ + 2}, {asked, y_ + kSingleHeight - 2}, {Pen::Text}});
    const double base = y_ + kSingleHeight - 6;
    const Paint paint = paintOf(lane);
    add(TextShape{scale_.at(lane.end) + 3, base, 12, markOf(lane), paint, true, TextSide::Left,
                  title});
    add(TextShape{kPictureMargin,
                  base,
                  kRowText,
                  shortenedAtFront(lane.identifier, kLabelCharacters),
                  {Pen::Text},
                  false,
                  TextSide::Left,
                  title});
    add(TextShape{kOutcomeLeft, base, kRowText, shortened(outcomeText(lane), kOutcomeCharacters),
                  paint, false, TextSide::Left, title});
    y_ += kSingleHeight;
}

void PictureLayout::addGroup(const LaneGroup& group) {
    const std::string title = titleOfGroup(group.lanes);
    addStripe(kGroupHeight - 2, title, Pen::Stripe);
    for (AreaShape& area :
         stackedAreas(group.lanes, kDoing, {scale_, y_ + 2 + kDoneHeight, kDoneHeight})) {
        area.title = title;
        add(std::move(area));
    }
    const double bottom = y_ + 4 + kDoneHeight + kWaitingHeight;
    for (AreaShape& area : stackedAreas(group.lanes, kWaiting, {scale_, bottom, kWaitingHeight})) {
        area.title = title;
        add(std::move(area));
    }
    const double top = y_;
    y_ = top + 14;
    write(kPictureMargin, counted(group.lanes.size(), "application"));
    write(kOutcomeLeft, shortened(outcomesOf(group.lanes), kOutcomeCharacters));
    y_ = top + 28;
    write(kPictureMargin, shortenedAtFront(group.lanes.front()->identifier, kLabelCharacters),
          {Pen::Faint});
    write(kOutcomeLeft, "on average " + durationText(meanLength(group.lanes)), {Pen::Faint});
    y_ = top + 41;
    write(kPictureMargin,
          shortenedAtFront("to " + group.lanes.back()->identifier, kLabelCharacters), {Pen::Faint});
    y_ = top + kGroupHeight;
}

void PictureLayout::addFailures() {
    const std::vector<FailureSum> sums = sumsOfFailures(timeline_);
    if (sums.empty()) return;
    writeHeading("What went wrong");
    for (std::size_t i = 0; i < std::min(sums.size(), kShownSums); ++i) {
        y_ += 16;
        write(kPictureMargin, sentenceOfFailure(sums[i]), {Pen::Bad});
    }
    y_ += 6;
}

void PictureLayout::addWaits() {
    writeHeading("What waited for what");
    const std::vector<WaitSum> sums = sumsOfWaits(timeline_);
    for (std::size_t i = 0; i < std::min(sums.size(), kShownSums); ++i) {
        y_ += 16;
        write(kPictureMargin, shortened(sentenceOfWait(sums[i]), kLineCharacters));
    }
    y_ += 6;
}

void PictureLayout::addLongest() {
    const std::vector<const TimelineLane*> longest = longestLanes(timeline_, kShownLongest);
    if (longest.empty()) return;
    writeHeading("What took longest, waits for other applications aside");
    y_ += 2;
    const TimelineScale ownScale{kPlotLeft, kPlotWidth, longest.front()->ownTime()};
    for (const TimelineLane* lane : longest) {
        TimelineMoment begin{0};
        for (const TimelineSpan& span : lane->spans) {
            if (isWaitForOthers(span.kind)) continue;
            const double x = ownScale.at(begin);
            begin = together(begin, span.length());
            addSpanBox({x,
                        y_ + 3,
                        ownScale.at(begin) - x,
                        kSingleHeight - 6,
                        {Pen::Span, span.kind},
                        titleOfSpan(*lane, span)});
        }
        const double top = y_;
        y_ = top + kSingleHeight - 6;
        write(kPictureMargin, shortenedAtFront(lane->identifier, kLabelCharacters));
        write(kOutcomeLeft, shortened(durationText(lane->ownTime()) + ", " + outcomeText(*lane),
                                      kOutcomeCharacters));
        y_ = top + kSingleHeight;
    }
}

}  // namespace

TimelineDrawing layOutTimeline(const Timeline& timeline) { return PictureLayout(timeline).draw(); }

}  // namespace appsync
