#include "table.h"

#include <algorithm>
#include <cstdio>
#include <utility>

namespace {

/// Characters, not bytes: all but the bytes that continue one.
std::size_t widthOf(const std::string &text) {
  return static_cast<std::size_t>(std::count_if(text.begin(), text.end(), [](char byte) {
    return (static_cast<unsigned char>(byte) & 0xC0U) != 0x80U;
  }));
}

std::string lineOf(const std::vector<std::string> &cells, const std::vector<std::size_t> &widths) {
  std::string line;
  for (std::size_t i = 0; i < cells.size(); ++i)
    line += cells[i] + std::string(widths[i] + 2 - widthOf(cells[i]), ' ');
  line.erase(line.find_last_not_of(' ') + 1);
  return line;
}

} // namespace

Table::Table(std::vector<std::string> heading) {
  rows_.push_back(std::move(heading));
}

void Table::add(std::vector<std::string> cells) {
  cells.resize(rows_.front().size());
  rows_.push_back(std::move(cells));
}

void Table::print() const {
  if (isEmpty())
    return;
  std::vector<std::size_t> widths(rows_.front().size());
  for (const std::vector<std::string> &row : rows_)
    for (std::size_t i = 0; i < row.size(); ++i)
      widths[i] = std::max(widths[i], widthOf(row[i]));
  for (const std::vector<std::string> &row : rows_)
    printf("%s\n", lineOf(row, widths).c_str());
}
