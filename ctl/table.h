// Aligned columns on standard output.
#pragma once

#include <string>
#include <vector>

class Table {
public:
  explicit Table(std::vector<std::string> heading);

  /// Cells are texts that a terminal may get (see terminalText); missing ones at the end are empty.
  void add(std::vector<std::string> cells);
  bool isEmpty() const { return rows_.size() == 1; }
  /// Prints the heading and the rows, two blanks between columns, none at the ends of lines; nothing when
  /// there are no rows.
  void print() const;

private:
  std::vector<std::vector<std::string>> rows_;
};
