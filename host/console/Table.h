#pragma once

#include <cstddef>
#include <set>
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

    /// Cuts the cells of the widest columns so that a line has no more characters than that, as far
    /// as that goes. For terminals: who reads it through a pipe gets all of it.
    void fitInto(std::size_t width) { width_ = width; }

    /// Of the cells of that column the ends are kept where they are cut: what identifiers of one
    /// maker differ in.
    void keepEndsOf(std::size_t column) { keptEnds_.insert(column); }

    /// The rows, heading first, each with a line end.
    [[nodiscard]] std::string text() const;

  private:
    [[nodiscard]] std::vector<std::size_t> columnWidths() const;
    [[nodiscard]] std::string cell(const std::string& text, std::size_t column,
                                   std::size_t width) const;

    std::vector<std::vector<std::string>> rows_;
    std::set<std::size_t> keptEnds_;
    std::size_t width_ = 0;  // 0: any
};

}  // namespace appsync
