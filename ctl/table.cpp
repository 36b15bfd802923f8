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

} // namespace

Columns::Columns(std::vector<std::string> heading) : heading_(std::move(heading)), widths_(heading_.size()) {
  measure(heading_);
}

void Columns::measure(const std::vector<std::string> &cells) {
  for (std::size_t i = 0; i < std::min(cells.size(), widths_.size()); ++i)
    widths_[i] = std::max(widths_[i], widthOf(cells[i]));
}

void Columns::print(const std::vector<std::string> &cells) const {
  std::string line;
  for (std::size_t i = 0; i < std::min(cells.size(), widths_.size()); ++i) {
    const std::size_t width = widthOf(cells[i]);
    line += cells[i] + std::string(std::max(widths_[i], width) + 2 - width, ' ');
  }
  line.erase(line.find_last_not_of(' ') + 1);
  printf("%s\n", line.c_str());
}

Table::Table(std::vector<std::string> heading) : columns_(std::move(heading)) {}

void Table::add(std::vector<std::string> cells) {
  columns_.measure(cells);
  rows_.push_back(std::move(cells));
}

void Table::print() const {
  if (isEmpty())
    return;
  columns_.printHeading();
  for (const std::vector<std::string> &row : rows_)
    columns_.print(row);
}
