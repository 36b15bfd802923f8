#include "logger.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <ctime>
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

constexpr const char *levelWords[] = {"ERROR", "INFO ", "TRACE"};

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

/// A second and its text, shared by the thousands of lines of one second. The zone does not change after
/// logInit.
struct Clock {
  time_t second = -1;
  char text[16] = "";
};

Clock lineClock;

// "HH:MM:SS" in local time; empty when it cannot be determined. localtime_r, unlike localtime, does not check
// the time-zone file for every line.
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
  const int prefix =
      snprintf(line, sizeof line, "%s %s (%s,%d): ", levelWords[level], currentTime(), component, glbCurLine);
  const auto used = static_cast<std::size_t>(std::clamp(prefix, 0, static_cast<int>(LineSize) - 1));

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
