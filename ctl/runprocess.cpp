#include "runprocess.h"

#include <cstdlib>
#include <string>

#include <fcntl.h>
#include <unistd.h>

#include "filedescriptor.h"

namespace {

/// Fields of /proc/<pid>/stat behind the program's name, which may hold anything.
enum StatField { StateField = 0, StartField = 19 };

std::string statOf(long pid) {
  const FileDescriptor file(("/proc/" + std::to_string(pid) + "/stat").c_str(), O_RDONLY);
  char text[4096];
  const ssize_t size = file.isOpen() ? file.read(text, sizeof text) : 0;
  const std::string all(text, static_cast<std::size_t>(size > 0 ? size : 0));
  const std::size_t end = all.rfind(") ");
  return end == std::string::npos ? "" : all.substr(end + 2);
}

std::string fieldOf(std::string text, int number) {
  for (; number > 0; --number) {
    const std::size_t blank = text.find(' ');
    if (blank == std::string::npos)
      return "";
    text.erase(0, blank + 1);
  }
  return text.substr(0, text.find(' '));
}

/// Seconds since the epoch of a start that is given in clock ticks since the system's own.
std::time_t momentOf(const std::string &ticks) {
  timespec sinceBoot = {};
  static_cast<void>(clock_gettime(CLOCK_BOOTTIME, &sinceBoot));
  const long began = strtol(ticks.c_str(), nullptr, 10) / sysconf(_SC_CLK_TCK);
  return time(nullptr) - sinceBoot.tv_sec + began;
}

} // namespace

bool isStillAtWork(long pid, std::time_t lastSign) {
  constexpr std::time_t Rounding = 2;
  const std::string stat = statOf(pid);
  const std::string state = fieldOf(stat, StateField);
  if (state.empty() || state == "Z" || state == "X")
    return false;
  return momentOf(fieldOf(stat, StartField)) <= lastSign + Rounding;
}
