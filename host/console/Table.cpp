#include "host/console/Table.h"

#include <algorithm>
#include <string_view>
#include <utility>

#include "host/console/Text.h"

namespace appsync {
namespace {

constexpr std::string_view kGap = "  ";
constexpr std::size_t kFewest = 4;  // characters of a cell that still say something

}  // namespace

void Table::add(std::vector<std::string> cells) {
    for (std::string& cell : cells) cell = printable(cell);
    rows_.push_back(std::move(cells));
}

std::vector<std::size_t> Table::columnWidths() const {
    std::vector<std::size_t> widths(rows_.front().size());
    for (const auto& row : rows_) {
        for (std::size_t column = 0; column < widths.size(); ++column) {
            widths[column] = std::max(widths[column], displayWidth(row[column]));
        }
    }
    if (width_ == 0) return widths;
    std::size_t taken = kGap.size() * (widths.size() - 1);
    for (const std::size_t each : widths) taken += each;
    for (; taken > width_; --taken) {
        const auto widest = std::max_element(widths.begin(), widths.end());
        if (*widest <= kFewest) break;
        --*widest;
    }
    return widths;
}

std::string Table::cell(const std::string& text, std::size_t column, std::size_t width) const {
    const std::size_t length = displayWidth(text);
    if (length <= width || !keptEnds_.contains(column)) return fitted(text, width);
    return "~" + std::string(endOf(text, width - 1));
}

std::string Table::text() const {
    const std::vector<std::size_t> widths = columnWidths();
    std::string result;
    for (const auto& row : rows_) {
        for (std::size_t column = 0; column + 1 < widths.size(); ++column) {
            result.append(cell(row[column], column, widths[column])).append(kGap);
        }
        const bool isCut = displayWidth(row.back()) > widths.back();
        result += (isCut ? cell(row.back(), widths.size() - 1, widths.back()) : row.back()) + "\n";
    }
    return result;
}

}  // namespace appsync
