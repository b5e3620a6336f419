#include "host/timeline/TimelinePage.h"

#include <array>
#include <vector>

#include "host/timeline/TimelineDrawing.h"
#include "host/timeline/TimelineSvg.h"

namespace appsync {
namespace {

constexpr std::size_t kCellCharacters = 300;

constexpr const char* kPageHead =
    R"(<meta charset="utf-8">
<meta http-equiv="Content-Security-Policy" content="default-src 'none'; style-src 'unsafe-inline'">
<meta name="viewport" content="width=device-width, initial-scale=1">
<meta name="color-scheme" content="light dark">
<style>
body { font: 14px/1.45 "DejaVu Sans", Verdana, sans-serif; margin: 16px; color: #1a1a1a; background: #fff; }
.picture { overflow-x: auto; }
.picture svg { min-width: 760px; max-width: 100%; height: auto; }
h2 { font-size: 16px; margin: 24px 0 8px; }
.table { overflow-x: auto; }
table { border-collapse: collapse; }
th, td { padding: 3px 12px 3px 0; text-align: left; vertical-align: top; border-bottom: 1px solid #d9dce1; }
td.number { text-align: right; white-space: nowrap; }
td.failed { color: #b33c00; font-weight: bold; }
@media (prefers-color-scheme: dark) {
  body { color: #ececec; background: #16181c; }
  th, td { border-color: #3a3f48; }
  td.failed { color: #ff9b5c; }
}
</style>
)";

std::string textCell(const std::string& text) {
    return "<td><bdi>" + escapedMarkup(shortened(text, kCellCharacters)) + "</bdi></td>";
}

std::string numberCell(const std::string& text) {
    return "<td class=\"number\">" + escapedMarkup(text) + "</td>";
}

std::string outcomeCell(const TimelineLane& lane) {
    return std::string(needsAttention(lane) ? "<td class=\"failed\">" : "<td>") + "<bdi>" +
           escapedMarkup(shortened(outcomeText(lane), kCellCharacters)) + "</bdi></td>";
}

std::string tableOf(const char* heading, const std::vector<const char*>& columns,
                    const std::string& rows) {
    std::string table = std::string("<h2>") + heading +
                        "</h2>\n<div class=\"table\" role=\"region\" tabindex=\"0\" aria-label=\"" +
                        heading + "\"><table>\n<thead><tr>";
    for (const char* column : columns)
        table += std::string("<th scope=\"col\">") + column + "</th>";
    return table + "</tr></thead>\n<tbody>\n" + rows + "</tbody>\n</table></div>\n";
}

/// How long the lane was in spans of each kind.
std::array<TimelineMoment, kSpanKinds> timesOf(const TimelineLane& lane) {
    std::array<TimelineMoment, kSpanKinds> times{};
    for (const TimelineSpan& span : lane.spans) {
        TimelineMoment& time = times.at(static_cast<std::size_t>(span.kind));
        time = together(time, span.length());
    }
    return times;
}

std::string applicationsTable(const Timeline& timeline) {
    std::array<bool, kSpanKinds> isThere{};
    for (const TimelineLane& lane : timeline.lanes) {
        for (const TimelineSpan& span : lane.spans) {
            isThere.at(static_cast<std::size_t>(span.kind)) = true;
        }
    }
    std::vector<const char*> columns = {"application", "name",         "version",
                                        "outcome",     "asked for at", "took"};
    for (std::size_t kind = 0; kind < kSpanKinds; ++kind) {
        if (isThere.at(kind)) columns.push_back(nameOfSpan(static_cast<SpanKind>(kind)));
    }
    std::string rows;
    for (const TimelineLane& lane : timeline.lanes) {
        rows += "<tr>" + textCell(lane.identifier) + textCell(lane.name) + textCell(lane.version) +
                outcomeCell(lane) + numberCell(durationText(lane.asked)) +
                numberCell(durationText(lane.length()));
        const std::array<TimelineMoment, kSpanKinds> times = timesOf(lane);
        for (std::size_t kind = 0; kind < kSpanKinds; ++kind) {
            if (!isThere.at(kind)) continue;
            rows += numberCell(times.at(kind).count() == 0 ? "" : durationText(times.at(kind)));
        }
        rows += "</tr>\n";
    }
    return tableOf("Applications", columns, rows);
}

std::string phasesTable(const Timeline& timeline) {
    std::string rows;
    for (const TimelinePhase& phase : timeline.phases) {
        rows += "<tr>" + textCell(phase.name) + numberCell(durationText(phase.begin)) +
                numberCell(durationText(phase.end - phase.begin)) + "</tr>\n";
    }
    return tableOf("Phases of the session", {"phase", "began at", "took"}, rows);
}

std::string waitsTable(const Timeline& timeline) {
    std::string rows;
    for (const WaitSum& sum : sumsOfWaits(timeline)) {
        rows += "<tr>" + textCell("for " + sum.what) + numberCell(std::to_string(sum.count)) +
                numberCell(durationText(sum.total)) + numberCell(durationText(sum.longest)) +
                textCell(sum.who.empty() ? "the session" : sum.who) + "</tr>\n";
    }
    return tableOf("What waited for what", {"wait", "times", "in all", "longest", "who"}, rows);
}

}  // namespace

std::string timelinePage(const Timeline& timeline) {
    std::string page = "<!DOCTYPE html>\n<html lang=\"en\">\n<head>\n" + std::string(kPageHead) +
                       "<title>" + escapedMarkup(shortened(headingOf(timeline), kCellCharacters)) +
                       "</title>\n</head>\n<body>\n<div class=\"picture\">\n" +
                       timelineSvg(timeline) + "</div>\n";
    if (!timeline.lanes.empty()) page += applicationsTable(timeline);
    if (!timeline.phases.empty()) page += phasesTable(timeline);
    if (!timeline.waits.empty()) page += waitsTable(timeline);
    return page + "</body>\n</html>\n";
}

}  // namespace appsync
