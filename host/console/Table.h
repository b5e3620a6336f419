#pragma once

#include <cstddef>
#include <string>
#include <utility>
#include <vector>

namespace appsync {

/// Text in columns that are as wide as they must be, with a heading.
class Table {
  public:
    explicit Table(std::vector<std::string> heading) { rows_.push_back(std::move(heading)); }

    /// One row, as many cells as the heading has; what no terminal should get is replaced.
    void add(std::vector<std::string> cells);

    /// The most characters that the first columns may take; a longer cell is cut.
    void limit(std::vector<std::size_t> widths) { limits_ = std::move(widths); }

    /// The rows, heading first, each with a line end.
    [[nodiscard]] std::string text() const;

  private:
    std::vector<std::vector<std::string>> rows_;
    std::vector<std::size_t> limits_;
};

}  // namespace appsync
