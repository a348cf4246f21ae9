// Table: rows of text in aligned columns, for people.
#pragma once

#include <string>
#include <vector>

namespace tools {

class Table {
 public:
  /// The heading; its length is the number of columns.
  explicit Table(std::vector<std::string> heading) { addRow(std::move(heading)); }
  /// A row of as many cells as the heading has. Control characters are escaped; an empty cell is written "-".
  void addRow(std::vector<std::string> cells);
  /// All rows, each ended by a line feed, two spaces between columns, nothing behind the last one. Wide characters
  /// count as two columns, combining ones as none.
  std::string text() const;

 private:
  std::vector<std::vector<std::string>> rows_;
};

/// The columns that UTF-8 text without control characters takes on a terminal.
std::size_t displayWidth(const std::string& text);

}  // namespace tools
