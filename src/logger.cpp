#include "logger.h"

#include <algorithm>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <iterator>
#include <string_view>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "filedescriptor.h"
#include "utilities.h"

std::string glbLogFileName;
bool glbLogToSTDOUT = false;
int glbCurLine = 0;

namespace {

constexpr std::string_view levelWords[] = {"ERROR ", "INFO  ", "TRACE "};

// Almost every line fits; a longer one is formatted once more into a string of its size.
constexpr std::size_t LineSize = 2048;

LogSink logSink;

void writeText(const char *text, std::size_t length) {
  if (logSink) {
    logSink({text, length});
    return;
  }
  if (glbLogToSTDOUT) {
    fwrite(text, 1, length, stdout);
    return;
  }
  const FileDescriptor file(glbLogFileName.c_str(), O_WRONLY | O_APPEND | O_CREAT);
  if (!file.isOpen()) {
    const std::string message = NLS::getFormattedString("LOG_CANT_WRITE", glbLogFileName.c_str());
    fprintf(stderr, "%s\n", message.c_str());
    return;
  }
  // A line that cannot be written is lost: there is no other place to report it.
  static_cast<void>(file.write(text, length));
}

void writeHeader() {
  const std::string rule(78, '=');
  const std::string host = Util::getHostName();
  const std::string user = Util::getUserName();
  const std::string header = rule + "\n ORV Patch Log File\n   System Name: " + host +
                             "\n   User Name:   " + user + "\n   Process ID:  " + std::to_string(getpid()) +
                             "\n   Build Date:  " ORVPATCH_BUILD_DATE " " ORVPATCH_BUILD_TIME "\n" + rule +
                             "\n";
  writeText(header.data(), header.size());
}

/// A second and its text, shared by the thousands of lines of one second: the two conversions would take a
/// fiftieth of a large installation's time. The zone does not change after logInit.
struct Clock {
  time_t second = -1;
  char text[16] = "";
};

Clock lineClock;

// "HH:MM:SS" in local time; empty when it cannot be determined. localtime_r, unlike localtime, does not check
// the time-zone file for every line, which would take a fifth of a large installation's time.
const char *currentTime() {
  const time_t now = time(nullptr);
  if (now == lineClock.second)
    return lineClock.text;
  lineClock = {now, ""};
  tm local = {};
  if (localtime_r(&now, &local) != nullptr)
    static_cast<void>(strftime(lineClock.text, sizeof lineClock.text, "%H:%M:%S", &local));
  return lineClock.text;
}

/// Fills in the start of a line, "LEVEL HH:MM:SS (component,line): ", piece by piece: snprintf would take a
/// fiftieth of a large installation's time. Returns its length.
std::size_t formatPrefix(char *line, logger_level level, const char *component) {
  char *to = line;
  const auto append = [&to, end = line + LineSize - 1](std::string_view piece) {
    to += piece.copy(to, static_cast<std::size_t>(end - to));
  };
  char number[12];
  const char *const numberEnd = std::to_chars(number, std::end(number), glbCurLine).ptr;

  append(levelWords[level]);
  append(currentTime());
  append(" (");
  append(component);
  append(",");
  append({number, static_cast<std::size_t>(numberEnd - number)});
  append("): ");
  return static_cast<std::size_t>(to - line);
}

} // namespace

void logInit() {
  tzset();
  lineClock = {};
  if (getenv("PATCH_DEBUG") != nullptr) {
    glbLogToSTDOUT = true;
    glbLogFileName.clear();
  } else {
    const std::string directory = Util::getQuillHome() + "patchlogs";
    // It usually exists; when it cannot be made, opening the log reports it.
    static_cast<void>(mkdir(directory.c_str(), 0755));
    glbLogFileName = directory + "/orvpatch.log";
  }
  writeHeader();
}

LogSink setLogSink(LogSink sink) {
  return std::exchange(logSink, std::move(sink));
}

void setLine(int line) {
  glbCurLine = line;
}

void logMsg(logger_level level, const char *component, const char *format, va_list arguments) {
  char line[LineSize];
  const std::size_t used = formatPrefix(line, level, component);

  va_list again;
  va_copy(again, arguments);
  const int message = vsnprintf(line + used, sizeof line - used, format, arguments);
  const std::size_t length = used + static_cast<std::size_t>(std::max(message, 0));
  if (length < LineSize) {
    line[length] = '\n';
    writeText(line, length + 1);
  } else {
    std::string longLine(line, used);
    longLine.resize(length + 1);
    vsnprintf(longLine.data() + used, length - used + 1, format, again);
    longLine[length] = '\n';
    writeText(longLine.data(), longLine.size());
  }
  va_end(again);
}

void logError(const char *component, const char *format, ...) {
  va_list arguments;
  va_start(arguments, format);
  logMsg(LEVEL_ERROR, component, format, arguments);
  va_end(arguments);
}

void logInfo(const char *component, const char *format, ...) {
  va_list arguments;
  va_start(arguments, format);
  logMsg(LEVEL_INFO, component, format, arguments);
  va_end(arguments);
}

void logTrace(const char *component, const char *format, ...) {
  va_list arguments;
  va_start(arguments, format);
  logMsg(LEVEL_TRACE, component, format, arguments);
  va_end(arguments);
}
