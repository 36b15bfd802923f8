#include "memorylog.h"

#include <algorithm>
#include <utility>

namespace {

/// A whole home is read with some thousand lines; more than these are of no use as evidence.
constexpr std::size_t MostMessages = 20000;

std::string messageOf(std::string_view line) {
  const std::size_t prefix = line.find("): ");
  line.remove_prefix(prefix == std::string_view::npos ? 0 : prefix + 3);
  if (!line.empty() && line.back() == '\n')
    line.remove_suffix(1);
  return std::string(line);
}

} // namespace

MemoryLog::MemoryLog() {
  before_ = setLogSink([this](std::string_view line) {
    if (messages_.size() >= MostMessages)
      messages_.clear();
    messages_.push_back(messageOf(line));
  });
}

MemoryLog::~MemoryLog() {
  static_cast<void>(setLogSink(std::move(before_)));
}

std::string MemoryLog::last(const std::string &start) const {
  const auto found = std::find_if(messages_.rbegin(), messages_.rend(), [&start](const std::string &message) {
    return message.compare(0, start.size(), start) == 0;
  });
  return found == messages_.rend() ? "" : *found;
}
