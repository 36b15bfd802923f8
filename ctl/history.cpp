#include "history.h"

#include <algorithm>
#include <cstring>

#include "inputfile.h"
#include "utilities.h"

namespace {

/// A line has about 100 bytes: two million attempts.
constexpr std::size_t LargestHistory = 256UL * 1024 * 1024;

constexpr std::string_view Separator = " | ";

std::string trimmed(std::string_view text) {
  std::string result(text);
  Util::trimString(result);
  return result;
}

/// Takes the field before the first separator off the start; false when there is none.
bool takeFirst(std::string_view &text, std::string &field) {
  const std::size_t at = text.find(Separator);
  if (at == std::string_view::npos)
    return false;
  field = trimmed(text.substr(0, at));
  text.remove_prefix(at + Separator.size());
  return true;
}

/// Takes the field behind the last separator off the end.
bool takeLast(std::string_view &text, std::string &field) {
  const std::size_t at = text.rfind(Separator);
  if (at == std::string_view::npos)
    return false;
  field = trimmed(text.substr(at + Separator.size()));
  text = text.substr(0, at);
  return true;
}

bool parseTime(const std::string &text, tm &parts) {
  parts = {};
  const char *const end = strptime(text.c_str(), "%m/%d/%Y %H:%M:%S", &parts);
  return end != nullptr && *end == '\0';
}

/// The name of a patch may hold separators itself, so the fields are taken off both ends.
bool parseRecord(std::string_view line, HistoryRecord &record) {
  if (!takeFirst(line, record.product) || !takeFirst(line, record.platform) ||
      !takeFirst(line, record.target) || !takeLast(line, record.time) || !takeLast(line, record.user) ||
      !takeLast(line, record.result))
    return false;
  record.name = trimmed(line);
  tm ignored = {};
  return (record.result == "PASS" || record.result == "FAIL") &&
         (record.time.empty() || parseTime(record.time, ignored));
}

void addLine(std::string_view line, std::size_t number, History &history) {
  if (trimmed(line).empty() || line.front() == '#')
    return;
  HistoryRecord record;
  record.line = number;
  if (parseRecord(line, record))
    history.records.push_back(record);
  else
    history.foreign.push_back({number, std::string(line)});
}

} // namespace

History readHistory(const std::string &home) {
  return parseHistory(InputFile(home + "patchlogs/patches.hist").content(LargestHistory));
}

History parseHistory(std::string_view text) {
  History history;
  for (std::size_t number = 1; !text.empty(); ++number) {
    const std::size_t end = text.find('\n');
    addLine(text.substr(0, end), number, history);
    text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
  }
  return history;
}

std::string dayOf(const HistoryRecord &record) {
  tm parts = {};
  char text[16] = "";
  if (parseTime(record.time, parts))
    static_cast<void>(strftime(text, sizeof text, "%Y-%m-%d", &parts));
  return text;
}

int secondOf(const HistoryRecord &record) {
  tm parts = {};
  if (!parseTime(record.time, parts))
    return -1;
  return parts.tm_hour * 3600 + parts.tm_min * 60 + parts.tm_sec;
}

std::vector<std::time_t> momentsOf(const HistoryRecord &record) {
  std::vector<std::time_t> moments;
  for (const int summer : {0, 1}) {
    tm parts = {};
    if (!parseTime(record.time, parts))
      return {};
    const int hour = parts.tm_hour;
    parts.tm_isdst = summer;
    const std::time_t moment = mktime(&parts);
    // A time that does not exist in this form is moved by an hour.
    if (moment != -1 && parts.tm_hour == hour &&
        std::find(moments.begin(), moments.end(), moment) == moments.end())
      moments.push_back(moment);
  }
  return moments;
}
