// Aligned columns on standard output.
#pragma once

#include <string>
#include <vector>

/// The widths that columns need, for rows that are not kept.
class Columns {
public:
  explicit Columns(std::vector<std::string> heading);

  /// Makes room for these cells: texts that a terminal may get (see terminalText).
  void measure(const std::vector<std::string> &cells);
  void printHeading() const { print(heading_); }
  /// Prints a line, two blanks between columns, none at its end.
  void print(const std::vector<std::string> &cells) const;

private:
  std::vector<std::string> heading_;
  std::vector<std::size_t> widths_;
};

/// A table that is small enough to be kept until all of it is known.
class Table {
public:
  explicit Table(std::vector<std::string> heading);

  void add(std::vector<std::string> cells);
  bool isEmpty() const { return rows_.empty(); }
  /// Prints the heading and the rows; nothing when there are no rows.
  void print() const;

private:
  Columns columns_;
  std::vector<std::vector<std::string>> rows_;
};
