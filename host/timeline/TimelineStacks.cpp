#include "host/timeline/TimelineStacks.h"

#include <algorithm>
#include <cmath>

namespace appsync {
namespace {

constexpr double kColumnWidth = 2;

using Columns = std::vector<double>;

/// How many of the applications are in a span of that kind in each column; one that is in one for
/// a part of the column counts for that part.
Columns occupancy(const std::vector<const TimelineLane*>& lanes, SpanKind kind,
                  const TimelineScale& scale, std::size_t columns) {
    // In `steps` what holds from a column on.
    Columns parts(columns, 0);
    Columns steps(columns + 1, 0);
    const auto columnOf = [&](double x) {
        return std::min(static_cast<std::size_t>((x - scale.left) / kColumnWidth), columns - 1);
    };
    for (const TimelineLane* lane : lanes) {
        for (const TimelineSpan& span : lane->spans) {
            if (span.kind != kind) continue;
            const double begin = scale.at(span.begin);
            const double end = scale.at(span.end);
            const std::size_t first = columnOf(begin);
            const std::size_t last = columnOf(end);
            const auto edge = [&](std::size_t column) {
                return scale.left + static_cast<double>(column) * kColumnWidth;
            };
            if (first == last) {
                parts[first] += (end - begin) / kColumnWidth;
                continue;
            }
            parts[first] += (edge(first + 1) - begin) / kColumnWidth;
            parts[last] += (end - edge(last)) / kColumnWidth;
            steps[first + 1] += 1;
            steps[last] -= 1;
        }
    }
    double whole = 0;
    for (std::size_t column = 0; column < columns; ++column) {
        whole += steps[column];
        parts[column] += whole;
    }
    return parts;
}

struct StackEdges {
    Columns below;
    Columns above;
};

/// The area between the edges from one column to another, where something stands.
AreaShape areaBetween(const StackEdges& edges, std::size_t first, std::size_t end, double unit,
                      const StackPlace& place) {
    AreaShape area;
    const auto x = [&](std::size_t column) {
        return place.scale.left + static_cast<double>(column) * kColumnWidth;
    };
    const auto addEdge = [&](double height, double from, double to) {
        const double y = place.bottom - height * unit;
        const bool goesOn = area.points.size() > 1 && std::abs(area.points.back().y - y) < 0.05;
        if (goesOn) area.points.pop_back();
        if (!goesOn) area.points.push_back({from, y});
        area.points.push_back({to, y});
    };
    for (std::size_t i = first; i < end; ++i) addEdge(edges.above[i], x(i), x(i + 1));
    area.points.push_back({x(end), place.bottom - edges.below[end - 1] * unit});
    for (std::size_t i = end; i > first; --i) addEdge(edges.below[i - 1], x(i), x(i - 1));
    return area;
}

void addAreas(std::vector<AreaShape>& areas, const StackEdges& edges, SpanKind kind, double unit,
              const StackPlace& place) {
    const auto isThere = [&](std::size_t column) {
        return edges.above[column] > edges.below[column];
    };
    std::size_t first = 0;
    while (first < edges.above.size()) {
        std::size_t end = first;
        while (end < edges.above.size() && isThere(end)) ++end;
        if (end > first) {
            areas.push_back(areaBetween(edges, first, end, unit, place));
            areas.back().paint = {Pen::Span, kind};
        }
        first = end + 1;
    }
}

}  // namespace

std::vector<AreaShape> stackedAreas(const std::vector<const TimelineLane*>& lanes,
                                    const std::vector<SpanKind>& kinds, const StackPlace& place) {
    const auto columns = static_cast<std::size_t>(std::ceil(place.scale.width / kColumnWidth));
    std::vector<StackEdges> stack;
    stack.reserve(kinds.size());
    Columns top(columns, 0);
    for (const SpanKind kind : kinds) {
        StackEdges edges{top, occupancy(lanes, kind, place.scale, columns)};
        for (std::size_t i = 0; i < columns; ++i) top[i] = edges.above[i] += edges.below[i];
        stack.push_back(std::move(edges));
    }
    const double highest = *std::max_element(top.begin(), top.end());
    std::vector<AreaShape> areas;
    if (highest <= 0) return areas;
    for (std::size_t i = 0; i < kinds.size(); ++i) {
        addAreas(areas, stack[i], kinds[i], place.height / highest, place);
    }
    return areas;
}

}  // namespace appsync
