#pragma once

#include <cstddef>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace appsync {

struct Console;

/// Text in columns that are as wide as they must be, with a heading.
class Table {
  public:
    explicit Table(std::vector<std::string> heading) { rows_.push_back(std::move(heading)); }

    /// One row, as many cells as the heading has; what no terminal should get is replaced.
    void add(std::vector<std::string> cells);

    /// Of the cells of that column the ends are kept where they are cut: what identifiers of one
    /// maker differ in.
    void keepEndsOf(std::size_t column) { keptEnds_.insert(column); }

    /// The columns that go where a terminal is too narrow to show something of each, the first of
    /// these first.
    void spare(std::vector<std::size_t> columns) { spared_ = std::move(columns); }

    /// The rows, heading first, each with a line end.
    [[nodiscard]] std::string text() const;

    /// The same for that console. On a terminal no line is wider than it is: the widest columns are
    /// cut, and columns are left out. Who reads it through a pipe gets all of it.
    [[nodiscard]] std::string textFor(const Console& console) const;

  private:
    struct Column {
        std::size_t index;
        std::size_t width;
    };

    [[nodiscard]] std::vector<Column> columns() const;
    [[nodiscard]] std::vector<Column> columnsWithin(std::size_t width) const;
    [[nodiscard]] std::string rowsIn(const std::vector<Column>& columns,
                                     std::string_view cutMark) const;

    std::vector<std::vector<std::string>> rows_;
    std::set<std::size_t> keptEnds_;
    std::vector<std::size_t> spared_;
};

}  // namespace appsync
