#include "rundate.h"

#include <ctime>
#include <utility>

#include "patchfilename.h"

namespace {

constexpr int Day = 24 * 3600;

bool fits(const HistoryRecord &record, const LogAttempt &attempt, const std::string &user) {
  const PatchFileName name(attempt.patch);
  return record.user == user && record.result == (attempt.passed ? "PASS" : "FAIL") &&
         record.platform == name.getFullPlatform() && record.target == name.getTarget();
}

/// The day that lies so many days before that of the record.
std::string dayBefore(const HistoryRecord &record, int days) {
  tm parts = {};
  if (strptime(record.time.c_str(), "%m/%d/%Y %H:%M:%S", &parts) == nullptr)
    return "";
  parts.tm_mday -= days;
  static_cast<void>(timegm(&parts));
  char text[16] = "";
  static_cast<void>(strftime(text, sizeof text, "%Y-%m-%d", &parts));
  return text;
}

} // namespace

RunDates::RunDates(History history) : history_(std::move(history)) {
  for (std::size_t i = 0; i < history_.records.size(); ++i)
    bySecond_.emplace(secondOf(history_.records[i]), i);
}

RunDate RunDates::dateOf(const LogAttempt &attempt, const std::string &user) const {
  if (attempt.from < 0 || attempt.to < 0)
    return {};
  const HistoryRecord *found = nullptr;
  const int seconds = (attempt.to - attempt.from + Day) % Day;
  // Puts a line on disk: what takes a minute is another clock.
  for (int i = 0; i <= seconds && i < 60; ++i) {
    const auto [first, last] = bySecond_.equal_range((attempt.from + i) % Day);
    for (auto at = first; at != last; ++at) {
      if (!fits(history_.records[at->second], attempt, user))
        continue;
      if (found != nullptr)
        return {};
      found = &history_.records[at->second];
    }
  }
  if (found == nullptr)
    return {};
  // Written after the midnight that follows the attempt's first second, it tells the day after.
  const int days = attempt.days + (secondOf(*found) < attempt.from ? 1 : 0);
  return {dayBefore(*found, days), found->line};
}
