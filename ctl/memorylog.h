// The installer's log, kept in memory: its units trace what they find, and a finding may quote that. As long
// as the object lives no log of a home is written.
#pragma once

#include <string>
#include <vector>

#include "logger.h"

class MemoryLog {
public:
  MemoryLog();
  MemoryLog(const MemoryLog &) = delete;
  MemoryLog &operator=(const MemoryLog &) = delete;
  ~MemoryLog();

  /// The messages so far, without level, time, component and line end.
  const std::vector<std::string> &messages() const { return messages_; }
  /// The last message that begins with `start`; empty when there is none.
  std::string last(const std::string &start) const;

private:
  std::vector<std::string> messages_;
  LogSink before_;
};
