#include "host/console/Table.h"

#include <algorithm>
#include <utility>

#include "host/console/Text.h"

namespace appsync {

void Table::add(std::vector<std::string> cells) {
    for (std::string& cell : cells) cell = printable(cell);
    rows_.push_back(std::move(cells));
}

std::string Table::text() const {
    std::vector<std::size_t> widths(rows_.front().size());
    for (const auto& row : rows_) {
        for (std::size_t column = 0; column < widths.size(); ++column) {
            widths[column] = std::max(widths[column], displayWidth(row[column]));
        }
    }
    for (std::size_t column = 0; column < std::min(widths.size(), limits_.size()); ++column) {
        widths[column] = std::min(widths[column], limits_[column]);
    }
    std::string result;
    for (const auto& row : rows_) {
        for (std::size_t column = 0; column + 1 < widths.size(); ++column) {
            result += fitted(row[column], widths[column]) + "  ";
        }
        result += row.back() + "\n";
    }
    return result;
}

}  // namespace appsync
