// The day of a run. The lines of the log tell the time alone; the history line that a run has written tells
// the day too.
#pragma once

#include <cstddef>
#include <string>
#include <unordered_map>
#include <vector>

#include "history.h"
#include "runlog.h"

struct RunDate {
  std::string day;      ///< "2026-03-09", of the run's first message; empty when it is not certain
  std::size_t line = 0; ///< of the history, from which it is known
};

class RunDates {
public:
  explicit RunDates(History history);

  /// The day when exactly one history line can be the one of this attempt: of this user, this result, a patch
  /// of this name's platform and target, and written within these seconds.
  RunDate dateOf(const LogAttempt &attempt, const std::string &user) const;

private:
  History history_;
  std::unordered_multimap<int, std::size_t> bySecond_; ///< second of the day -> index of the record
};
