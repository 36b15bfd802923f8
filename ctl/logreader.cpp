#include "logreader.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cstdio>
#include <utility>

namespace {

constexpr std::size_t HeaderLines = 7;
constexpr std::string_view HostLabel = "   System Name: ";
constexpr std::string_view UserLabel = "   User Name:   ";
constexpr std::string_view PidLabel = "   Process ID:  ";
constexpr std::string_view BuildLabel = "   Build Date:  ";

bool isRule(std::string_view line) {
  return line.size() == 78 && line.find_first_not_of('=') == std::string_view::npos;
}

bool beginsWith(std::string_view line, std::string_view start) {
  return line.substr(0, start.size()) == start;
}

/// The whole text as a number of digits; false when it is none.
template <class Number>
bool parseNumber(std::string_view text, Number &number) {
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  return !text.empty() && error == std::errc() && end == text.data() + text.size();
}

/// Whether the line can be the one at this place of a header block.
bool fitsHeader(std::size_t place, std::string_view line) {
  long pid = 0;
  switch (place) {
  case 1:
    return line == " ORV Patch Log File";
  case 2:
    return beginsWith(line, HostLabel);
  case 3:
    return beginsWith(line, UserLabel);
  case 4:
    return beginsWith(line, PidLabel) && parseNumber(line.substr(PidLabel.size()), pid);
  case 5:
    return beginsWith(line, BuildLabel);
  default:
    return isRule(line);
  }
}

LogHeader headerOf(const std::vector<std::string> &lines, std::uint64_t offset) {
  LogHeader header;
  header.offset = offset;
  header.host = lines[2].substr(HostLabel.size());
  header.user = lines[3].substr(UserLabel.size());
  static_cast<void>(parseNumber(std::string_view(lines[4]).substr(PidLabel.size()), header.pid));
  return header;
}

/// Second of the day of "HH:MM:SS"; -1 for anything else.
int secondOfDay(std::string_view text) {
  int hour = 0;
  int minute = 0;
  int second = 0;
  if (text.size() != 8 || text[2] != ':' || text[5] != ':' || !parseNumber(text.substr(0, 2), hour) ||
      !parseNumber(text.substr(3, 2), minute) || !parseNumber(text.substr(6, 2), second))
    return -1;
  // A leap second has the number 60.
  const bool isTime = hour >= 0 && hour < 24 && minute >= 0 && minute < 60 && second >= 0 && second <= 60;
  return isTime ? hour * 3600 + minute * 60 + std::min(second, 59) : -1;
}

bool takeLevel(std::string_view &line, LogLevel &level) {
  static constexpr std::array<std::pair<std::string_view, LogLevel>, 3> words = {
      {{"ERROR ", LogLevel::Error}, {"INFO  ", LogLevel::Info}, {"TRACE ", LogLevel::Trace}}};
  for (const auto &[word, value] : words)
    if (beginsWith(line, word)) {
      line.remove_prefix(word.size());
      level = value;
      return true;
    }
  return false;
}

/// Takes the text before `end` off the start.
bool takeUntil(std::string_view &line, std::string_view end, std::string_view &text) {
  const std::size_t at = line.find(end);
  if (at == std::string_view::npos)
    return false;
  text = line.substr(0, at);
  line.remove_prefix(at + end.size());
  return true;
}

/// "LEVEL HH:MM:SS (component,line): text". The time is missing when the system could not tell it.
bool parseMessage(std::string_view line, LogMessage &message) {
  std::string_view time;
  std::string_view component;
  std::string_view number;
  if (!takeLevel(line, message.level) || !takeUntil(line, " (", time) || !takeUntil(line, ",", component) ||
      !takeUntil(line, "): ", number))
    return false;
  message.time = secondOfDay(time);
  if ((message.time < 0 && !time.empty()) || component.find_first_of("()") != std::string_view::npos ||
      !parseNumber(number, message.line))
    return false;
  message.component = component;
  message.text = line;
  return true;
}

/// Adds what still fits and counts the rest.
void append(std::string &text, std::size_t &omitted, std::string_view more) {
  const std::size_t fitting = std::min(more.size(), LogReader::LongestMessage - text.size());
  text += more.substr(0, fitting);
  omitted += more.size() - fitting;
}

} // namespace

LogReader::LogReader(LogListener &listener, std::uint64_t offset)
    : listener_(listener), offset_(offset), lineOffset_(offset) {}

void LogReader::feed(std::string_view bytes) {
  while (!bytes.empty()) {
    const std::size_t end = std::min(bytes.find('\n'), bytes.size());
    append(line_, lineOmitted_, bytes.substr(0, end));
    offset_ += end;
    bytes.remove_prefix(end);
    if (bytes.empty())
      return;
    takeLine();
    bytes.remove_prefix(1);
    ++offset_;
    lineOffset_ = offset_;
  }
}

void LogReader::settle() {
  if (line_.empty() && candidate_.empty())
    handOut();
}

void LogReader::finish() {
  if (!line_.empty())
    takeLine();
  dropCandidate();
  handOut();
}

void LogReader::takeLine() {
  const std::string line = std::exchange(line_, "");
  const std::size_t omitted = std::exchange(lineOmitted_, 0);
  if (!candidate_.empty() && !fitsHeader(candidate_.size(), line))
    dropCandidate();
  if (candidate_.empty() && !isRule(line)) {
    takeOrdinary(line, omitted);
    return;
  }
  if (candidate_.empty())
    candidateOffset_ = lineOffset_;
  candidate_.push_back(line);
  if (candidate_.size() < HeaderLines)
    return;
  handOut();
  listener_.onHeader(headerOf(candidate_, candidateOffset_));
  candidate_.clear();
}

void LogReader::takeOrdinary(std::string_view line, std::size_t omitted) {
  LogMessage next;
  if (parseMessage(line, next)) {
    handOut();
    next.omitted = omitted;
    message_ = std::move(next);
    hasMessage_ = true;
  } else if (hasMessage_) {
    append(message_.text, message_.omitted, "\n");
    append(message_.text, message_.omitted, line);
    message_.omitted += omitted;
  } else {
    listener_.onStray();
  }
}

/// What looked like a header block is a part of a message.
void LogReader::dropCandidate() {
  for (const std::string &line : std::exchange(candidate_, {}))
    takeOrdinary(line, 0);
}

void LogReader::handOut() {
  if (!hasMessage_)
    return;
  hasMessage_ = false;
  listener_.onMessage(message_);
}

std::string clockText(int time) {
  char text[32] = "";
  if (time >= 0)
    snprintf(text, sizeof text, "%02d:%02d:%02d", time / 3600, time / 60 % 60, time % 60);
  return text;
}

const char *levelName(LogLevel level) {
  switch (level) {
  case LogLevel::Error:
    return "error";
  case LogLevel::Info:
    return "info";
  default:
    return "trace";
  }
}
