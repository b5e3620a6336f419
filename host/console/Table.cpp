#include "host/console/Table.h"

#include <algorithm>
#include <numeric>
#include <string_view>
#include <utility>

#include "host/console/Console.h"
#include "host/console/Text.h"

namespace appsync {
namespace {

constexpr std::string_view kGap = "  ";
constexpr std::size_t kFewest = 8;  // characters of a cell that still say something

// The characters in a line of so many columns, where each has the width that `widthOf` gives.
template <typename Columns, typename Width>
std::size_t lineWidth(const Columns& columns, Width widthOf) {
    return std::accumulate(
        columns.begin(), columns.end(), kGap.size() * (columns.size() - 1),
        [&](std::size_t sum, const auto& column) { return sum + widthOf(column); });
}

}  // namespace

void Table::add(std::vector<std::string> cells) {
    for (std::string& cell : cells) cell = printable(cell);
    rows_.push_back(std::move(cells));
}

std::vector<Table::Column> Table::columns() const {
    std::vector<Column> columns;
    columns.reserve(rows_.front().size());
    for (std::size_t index = 0; index < rows_.front().size(); ++index) {
        std::size_t width = 0;
        for (const auto& row : rows_) width = std::max(width, displayWidth(row[index]));
        columns.push_back({index, width});
    }
    return columns;
}

std::vector<Table::Column> Table::columnsWithin(std::size_t width) const {
    std::vector<Column> columns = this->columns();
    const auto fewest = [](const Column& column) { return std::min(column.width, kFewest); };
    const auto all = [](const Column& column) { return column.width; };
    for (auto spared = spared_.begin(); columns.size() > 1 && lineWidth(columns, fewest) > width;) {
        const std::size_t gone = spared != spared_.end() ? *spared++ : columns.back().index;
        std::erase_if(columns, [&](const Column& column) { return column.index == gone; });
    }
    const std::size_t least = columns.size() > 1 ? kFewest : 1;
    for (std::size_t taken = lineWidth(columns, all); taken > width; --taken) {
        const auto widest = std::max_element(
            columns.begin(), columns.end(),
            [](const Column& left, const Column& right) { return left.width < right.width; });
        if (widest->width <= least) break;
        --widest->width;
    }
    return columns;
}

std::string Table::rowsIn(const std::vector<Column>& columns, std::string_view cutMark) const {
    std::string result;
    for (const auto& row : rows_) {
        for (const auto& [index, width] : columns) {
            const std::string& text = row[index];
            const bool isLast = index == columns.back().index;
            const bool isHeading = &row == &rows_.front();
            if (isLast && displayWidth(text) <= width) {
                result += text;
            } else if (keptEnds_.contains(index) && !isHeading) {
                result += fittedAtFront(text, width, cutMark);
            } else {
                result += fitted(text, width, cutMark);
            }
            result += isLast ? "\n" : kGap;
        }
    }
    return result;
}

std::string Table::text() const { return rowsIn(columns(), ""); }

std::string Table::textFor(const Console& console) const {
    return console.isTerminal ? rowsIn(columnsWithin(console.width), console.cutMark) : text();
}

}  // namespace appsync
